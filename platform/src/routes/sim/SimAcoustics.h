// The acoustics between a room's devices: what a loudspeaker puts into the room, and what a
// microphone hears of it. Used by the sim routes when the room or the device is not today's
// ideal one (SimRoomConfig.h); samples are floats, full scale 1.
// Real-time: play() and hear() neither allocate nor block.
#pragma once
#include <cstdint>
#include <memory>
#include <string>

#include "routes/sim/SimRoomConfig.h"
#include "routes/sim/SimRoomLayout.h"
#include "routes/sim/acoustics/Background.h"
#include "routes/sim/acoustics/ClockDrift.h"
#include "routes/sim/acoustics/Distortion.h"
#include "routes/sim/acoustics/Response.h"
#include "routes/sim/acoustics/RoomReverb.h"

namespace korvo {
namespace platform {
namespace sim {

// Pieces of at most this many samples go through play() and hear().
constexpr int kAcousticChunk = 1024;

// A device's loudspeaker: distortion growing with level, the driver's response, and the
// device's clock against the room's.
class SpeakerAcoustics {
public:
    static std::unique_ptr<SpeakerAcoustics> make(const AcousticSettings& settings, std::string* error);
    // Turns `count` device samples into room samples in `out` (room for count + 64); returns
    // how many.
    long play(const int16_t* in, long count, float* out);

private:
    explicit SpeakerAcoustics(const AcousticSettings& settings);
    acoustics::Distortion mDistortion;
    acoustics::Response mResponse;
    std::unique_ptr<acoustics::ClockDrift> mClock;  // none on the room's clock
    float mScratch[kAcousticChunk];
};

// What a microphone hears in the room before its converter: each speaker by its own path
// (its own device's at the device's spacing, the others at the room's distance: level 1/d,
// delay d / 343 m/s), the room's reverberation of them all, the room's background, then
// the microphone's response.
class RoomHearing {
public:
    static std::unique_ptr<RoomHearing> make(const AcousticSettings& settings, uint64_t seed, uint64_t ownIdentity,
                                             std::string* error);
    // The sound at [position, position + count), count <= kAcousticChunk.
    void hear(const RoomLayout& room, int64_t position, int count, float* out);

private:
    RoomHearing(const AcousticSettings& settings, uint64_t seed, uint64_t ownIdentity);
    uint64_t mOwn;
    float mPeerGain, mSelfGain;
    int64_t mPeerDelay, mSelfDelay;
    acoustics::RoomReverb mReverb;
    std::unique_ptr<acoustics::Background> mBackground;
    acoustics::Response mResponse;
    float mToReverb[kAcousticChunk];
    float mReverberant[kAcousticChunk];
};

}  // namespace sim
}  // namespace platform
}  // namespace korvo
