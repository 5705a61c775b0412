// A room's reverberation: what a microphone hears of a sound besides its direct path.
//
// The impulse response is made, not measured: six early reflections 3 to 11 ms after the
// direct sound (sparse taps, done sample by sample), then a dense tail of Gaussian noise
// under an exponential envelope that falls 60 dB in the room's decay time T60 (done by
// FFT in blocks, see Convolver), which is how a diffuse field decays. Its energy is set by
// the room's critical distance rc, where the reverberant sound is as loud as the direct:
// the response's energy is 1 / rc^2, a direct path at 1 m having gain 1. A quarter of it is
// in the early reflections. Real-time: process() neither allocates nor blocks.
#pragma once
#include <array>
#include <cstdint>
#include <memory>
#include <vector>

#include "routes/sim/acoustics/Convolver.h"

namespace korvo {
namespace platform {
namespace acoustics {

class RoomReverb {
public:
    static constexpr int kEarlyTaps = 6;

    // decaySeconds <= 0: no reverberation.
    RoomReverb(double decaySeconds, double criticalDistanceM, uint64_t seed, double rate);
    bool none() const { return !mTail; }

    // out = the reverberant sound of in (the direct sound is not included); in and out are
    // different arrays.
    void process(const float* in, float* out, int count);

    // The whole response, early taps and tail, from the direct sound's instant on.
    const std::vector<float>& response() const { return mResponse; }

private:
    std::vector<float> mResponse;
    std::array<int, kEarlyTaps> mTapDelay{};
    std::array<float, kEarlyTaps> mTapGain{};
    std::vector<float> mHistory;  // the last input samples, for the early taps
    int mHistoryAt = 0;
    std::unique_ptr<Convolver> mTail;
};

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
