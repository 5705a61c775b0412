// Names and per-process settings of the simulated room.
//
// A microphone reads its acoustic path from its own process environment:
//   KORVO_SIM_GAIN   dB from the speakers to this microphone (default 0)
//   KORVO_SIM_NOISE  white noise in dBFS RMS, 0 dBFS being an RMS of 32768
//                    (default: no noise)
//   KORVO_SIM_SEED   seed of that noise (default 1: runs repeat exactly)
// An empty value counts as unset.
#pragma once
#include <cstdint>
#include <optional>
#include <string>

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

}  // namespace sim
}  // namespace platform
}  // namespace korvo
