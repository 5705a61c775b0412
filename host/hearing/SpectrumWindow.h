// One analysis length of the frame decoder: a Hann window over the newest `length`
// samples, its power spectrum, and the noise around a bin.
//
// Powers are scaled so that a sine of amplitude A (full scale 1) centred on a bin reads
// A^2 there, whatever the length: levels of different lengths compare directly.
#pragma once
#include <cstddef>
#include <vector>

namespace korvo {
namespace host {

class SpectrumWindow {
public:
    // Reference bins for a noise estimate: `count` on each side, every kReferenceStep bins
    // (bins two apart under Hann are nearly independent, neighbours are not), the nearest
    // kReferenceGap bins away (outside the main lobe of a line at the bin); the estimate is
    // the rank-th smallest, rank = 3/4 of count, so a quarter may hold other lines.
    static constexpr int kMaxReferenceCount = 128;
    static constexpr int kInsertionKeep = 9;  // up to 32 references
    static constexpr int kReferenceStep = 2;
    static constexpr int kReferenceGap = 3;
    static constexpr int rankOf(int count) { return count * 3 / 4; }

    SpectrumWindow(int length, int referenceCount);
    ~SpectrumWindow();
    SpectrumWindow(const SpectrumWindow&) = delete;
    SpectrumWindow& operator=(const SpectrumWindow&) = delete;

    // Analyses samples[0 .. length): the newest `length` samples in time order.
    void analyse(const float* samples);

    int length() const { return mLength; }
    int referenceCount() const { return mCount; }
    int bins() const { return mLength / 2 + 1; }
    double binHz() const { return mBinHz; }
    float power(int bin) const { return mPower[static_cast<size_t>(bin)]; }
    // The bin's power as it has stood over its last dips: the greatest of its powers in the
    // analyses so far, each kHeldDecay lower for every analysis since. A tone heard with its
    // echoes beats: for a frame its echoes may cancel it at the microphone, not its
    // harmonics at the same moment.
    static constexpr float kHeldDecay = 0.5f;  // 3 dB an analysis
    float heldPower(int bin) const { return mHeld[static_cast<size_t>(bin)]; }
    // Forgets every power so far (the held ones).
    void clear();

    // The quietest noise a room can have: white noise of 2 LSB RMS at 16 bits (-84 dBFS). A
    // microphone's own noise lies above it; below it lie only a converter's silence and
    // its rounding.
    static constexpr double kQuietestVariance = 4.0 / (32768.0 * 32768.0);
    double quietestNoise() const;

    // Whether a noise estimate can be made at `bin` from below / from above.
    bool referenceBelow(int bin, int gap) const;
    bool referenceAbove(int bin, int gap) const;
    // The noise power at `bin`: on each side with room, the kReferenceRank-th smallest of
    // its reference bins (from `gap` bins away), and the louder side of the two, so a
    // sloped spectrum never reads quieter than the side it rises towards; never under
    // quietestNoise().
    double noise(int bin, int gap) const;
    // A cheap lower bound of noise(bin, gap): on each side the least of the nearest
    // count - rank + 1 references (among that many, one lies at or below the rank-th).
    double noiseBound(int bin, int gap) const;

    // The largest power in [lo, hi] at a local maximum (not below either neighbour):
    // its bin, or -1.
    int peak(int lo, int hi) const;
    // A peak's frequency (Hz) and power, interpolated on the log powers of its neighbours
    // (Hann's main lobe is close to a Gaussian there).
    void interpolate(int bin, double* hz, double* power) const;

private:
    double side(int from, int step) const;

    int mLength;
    int mCount;
    double mBinHz;
    float* mIn = nullptr;
    void* mOut = nullptr;  // fftwf_complex[bins]
    void* mPlan = nullptr;
    std::vector<float> mWindow;
    std::vector<float> mPower;
    std::vector<float> mHeld;
};

}  // namespace host
}  // namespace korvo
