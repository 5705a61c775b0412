// The frame record that a host may read beside the meter's operations: the newest
// complete frame's ring slot, its level, the whole five-frame capture ring and the
// sample count of the read that completed it. A capture step publishes it once per
// completed frame; read_write_audio copies it under its lock. A host that reads it after
// each capture step sees every frame the plug-in captured.
#pragma once
#include <cstddef>
#include <cstdint>

#include "Export.h"
#include "SoundMeterConstants.h"

struct Mmic_data_t {
    int32_t index;       // ring slot (0..4) of the newest complete frame
    float level;         // level in dB of the read that completed it
    int16_t data[korvo::kRingSamples];  // the whole five-frame ring
    int32_t count;       // samples delivered by the completing read
    int32_t reserved;    // copied both ways, never set by the library
};
static_assert(sizeof(Mmic_data_t) == 5136, "Mmic_data_t layout");
static_assert(offsetof(Mmic_data_t, level) == 4, "Mmic_data_t layout");
static_assert(offsetof(Mmic_data_t, data) == 8, "Mmic_data_t layout");
static_assert(offsetof(Mmic_data_t, count) == 5128, "Mmic_data_t layout");
static_assert(offsetof(Mmic_data_t, reserved) == 5132, "Mmic_data_t layout");

// Direction 1 writes the caller's record into the shared one; any other value reads it.
// Always 1.
KORVO_EXPORT int read_write_audio(int* unused, int direction, Mmic_data_t* record);

// For a host that looks it up with dlsym: a C++ function, found by its mangled name.
typedef int (*read_write_audio_t)(int*, int, Mmic_data_t*);
#define KORVO_READ_WRITE_AUDIO_SYMBOL "_Z16read_write_audioPiiP11Mmic_data_t"
