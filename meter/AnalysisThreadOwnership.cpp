// The meter object's ownership of the process-wide analysis thread, and the
// operations that forward to it.
#include <log/log.h>

#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "meter/SoundMeter.h"

namespace {
const char* const kTag = "TQX";
const char* const kWho = "SoundMeter";
}  // namespace

void SoundMeter::start_wf_thread() {
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] start_wf_thread", kWho);
    if (WF_Thread != nullptr) return;
    WF_Thread = new android::WaveformCanvas();
    WF_Thread->run("WaveformCanvas", 0, 0);
}

void SoundMeter::end_wf_thread() {
    if (WF_Thread != nullptr) {
        WF_Thread->requestExitAndWait();
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] WF_Thread threadLoop finished", kWho);
        WF_Thread->release();
        WF_Thread.clear();
    }
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] end_wf_thread", kWho);
}

bool SoundMeter::getStateWFthread() { return WF_Thread != nullptr; }

// Without an analysis thread the forwarders do nothing and report what a fresh
// thread would: level 0, no bins.
void SoundMeter::setActive(bool on) {
    if (WF_Thread != nullptr) WF_Thread->setActive(on);
}

int SoundMeter::getDetectionLevel() { return WF_Thread != nullptr ? WF_Thread->getDetectionLevel() : 0; }

void SoundMeter::setDetectionLevel(int level) {
    if (WF_Thread != nullptr) WF_Thread->setDetectionLevel(level);
}

int SoundMeter::getSpectrumData(float* out) {
    return WF_Thread != nullptr ? WF_Thread->getSpectrumData(out) : 0;
}

int SoundMeter::getSpectrumData_zorv(float* out) {
    return WF_Thread != nullptr ? WF_Thread->getSpectrumData_zorv(out) : 0;
}
