// The frame decoder: raw captured frames in, code events out. A pure core with no
// device, thread, plug-in, file or clock: a live listener and an offline one feed it the
// same frames and hear the same codes.
//
// Every frame, Hann windows of several lengths over the newest samples are analysed (the
// longest every second frame): the
// shortest hears a loud tone on the first frame it fills, the longer ones add up a weak
// tone's energy coherently. Each code has a search range of +-2.5 % around its nominal
// frequency (a sender's clock may be 2 % off). In a range the highest peak is compared
// with the noise around it (an order statistic of nearby bins, the louder side of two,
// see SpectrumWindow); the threshold is the factor that noise alone passes with chance
// 1e-9 per code and frame, shared among the windows and the range's bins. A peak is a
// code only when it lies nearest that code's frequency, is no harmonic (of a line down to 80 Hz, the
// first 40 folded back at half the rate too) of a stronger line sounding with it, read the
// same frequency a frame earlier (beyond the one-frame window), and is the only strong
// line in the band (talk-off: speech and music bring siblings). The steady reading also
// keeps a tone that ends from being read, in a long window it partly fills, as the
// neighbouring code.
//
// A code is reported once when it begins and stays sounding while its line holds; after
// it ends, evidence for the same code may only come from samples after the end, and
// it must come back clearly louder than its echo would be by then (a reverberant tail
// fades, it does not return).
//
// Real time: addFrame neither allocates nor blocks nor makes system calls; all memory is
// taken by the constructor. Construction and destruction take a lock around FFTW's
// planner and may run on any thread; one object is fed from one thread at a time.
#pragma once
#include <array>
#include <cstdint>
#include <memory>
#include <vector>

#include "host/hearing/Decoder.h"
#include "host/hearing/SpectrumWindow.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

class FrameDecoder {
public:
    static constexpr int kCodes = kHostCodes;  // 0..22: code 23 lies above half the rate
    // Lengths of the analysis windows, shortest first: one frame for speed, up to about
    // 280 ms so a 300 ms tone still fills the longest one.
    // Lengths between 40 ms and 64 ms let such short tones fill a window on most frame
    // alignments.
    static constexpr int kWindows = 9;
    static constexpr std::array<int, kWindows> kWindowLengths = {512, 1024, 1536, 2048, 3072, 4096, 6144, 8192, 12288};
    // Reference bins on each side: the one-frame window keeps 8 (within 1.4 kHz, so a
    // sloped spectrum is judged locally; a loud tone passes its higher threshold anyway),
    // the others 32 (a lower threshold, within 2.8 kHz at 1024 and narrower beyond), 64
    // from 4096 and 128 from 8192 (within 1.4 kHz, 920 Hz at 12288): a steadier estimate
    // lowers the threshold over the mean noise by 1.4 and 2.1 dB (300 ms tones at -18 dB
    // SNR: heard 79.6 -> 99.8 % of 460).
    static constexpr int kShortReferences = 8;
    static constexpr int kReferences = 32;
    static constexpr int kLongReferences = 64;
    static constexpr int kLongFrom = 4096;
    static constexpr int kLongestReferences = 128;
    static constexpr int kLongestFrom = 8192;
    static constexpr int referenceCount(int window) {
        const int length = kWindowLengths[static_cast<size_t>(window)];
        return window == 0 ? kShortReferences : length >= kLongestFrom ? kLongestReferences : length >= kLongFrom ? kLongReferences : kReferences;
    }
    // Windows from this length on are analysed every second frame only: a frame moves them
    // by a twelfth or less of their length, and they cost most (277 -> 177 us CPU a frame).
    static constexpr int kEveryOtherFrom = 4096;
    static constexpr int kHistory = 12288;
    static constexpr double kTolerance = 0.025;   // search range: 2 % clock error and a margin
    static constexpr double kFalseAlarm = 1e-9;   // per code and frame, in noise alone
    static constexpr double kHoldFalseAlarm = 1e-3;  // a sounding code holds at this weaker evidence
    static constexpr double kLowestFundamentalHz = 80.0;  // a low voice lies above
    // Clipping without noise keeps folded harmonics up to the 30th above the floor (code
    // 3's 28th folds onto code 11). Up to the 16th a line's bin is matched, beyond only
    // its interpolated frequency, else any stronger code would hide every weaker one.
    static constexpr int kMaxFoldedHarmonic = 40;
    static constexpr int kLooseHarmonic = 16;
    static constexpr int kReleaseFrames = 4;      // frames without the line that end a sounding: an echo beats and dips
    // An echo fades by 60 dB in at most this long (a large hall); a return of the same code
    // must stand kReturnFactor above where such a fade would have left the ended sounding.
    static constexpr double kMaxReverbSeconds = 3.0;
    static constexpr double kReturnFactor = 10.0;  // 10 dB in power: an echo regrows after its dips by less
    // Nor may a return lie more than 20 dB under the code's last peak, a bound that eases by
    // 10 dB a second: some rooms (and sox's reverberation) send a tone back in bursts that
    // regrow by 18 dB more than a second after it ended, 45 dB under the tone, where the same
    // code said again by the same sender arrives at about its first level.
    static constexpr double kReturnPeakFactor = 0.01;
    static constexpr double kReturnPeakDbPerSecond = 10.0;
    // Where the noise floor is far down (a hall without noise) a code's reverberant tail
    // stays above the hold threshold for seconds, and the same code said again meanwhile
    // would never be reported. A sounding whose line has stayed kFallFactor below its peak for
    // kFallFrames and then comes back to within kRiseFactor of it has begun again: a tail does
    // not regrow by 14 dB (see kReturnFactor), though its fading dips that deep for a frame
    // (in the simulated hall, one frame took 6 of 100 exchanges' echoes for codes; four lost a
    // code said again every half second).
    static constexpr double kFallFactor = 0.01;  // 20 dB in power
    static constexpr double kRiseFactor = 0.25;  // 6 dB
    static constexpr int kFallFrames = 2;
    // Talk-off. Windows from 1024 on begin a code only when their previous analysis read its
    // peak within kSteadyBins (recorded speech: 360 false codes an hour without, 52 at 0.3
    // bin, 0 at 0.15; the price: 40 ms tones at -10 dB SNR heard 97.0 -> 93.3 %); the
    // one-frame window is exempt, it decides a loud tone's first frame (latency).
    static constexpr double kSteadyBins = 0.15;
    // A code's line is the only strong line from kSiblingFromHz up (see pureLine): babble
    // 984 and music 2,700 false codes an hour without, music 0 an hour with; a sibling half
    // as strong counts (babble 12 an hour when it had to be stronger).
    static constexpr double kSiblingFromHz = 300.0;     // hum and rumble below
    static constexpr double kSiblingDb = 15.0;
    static constexpr double kSiblingFalseAlarm = 1e-3;  // per window, for a sibling to be a line
    static constexpr double kStrongSiblingDb = 3.0;
    static constexpr double kOtherCodeDb = 3.0;         // a line at another code up to this much louder is that code
    static constexpr int kOwnHarmonics = 10;

    FrameDecoder();
    ~FrameDecoder();
    FrameDecoder(const FrameDecoder&) = delete;
    FrameDecoder& operator=(const FrameDecoder&) = delete;

    // One captured frame of kFrameSamples samples at kSampleRate, in capture order.
    // Returns the codes that begin at this frame.
    CodeSet addFrame(const int16_t* samples);
    // The codes sounding now.
    CodeSet sounding() const { return mSounding; }
    // The newest one-frame spectrum, bins 0..255, as levels 100 * (1 + log10(m) / 6) of
    // magnitude m (a full-scale sine reads about 100), never below 0.
    void levels(float* out256) const;
    // Forgets every sample and sounding.
    void reset();

    // Bins searched for `code` in window `window`, and the factor over the noise that a
    // peak there must reach to begin a code.
    int searchBins(int window, int code) const;
    double threshold(int window, int code) const;

private:
    struct Range {
        int lo = 0, hi = 0;
        double start = 0.0;  // threshold to begin
        double hold = 0.0;   // threshold to stay sounding
    };
    struct Peak {
        int bin = -1;
        double hz = 0.0;
        double power = 0.0;  // interpolated, as a sine's A^2
        double ratio = 0.0;  // bin power over the noise around it (0: below what was asked)
    };
    struct Track {
        bool sounding = false;
        int holdWindows = 0;  // windows [0, holdWindows) keep it sounding
        int misses = 0;
        double endLevel = 0.0;
        double peakLevel = 0.0;  // the loudest its line has been while sounding
        int fallen = 0;          // frames in a row its line has been kFallFactor below that
        int64_t sinceEnd = -1;  // frames since its last end, -1 for never
    };

    bool fresh(int length) const { return length < kEveryOtherFrom || mFrames % 2 == 0; }
    // Whether the newest frame still holds sound a window of `length` samples holds: a window
    // whose sound has ended (a recording's noise cut to digital silence, a voice's pause)
    // shows the same old samples frame after frame, and their noise peaks read as steady
    // lines. Its newest frame must carry at least kLiveShare of the window's mean power.
    bool live(int length) const;
    // The highest peak in the code's range; its ratio is left 0 when it cannot reach `least`.
    Peak find(int window, int code, double least) const;
    bool harmonicOfStronger(const SpectrumWindow& w, const Peak& p) const;
    bool pureLine(int window, const SpectrumWindow& w, const Peak& p) const;
    static double returnLevel(const Track& t);
    bool begins(int code, Track& t);
    // Whether the sounding goes on, and true when it has begun again.
    bool holdOrEnd(int code, Track& t);

    std::vector<std::unique_ptr<SpectrumWindow>> mWindows;
    std::array<std::array<Range, kCodes>, kWindows> mRanges{};
    std::array<double, kWindows> mSiblingFactor{};  // a sibling counts as a line at this factor over its noise
    double mLineFactor = 0.0;  // a fundamental counts as a line at this factor over its noise
    std::vector<float> mHistory;
    static constexpr double kLiveShare = 0.1;  // -10 dB: a steady tone or noise keeps about 1
    std::array<double, kHistory / korvo::kFrameSamples> mFramePower{};  // by frame number, modulo
    int64_t mFrames = 0;
    std::array<Track, kCodes> mTracks{};
    CodeSet mSounding = 0;
    std::array<std::array<double, kCodes>, kWindows> mLastHz{};  // each window's peak frequency in the previous frame
};

}  // namespace host
}  // namespace korvo
