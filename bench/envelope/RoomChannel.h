// A peer's loudspeaker heard by a listening device's microphone in a room preset, offline:
// the same pieces, in the same order, as the simulated room puts between two devices of a
// demo (distortion, the loudspeaker's response and clock, the path's level and delay, the
// room's reverberation and background, the microphone's response and clock, the converter's
// full scale). The peer's clock runs fast by its preset's ppm and the listener's slow by as
// much, as in `demo --devices`.
#pragma once
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "routes/sim/acoustics/Background.h"
#include "routes/sim/acoustics/ClockDrift.h"
#include "routes/sim/acoustics/Distortion.h"
#include "routes/sim/acoustics/Presets.h"
#include "routes/sim/acoustics/Response.h"
#include "routes/sim/acoustics/RoomReverb.h"

namespace korvo {
namespace envelope {

namespace acoustics = platform::acoustics;

class RoomChannel : private acoustics::ClockDrift::Source {
public:
    // The peer's device samples from `at` on (its own clock): what its tone engine plays.
    using Speaker = std::function<void(int64_t at, int count, int16_t* out)>;

    // Null, with the reason, when a piece cannot be made (the converter, a music file).
    static std::unique_ptr<RoomChannel> make(const acoustics::RoomPreset& room, const acoustics::DevicePreset& device,
                                             uint64_t seed, Speaker speaker, std::string* error);
    // The microphone's next `count` samples, 16-bit.
    void capture(int16_t* out, int count);

private:
    RoomChannel(const acoustics::RoomPreset& room, const acoustics::DevicePreset& device, uint64_t seed, Speaker speaker);
    long fetch(float** data) override;
    void roomChunk(float* out, int count);  // the sound at the microphone, on the room's clock
    void speakerInto(int need);             // at least `need` room samples of the speaker queued

    Speaker mSpeaker;
    int64_t mSpoken = 0;  // device samples the speaker has played
    acoustics::Distortion mDistortion;
    acoustics::Response mSpeakerResponse;
    std::unique_ptr<acoustics::ClockDrift> mSpeakerClock;
    std::deque<float> mQueued;  // the speaker's room samples, the path's delay ahead
    float mGain;
    acoustics::RoomReverb mReverb;
    std::unique_ptr<acoustics::Background> mBackground;
    acoustics::Response mMicResponse;
    std::unique_ptr<acoustics::ClockDrift> mMicClock;
    std::vector<float> mRoom, mReverberant, mDevice, mPlayed, mFetched;
};

}  // namespace envelope
}  // namespace korvo
