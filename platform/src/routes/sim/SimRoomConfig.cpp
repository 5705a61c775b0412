#include "routes/sim/SimRoomConfig.h"

#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>

namespace korvo {
namespace platform {
namespace sim {

namespace {

// Gains beyond these are typing errors, not rooms.
constexpr double kMinGainDb = -120.0;
constexpr double kMaxGainDb = 40.0;
constexpr double kMinNoiseDbfs = -150.0;
constexpr double kMaxNoiseDbfs = 0.0;
// A crystal is off by tens of ppm; more than a thousand is no clock.
constexpr double kMaxClockPpm = 1000.0;
constexpr double kMinDistanceM = 0.1;
constexpr double kMaxDistanceM = 100.0;

// Error texts stay on one line whatever the user typed.
std::string printable(const std::string& text) {
    std::string out = text;
    for (char& c : out) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
    }
    return out;
}

// 40, -120, 0.1: as a person writes them.
std::string shortNumber(double v) {
    char text[32];
    snprintf(text, sizeof text, "%g", v);
    return text;
}

const char* envValue(const char* name) {
    const char* value = std::getenv(name);
    return (value && *value) ? value : nullptr;
}

bool parseNumber(const char* text, double* out) {
    char* endp = nullptr;
    errno = 0;
    const double v = std::strtod(text, &endp);
    if (endp == text || *endp != '\0' || errno == ERANGE || !std::isfinite(v)) return false;
    *out = v;
    return true;
}

bool parseSeed(const char* text, uint64_t* out) {
    if (*text < '0' || *text > '9') return false;  // strtoull would accept a sign
    char* endp = nullptr;
    errno = 0;
    const unsigned long long v = std::strtoull(text, &endp, 10);
    if (*endp != '\0' || errno == ERANGE) return false;
    *out = v;
    return true;
}

bool readLevel(const char* name, double lo, double hi, const char* what, double* out,
               std::string* error) {
    const char* text = envValue(name);
    if (!text) return true;
    double v = 0;
    if (!parseNumber(text, &v) || v < lo || v > hi) {
        if (error) {
            *error = std::string(name) + "='" + printable(text) + "' is not " + what + " between " +
                     shortNumber(lo) + " and " + shortNumber(hi);
        }
        return false;
    }
    *out = v;
    return true;
}

}  // namespace

bool validateRoomName(const std::string& room, std::string* error) {
    bool ok = !room.empty() && room.size() <= kMaxRoomNameLength;
    for (char c : room) {
        const bool allowed = (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
                             (c >= '0' && c <= '9') || c == '.' || c == '_' || c == '-';
        ok = ok && allowed;
    }
    if (!ok && error) {
        *error = "bad sim room name '" + printable(room) + "' (1 to 64 characters of A-Z a-z 0-9 . _ -)";
    }
    return ok;
}

std::string roomFolder() { return "/dev/shm/korvo-" + std::to_string(unsigned(geteuid())); }

std::string roomPath(const std::string& room) { return roomFolder() + "/" + room; }

std::optional<MicSettings> micSettingsFromEnv(std::string* error) {
    MicSettings s;
    if (!readLevel("KORVO_SIM_GAIN", kMinGainDb, kMaxGainDb, "a gain in dB", &s.gainDb, error)) {
        return std::nullopt;
    }
    double noise = 0;
    if (envValue("KORVO_SIM_NOISE")) {
        if (!readLevel("KORVO_SIM_NOISE", kMinNoiseDbfs, kMaxNoiseDbfs, "a level in dBFS", &noise,
                       error)) {
            return std::nullopt;
        }
        s.noiseDbfs = noise;
    }
    if (const char* seed = envValue("KORVO_SIM_SEED")) {
        if (!parseSeed(seed, &s.seed)) {
            if (error) {
                *error = "KORVO_SIM_SEED='" + printable(seed) + "' is not an unsigned integer";
            }
            return std::nullopt;
        }
    }
    return s;
}

bool AcousticSettings::ideal() const {
    return std::string(room->name) == "quiet" && std::string(device->name) == "ideal" && clockPpm == 0.0 &&
           distanceM == 1.0 && musicFile.empty();
}

std::optional<AcousticSettings> acousticSettingsFromEnv(std::string* error) {
    AcousticSettings s;
    const char* room = envValue("KORVO_SIM_ROOM");
    s.room = acoustics::findRoomPreset(room ? room : "quiet");
    if (!s.room) {
        if (error) *error = "KORVO_SIM_ROOM='" + printable(room) + "' is not a room (" + acoustics::roomPresetNames() + ")";
        return std::nullopt;
    }
    const char* device = envValue("KORVO_SIM_DEVICE");
    s.device = acoustics::findDevicePreset(device ? device : "ideal");
    if (!s.device) {
        if (error) *error = "KORVO_SIM_DEVICE='" + printable(device) + "' is not a device (" + acoustics::devicePresetNames() + ")";
        return std::nullopt;
    }
    s.clockPpm = s.device->clockPpm;
    s.distanceM = s.room->distanceM;
    if (!readLevel("KORVO_SIM_CLOCK_PPM", -kMaxClockPpm, kMaxClockPpm, "a clock offset in ppm", &s.clockPpm, error) ||
        !readLevel("KORVO_SIM_DISTANCE", kMinDistanceM, kMaxDistanceM, "a distance in metres", &s.distanceM, error)) {
        return std::nullopt;
    }
    if (const char* music = envValue("KORVO_SIM_MUSIC")) s.musicFile = music;
    return s;
}

}  // namespace sim
}  // namespace platform
}  // namespace korvo
