// The capture stream: minimum buffer size, opening, starting and stopping the
// microphone stream, and its event callback.
#include "capture/CaptureStream.h"

#include <unistd.h>

#include <media/AudioRecord.h>

#include "common/LogTags.h"
#include "meter/SoundMeter.h"

using android::AudioRecord;

int AudioRecord_getMinBufferSize(int sampleRate, int channelConfig, int audioFormat) {
    int channelCount;
    switch (channelConfig) {
        case 1: case 2: case 16: channelCount = 1; break;
        case 3: case 12: case 48: channelCount = 2; break;
        case 0x3F0000: channelCount = 6; break;
        default:
            METER_LOGD("[%s] getMinBufferSize(): Invalid channel configuration.\n");
            return -1;
    }
    if (audioFormat != 2 && (audioFormat < 100 || audioFormat > 105)) {
        METER_LOGD("[%s] getMinBufferSize(): Invalid audio format.");
        return -1;
    }
    METER_LOG(ANDROID_LOG_VERBOSE, "[%s] android_media_AudioRecord_get_min_buff_size(%d, %d, %d)", sampleRate, channelCount, audioFormat);

    audio_format_t format;
    switch (audioFormat) {
        case 2: format = AUDIO_FORMAT_PCM_16_BIT; break;
        case 100: format = AUDIO_FORMAT_AMR_NB; break;
        case 101: format = AUDIO_FORMAT_AMR_WB; break;
        default: format = AUDIO_FORMAT_PCM_8_BIT; break;
    }
    audio_channel_mask_t mask;
    if (channelCount == 1) {
        mask = AUDIO_CHANNEL_IN_MONO;
    } else if (channelCount == 2) {
        mask = AUDIO_CHANNEL_IN_STEREO;
    } else {
        mask = AUDIO_CHANNEL_INDEX_HDR | ((1u << channelCount) - 1u);
    }

    size_t frameCount = 0;
    if (AudioRecord::getMinFrameCount(&frameCount, static_cast<uint32_t>(sampleRate), format, mask) != 0) {
        return -1;
    }
    int bytesPerSample = audioFormat == 2 ? 2 : (audioFormat == 101 ? 61 : 1);
    METER_LOG(ANDROID_LOG_VERBOSE, "[%s] FrameCount[%d] x nbChannels[%d] x bytesPerSample[%d]", static_cast<int>(frameCount), channelCount, bytesPerSample);
    uint32_t size = static_cast<uint32_t>(channelCount) * static_cast<uint32_t>(bytesPerSample) *
                    static_cast<uint32_t>(frameCount);
    if (size == 0 || size == 0xFFFFFFFFu) return -1;
    return static_cast<int>(size);
}

void recorderCallback(int event, void* /*user*/, void* /*info*/) {
    __android_log_print(ANDROID_LOG_DEBUG, korvo::kMeterTag, "[SoundMeter] recorderCallback event[%d]\n", event);
}

void SoundMeter::startRecord() {
    audioRecord = new AudioRecord(android::String16());
    // A failed minimum-size query leaves a negative frame count; hand the stream 0 (its own minimum).
    size_t frames = recordFrameCount > 0 ? static_cast<size_t>(static_cast<ssize_t>(recordFrameCount)) : 0;
    audioRecord->set(AUDIO_SOURCE_MIC, static_cast<uint32_t>(sampleRate), AUDIO_FORMAT_PCM_16_BIT,
                     AUDIO_CHANNEL_IN_MONO, frames, recorderCallback, nullptr, 0, false,
                     AUDIO_SESSION_ALLOCATE, AudioRecord::TRANSFER_SYNC, AUDIO_INPUT_FLAG_NONE, -1, -1,
                     nullptr);
    prepareCountdown = 200;
    while (prepareCountdown != 0) {
        METER_LOGD("[%s] AudioRecord preparation %d\n", prepareCountdown);
        usleep(50000);
        prepareCountdown -= 50;
    }
    audioRecord->start(android::AudioSystem::SYNC_EVENT_NONE, AUDIO_SESSION_NONE);
    recordState.store(1, std::memory_order_relaxed);
    METER_LOGD("[%s] AudioRecord Started\n");
}

void SoundMeter::stopRecord() {
    // Without a stream (no startRecord yet) there is nothing to stop: nothing happens.
    if (audioRecord == nullptr) return;
    // The state goes before the stream: a read that the stop releases then finds the
    // recording stopped at its post-read check and gives the step up, nothing changed.
    recordState.store(0, std::memory_order_relaxed);
    ringIndex.store(0, std::memory_order_relaxed);
    frameFill.store(0, std::memory_order_relaxed);
    audioRecord->stop();
    METER_LOGD("[%s] AudioRecord Stopped\n");
}

void SoundMeter::stopAudio() {
    // Without a stream there is nothing to stop.
    if (audioRecord == nullptr) return;
    audioRecord->stop();
}

int SoundMeter::getRecordState() { return recordState.load(std::memory_order_relaxed); }
