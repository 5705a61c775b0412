// The meter object: construction, destruction and the small accessors.
#include "meter/SoundMeter.h"

#include "capture/CaptureStream.h"
#include "common/LogTags.h"

SoundMeter::SoundMeter()
    : sampleRate(korvo::kSampleRate),
      bufferSize(0),
      frameSamples(korvo::kFrameSamples),
      sleep(0),
      ringIndex(0),
      frameFill(0),
      prepareCountdown(200),
      count(0),
      need_ack(0),
      last_said(-1),
      last_heard(-1),
      listener_state(0),
      speaker_state(0),
      recordState(0),
      fillAtRead(0),
      frameRemaining(0),
      role(0),
      audioRecord(nullptr),
      toneGenerator(nullptr),
      recordFrameCount(0) {
    METER_LOGD("[%s] SoundMeter start!");
    METER_LOGD("[%s] audio_is_input_channel succeeded");
    // 16 = mono input, 2 = 16-bit PCM. A failed query (-1) leaves -2 here; startRecord copes with it.
    bufferSize = 2 * AudioRecord_getMinBufferSize(sampleRate, 16, 2);
    METER_LOGD("[%s] bufferSize=%d", bufferSize);
    METER_LOGD("[%s] nbChannels=0x%x, bytesPerSample=0x%x", 1, 2);
    // Frame period in whole milliseconds, in single precision: 1000 / 86.1328125 = 11.6 → 11.
    sleep = static_cast<int64_t>(1000.0f / (static_cast<float>(sampleRate) / static_cast<float>(frameSamples)));
    recordFrameCount = bufferSize / 2;
    METER_LOGD("[%s] AudioRecord Set succeeded. sleep set to %ld", static_cast<long>(sleep));
    METER_LOGD("[%s] AudioRecord Set succeeded. sleep set to %ld\n", static_cast<long>(sleep));
    ringIndex.store(0, std::memory_order_relaxed);
    frameFill.store(0, std::memory_order_relaxed);
}

SoundMeter::~SoundMeter() {
    end_wf_thread();
    // The capture stream goes with its last reference; the tone generator is the host's to release.
    audioRecord.clear();
}

void SoundMeter::setNeedAck(bool on) { need_ack = on ? 1 : 0; }

void SoundMeter::setRole(int mask) { role = mask; }

int SoundMeter::getRole() { return role; }

int SoundMeter::getCount() { return count; }
