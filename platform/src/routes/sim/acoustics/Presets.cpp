#include "routes/sim/acoustics/Presets.h"

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

// ResponseSpec fields: high-pass Hz and order, low-pass Hz and order, resonance Hz, dB, Q.
const ResponseSpec kFlat{};
// A phone's MEMS microphone: flat to 10 kHz, its port's resonance near 12 kHz, falling above
// 20 kHz.
const ResponseSpec kPhoneMicrophone{100.0, 2, 20000.0, 2, 12000.0, 3.0, 2.0};

}  // namespace

const std::vector<DevicePreset>& devicePresets() {
    static const std::vector<DevicePreset> presets = {
        {"ideal", kFlat, kFlat, -400.0, -400.0, 0.0, 0.0, 0.0,
         "today's device: flat, clean, on the room's clock, hearing itself as it hears the others"},
        {"phone",
         {400.0, 2, 18000.0, 4, 4000.0, 5.0, 2.0},
         kPhoneMicrophone,
         -40.0, -44.0, 20.0, 0.12, 18000.0,
         "a phone: a micro-speaker that moves little air below 400 Hz and falls steeply above 18 kHz, "
         "with a resonance near 4 kHz; about 1.2 % distortion at full volume; a MEMS microphone with "
         "its port's resonance near 12 kHz; a crystal 20 ppm fast; its microphone 12 cm from its speaker"},
        {"laptop",
         {300.0, 2, 17000.0, 4, 2500.0, 4.0, 1.5},
         {100.0, 2, 18000.0, 4, 0.0, 0.0, 1.0},
         -34.0, -36.0, -50.0, 0.25, 17000.0,
         "a laptop: small side-firing speakers falling above 17 kHz, a cabinet resonance near 2.5 kHz, "
         "about 2.5 % distortion at full volume; a microphone behind a grille, falling above 18 kHz; "
         "a clock 50 ppm slow; its microphone 25 cm from its speakers"},
        {"cheap-speaker",
         {800.0, 4, 12000.0, 4, 3000.0, 6.0, 1.5},
         kPhoneMicrophone,
         -24.0, -22.0, 100.0, 0.3, 12000.0,
         "a cheap loudspeaker: a small cone that cannot play above 12 kHz nor below 800 Hz, a strong "
         "resonance near 3 kHz and about 10 % distortion at full volume; a phone's microphone; a "
         "cheap crystal 100 ppm fast; 30 cm between them"},
    };
    return presets;
}

const std::vector<RoomPreset>& roomPresets() {
    static const std::vector<RoomPreset> presets = {
        {"quiet", 0.0, 1.0, 1.0, {}, "today's ideal room: no echo, no sound but the devices', every path at gain 1"},
        {"office", 0.5, 1.2, 2.0, {{SoundKind::Babble, -50.0}, {SoundKind::Fan, -60.0}},
         "an office: carpet and ceiling tiles (T60 0.5 s), desks 2 m apart, colleagues talking at a "
         "distance and the ventilation"},
        {"kitchen", 0.8, 0.9, 1.5, {{SoundKind::Music, -40.0}, {SoundKind::Fan, -45.0}},
         "a kitchen: tiles and hard walls (T60 0.8 s), devices 1.5 m apart, a radio playing and the "
         "extractor fan running"},
        {"hall", 2.0, 2.5, 6.0, {{SoundKind::Babble, -55.0}},
         "a hall: long reverberation (T60 2 s), devices 6 m apart, a crowd murmuring far off"},
        {"street", 0.0, 1.0, 1.0, {{SoundKind::Brown, -25.0}, {SoundKind::Pink, -30.0}, {SoundKind::Babble, -45.0}},
         "a street: outdoors (no reverberation), devices 1 m apart, loud traffic rumble, broadband "
         "noise and passers-by"},
    };
    return presets;
}

const DevicePreset* findDevicePreset(const std::string& name) {
    for (const DevicePreset& p : devicePresets()) {
        if (name == p.name) return &p;
    }
    return nullptr;
}

const RoomPreset* findRoomPreset(const std::string& name) {
    for (const RoomPreset& p : roomPresets()) {
        if (name == p.name) return &p;
    }
    return nullptr;
}

std::string roomPresetNames() {
    std::string s;
    for (const RoomPreset& p : roomPresets()) s += (s.empty() ? "" : ", ") + std::string(p.name);
    return s;
}

std::string devicePresetNames() {
    std::string s;
    for (const DevicePreset& p : devicePresets()) s += (s.empty() ? "" : ", ") + std::string(p.name);
    return s;
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
