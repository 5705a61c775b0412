// The frame decoder: raw captured frames in, code events out. A pure core with no
// device, thread, plug-in, file or clock: a live listener and an offline one feed it the
// same frames and hear the same codes.
//
// Every frame, Hann windows of several lengths over the newest samples are analysed: the
// shortest hears a loud tone on the first frame it fills, the longer ones add up a weak
// tone's energy coherently. Each code has a search range of +-2.5 % around its nominal
// frequency (a sender's clock may be 2 % off). In a range the highest peak is compared
// with the noise around it (an order statistic of nearby bins, the louder side of two,
// see SpectrumWindow); the threshold is the factor that noise alone passes with chance
// 1e-9 per code and frame, shared among the windows and the range's bins. A peak is a
// code only when it lies nearest that code's frequency, is no harmonic (2x .. 16x, folded
// back at half the rate too) of a stronger line sounding with it, and stands as a pure
// line above the spectrum around it (talk-off).
//
// A code is reported once when it begins and stays sounding while its line holds; after
// it ends, evidence for the same code may only come from samples after the end, and
// within a second it must come back clearly louder than it ended (a reverberant tail
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
    static constexpr int kWindows = 7;
    static constexpr std::array<int, kWindows> kWindowLengths = {512, 1024, 2048, 4096, 6144, 8192, 12288};
    static constexpr int kHistory = 12288;
    static constexpr double kTolerance = 0.025;   // search range: 2 % clock error and a margin
    static constexpr double kFalseAlarm = 1e-9;   // per code and frame, in noise alone
    static constexpr double kHoldFalseAlarm = 1e-3;  // a sounding code holds at this weaker evidence
    static constexpr int kMaxHarmonic = 16;       // clipping's odd harmonics stay strong this far
    static constexpr int kReleaseFrames = 2;      // frames without the line that end a sounding
    static constexpr int kRefractoryFrames = 86;  // a second after an end, a return must be louder
    static constexpr double kReturnFactor = 4.0;  // by 6 dB in power

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
        double ratio = 0.0;  // bin power over the noise around it
    };
    struct Track {
        bool sounding = false;
        int holdWindows = 0;  // windows [0, holdWindows) keep it sounding
        int misses = 0;
        double endLevel = 0.0;
        int64_t sinceEnd = -1;  // frames since its last end, -1 for never
    };

    Peak find(int window, int code) const;
    bool harmonicOfStronger(const SpectrumWindow& w, const Peak& p) const;
    bool pureLine(const SpectrumWindow& w, const Peak& p) const;
    bool begins(int code, Track& t);
    void holdOrEnd(int code, Track& t);

    std::vector<std::unique_ptr<SpectrumWindow>> mWindows;
    std::array<std::array<Range, kCodes>, kWindows> mRanges{};
    double mLineFactor = 0.0;  // a fundamental counts as a line at this factor over its noise
    std::vector<float> mHistory;
    int64_t mFrames = 0;
    std::array<Track, kCodes> mTracks{};
    CodeSet mSounding = 0;
};

}  // namespace host
}  // namespace korvo
