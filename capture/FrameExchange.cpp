// The process-wide frame record, its locks, and the level of a block of samples.
#include "capture/FrameExchange.h"

#include <cmath>
#include <cstring>

#include "analysis/WaveformCanvas.h"
#include "common/LogTags.h"

namespace {

// Ties a pthread object's life to the library's: initialised at load, destroyed at unload.
struct MutexLife {
    pthread_mutex_t* m;
    explicit MutexLife(pthread_mutex_t* mutex) : m(mutex) { pthread_mutex_init(m, nullptr); }
    ~MutexLife() { pthread_mutex_destroy(m); }
};
struct CondLife {
    pthread_cond_t* c;
    explicit CondLife(pthread_cond_t* cond) : c(cond) { pthread_cond_init(c, nullptr); }
    ~CondLife() { pthread_cond_destroy(c); }
};

}  // namespace

// Definition order is creation order; unload destroys them in reverse.
pthread_mutex_t AudioBufferLock;
static MutexLife sAudioBufferLockLife(&AudioBufferLock);
pthread_cond_t WaitAudioBuffer;
static CondLife sWaitAudioBufferLife(&WaitAudioBuffer);
android::sp<android::WaveformCanvas> WF_Thread;
pthread_mutex_t DataRW;
static MutexLife sDataRWLife(&DataRW);
pthread_mutex_t EventRW;
static MutexLife sEventRWLife(&EventRW);

Mmic_data_t MDATA;
int32_t audio_event = 0;

namespace {

bool sMdataInitialised = false;  // guarded by DataRW
bool sEventInitialised = false;  // guarded by EventRW

// Called with DataRW held.
void initialiseMdataOnce() {
    if (sMdataInitialised) return;
    METER_LOGD("[%s] Initialize MDATA\n");
    sMdataInitialised = true;
    MDATA.index = 0;
    MDATA.level = 0;
    MDATA.count = 0;
    MDATA.reserved = 0;
    memset(MDATA.data, 0, sizeof(MDATA.data));
}

}  // namespace

int read_write_audio(int* /*unused*/, int direction, Mmic_data_t* record) {
    pthread_mutex_lock(&DataRW);
    initialiseMdataOnce();
    if (direction == 1) {
        memcpy(&MDATA, record, sizeof(Mmic_data_t));
    } else {
        memcpy(record, &MDATA, sizeof(Mmic_data_t));
    }
    pthread_mutex_unlock(&DataRW);
    return 1;
}

int read_write_audio_int(int direction, int* value) {
    pthread_mutex_lock(&EventRW);
    if (!sEventInitialised) {
        sEventInitialised = true;
        audio_event = 0;
    }
    if (direction == 1) {
        audio_event = *value;
    } else {
        *value = audio_event;
    }
    pthread_mutex_unlock(&EventRW);
    return 1;
}

double readDone(short* samples, int n) { return korvo::levelOf(samples, n); }

namespace korvo {

double levelOf(const short* samples, int n) {
    double sum = 0.0;
    double squares = 0.0;
    for (int i = 0; i < n; ++i) {
        sum += samples[i];
        squares += static_cast<double>(static_cast<int64_t>(samples[i]) * samples[i]);
    }
    // n below 1 gives a value that is not finite, as the formula does.
    double variance = (squares - sum * sum / n) / n;
    return 10.0 * log10(variance * 9.313225746154785e-10) + 0.6000000238418579;
}

void resetSharedRecordForTests() {
    pthread_mutex_lock(&DataRW);
    sMdataInitialised = false;
    memset(&MDATA, 0xA5, sizeof(MDATA));
    pthread_mutex_unlock(&DataRW);
    pthread_mutex_lock(&EventRW);
    sEventInitialised = false;
    audio_event = 12345;
    pthread_mutex_unlock(&EventRW);
}

void publishFrame(int32_t index, float level, const int16_t* ring, int32_t count) {
    pthread_mutex_lock(&DataRW);
    initialiseMdataOnce();
    MDATA.index = index;
    MDATA.level = level;
    memcpy(MDATA.data, ring, sizeof(MDATA.data));
    MDATA.count = count;
    pthread_mutex_unlock(&DataRW);
}

}  // namespace korvo
