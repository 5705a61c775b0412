// Names and per-process settings of the simulated room.
//
// A microphone reads its acoustic path from its own process environment:
//   KORVO_SIM_GAIN   dB from the speakers to this microphone (default 0)
//   KORVO_SIM_NOISE  white noise in dBFS RMS, 0 dBFS being an RMS of 32768
//                    (default: no noise)
//   KORVO_SIM_SEED   seed of that noise (default 1: runs repeat exactly)
// and every route its device and room (acoustics/Presets.h has the presets' numbers):
//   KORVO_SIM_ROOM       quiet (default: today's ideal room), office, kitchen, hall, street
//   KORVO_SIM_DEVICE     ideal (default), phone, laptop, cheap-speaker
//   KORVO_SIM_CLOCK_PPM  the device's clock against the room's, -1000..1000 (default: the device's)
//   KORVO_SIM_DISTANCE   metres between devices, 0.1..100 (default: the room's)
//   KORVO_SIM_MUSIC      a recording the room plays as its music (default: music made here)
// An empty value counts as unset.
#pragma once
#include <cstdint>
#include <optional>
#include <string>

#include "routes/sim/acoustics/Presets.h"

namespace korvo {
namespace platform {
namespace sim {

constexpr size_t kMaxRoomNameLength = 64;

// ROOM is 1..64 characters of [A-Za-z0-9._-]; false with a one-line reason otherwise.
bool validateRoomName(const std::string& room, std::string* error);

// The folder of this user's rooms: /dev/shm/korvo-<uid>, private to the user (0700), so
// that no other user can read, join or take a room name.
std::string roomFolder();
// The file of a room in that folder.
std::string roomPath(const std::string& room);

struct MicSettings {
    double gainDb = 0.0;
    std::optional<double> noiseDbfs;  // none: no noise
    uint64_t seed = 1;
};

// Reads the settings from the environment; nullopt with a one-line reason on a bad value.
std::optional<MicSettings> micSettingsFromEnv(std::string* error);

struct AcousticSettings {
    const acoustics::RoomPreset* room = nullptr;
    const acoustics::DevicePreset* device = nullptr;
    double clockPpm = 0.0;
    double distanceM = 1.0;
    std::string musicFile;
    // Today's ideal room and device: sound passes exactly as it always has.
    bool ideal() const;
};

std::optional<AcousticSettings> acousticSettingsFromEnv(std::string* error);

}  // namespace sim
}  // namespace platform
}  // namespace korvo
