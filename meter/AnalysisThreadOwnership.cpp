// The meter object's ownership of the process-wide analysis thread, and the
// operations that forward to it.
#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "common/LogTags.h"
#include "meter/SoundMeter.h"

void SoundMeter::start_wf_thread() {
    METER_LOGD("[%s] start_wf_thread");
    if (WF_Thread != nullptr) return;
    WF_Thread = new android::WaveformCanvas();
    WF_Thread->run("WaveformCanvas", 0, 0);
}

void SoundMeter::end_wf_thread() {
    if (WF_Thread != nullptr) {
        WF_Thread->requestExitAndWait();
        METER_LOGD("[%s] WF_Thread threadLoop finished");
        WF_Thread->release();
        WF_Thread.clear();
    }
    METER_LOGD("[%s] end_wf_thread");
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
