// Convolution with a long impulse response in blocks, by FFT (uniformly partitioned
// overlap-save, FFTW): each block of kBlock input samples costs one forward and one inverse
// transform and one multiply-add per partition, whatever the response's length.
//
// Silent input costs nothing: a slot of the delay line whose two input blocks were all zeros
// is passed over, and a room whose loudspeakers have been quiet for the whole response skips
// both transforms (a device only listening in a long-reverberant room).
//
// The output is delayed by exactly kBlock samples. A caller that wants the response h
// without that delay hands in h shifted left by kBlock (its first kBlock taps must then be
// done another way): see RoomReverb. Real-time: process() neither allocates nor blocks.
#pragma once
#include <memory>
#include <vector>

namespace korvo {
namespace platform {
namespace acoustics {

class Convolver {
public:
    static constexpr int kBlock = 512;

    explicit Convolver(const std::vector<float>& response);
    ~Convolver();
    Convolver(const Convolver&) = delete;
    Convolver& operator=(const Convolver&) = delete;

    // out[i] = sum_k response[k] * in[i - kBlock - k], over every sample handed in so far.
    void process(const float* in, float* out, int count);
    int partitions() const { return mPartitions; }

private:
    void runBlock();

    struct Fft;
    std::unique_ptr<Fft> mFft;
    int mPartitions = 0;
    std::vector<float> mInput;    // the last two input blocks, oldest first
    std::vector<float> mOutput;   // the block being handed out
    int mFill = 0;                // samples of the current input block so far
    int mNewest = 0;              // delay-line slot of the newest input spectrum
    std::vector<char> mSilent;    // per slot: its input spectrum is all zeros
};

// Makes FFTW's planner safe to call from several threads (once per process); every
// plan in this process must be made after it.
void makeFftPlannerThreadSafe();

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
