#include "host/Device.h"

#include <system/audio.h>

#include "host/Clock.h"
#include "host/Interrupt.h"

namespace korvo {
namespace host {

bool Device::open(const DeviceSettings& settings, std::string* error) {
    close();
    mMeter = mPlugin.make();
    if (mMeter == nullptr) {
        if (error) *error = "the plug-in made no meter object";
        return false;
    }
    mMeter->makeToneGenerator(AUDIO_STREAM_MUSIC);
    mMeter->start_wf_thread();
    mMeter->startRecord();
    if (mMeter->getRecordState() != 1) {
        if (error) *error = "the microphone could not be started (see -v for the platform's reason)";
        close();
        return false;
    }
    mMeter->setRole(settings.role);
    mMeter->setNeedAck(settings.needAck);
    if (settings.setLevel) mMeter->setDetectionLevel(settings.level);
    return true;
}

void Device::close() {
    if (mMeter == nullptr) return;
    mMeter->stopRecord();
    mMeter->end_wf_thread();
    mMeter->releaseToneGenerator();
    mPlugin.destroy(mMeter);
    mMeter = nullptr;
}

Heard Device::hearUntil(int code, int64_t deadlineMs) {
    for (;;) {
        if (interrupted()) return Heard::Interrupted;
        if (mMeter->HearFreqIdx(code) == code) return Heard::Yes;
        if (monotonicMs() >= deadlineMs) return Heard::TimedOut;
    }
}

void Device::sayCode(int code, int durationMs) {
    mMeter->setSpeakerState(0);
    mMeter->SayFreqIdx(code, durationMs);
}

bool Device::stepUntil(int64_t deadlineMs) {
    while (monotonicMs() < deadlineMs) {
        if (interrupted()) return false;
        mMeter->processAudio();
    }
    return !interrupted();
}

}  // namespace host
}  // namespace korvo
