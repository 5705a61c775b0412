// Named situations for the simulated room: rooms (reverberation, distance between devices,
// background sounds) and devices (loudspeaker and microphone responses, distortion, clock).
// Every number is defined once, here, with the reason for it; the README repeats the table.
#pragma once
#include <string>
#include <vector>

#include "routes/sim/acoustics/Background.h"
#include "routes/sim/acoustics/Response.h"

namespace korvo {
namespace platform {
namespace acoustics {

struct DevicePreset {
    const char* name;
    ResponseSpec speaker;
    ResponseSpec microphone;
    double secondDb;       // the loudspeaker's second and third harmonics for a full-scale sine
    double thirdDb;
    double clockPpm;       // how fast the device's clock runs against the room's
    double selfDistanceM;  // its own loudspeaker to its own microphone; 0: as far as any other
    // The highest frequency its loudspeaker carries a code at: its low-pass corner, where the
    // level is 3 dB down and falls 24 dB an octave; 0: every code.
    double topHz;
    const char* why;
};

// A path of d metres delays its sound by d / kSpeedOfSound seconds.
constexpr double kSpeedOfSound = 343.0;  // m/s in air at 20 degrees C

struct RoomPreset {
    const char* name;
    double decaySeconds;       // T60; 0: no reverberation (outdoors, or today's ideal room)
    double criticalDistanceM;  // where the reverberant sound is as loud as the direct
    double distanceM;          // between devices; at 1 m a path has gain 1
    std::vector<SoundSpec> sounds;
    const char* why;
};

const std::vector<DevicePreset>& devicePresets();
const std::vector<RoomPreset>& roomPresets();
// Null when there is no such preset.
const DevicePreset* findDevicePreset(const std::string& name);
const RoomPreset* findRoomPreset(const std::string& name);
// "quiet, office, ..." for messages.
std::string roomPresetNames();
std::string devicePresetNames();

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
