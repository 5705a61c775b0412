// The process-wide frame record shared by the capture loop and the analysis
// thread, its locks and condition variable, and the level of a block of samples.
#pragma once
#include <pthread.h>

#include <cstdint>

#include <utils/StrongPointer.h>

#include "interface/Export.h"
#include "interface/FrameRecord.h"
#include "interface/SoundMeterConstants.h"

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
