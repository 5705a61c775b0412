// The process-wide frame record shared by the capture loop and the analysis
// thread, its locks and condition variable, and the level of a block of samples.
#pragma once
#include <pthread.h>

#include <cstddef>
#include <cstdint>

#include <utils/StrongPointer.h>

#include "interface/Export.h"
#include "interface/SoundMeterConstants.h"

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

namespace android {
class WaveformCanvas;
}

// Created at load in this order, torn down at unload in reverse.
extern KORVO_EXPORT pthread_mutex_t AudioBufferLock;
extern KORVO_EXPORT pthread_cond_t WaitAudioBuffer;
extern KORVO_EXPORT android::sp<android::WaveformCanvas> WF_Thread;
extern KORVO_EXPORT pthread_mutex_t DataRW;
extern KORVO_EXPORT pthread_mutex_t EventRW;

// The shared record and the event word (not exported; reached through the functions below).
extern Mmic_data_t MDATA;
extern int32_t audio_event;

// Direction 1 writes the caller's record into the shared one; any other value reads it.
KORVO_EXPORT int read_write_audio(int* unused, int direction, Mmic_data_t* record);
// Direction 1 stores *value into the event word; any other value loads it.
KORVO_EXPORT int read_write_audio_int(int direction, int* value);
// Level in dB (full scale) of n samples.
KORVO_EXPORT double readDone(short* samples, int n);

namespace korvo {
// Level formula shared by readDone and the capture loop.
double levelOf(const short* samples, int n);
// The shared record under DataRW, with its first-use initialisation; used by the capture loop.
void publishFrame(int32_t index, float level, const int16_t* ring, int32_t count);
// Tests only: forgets the first use of the record and the event word, as at load.
void resetSharedRecordForTests();
}  // namespace korvo
