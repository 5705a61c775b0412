#include "analysis/WaveformCanvas.h"

#include <unistd.h>

#include <cstdio>

#include "capture/FrameExchange.h"
#include "common/LogTags.h"
#include "interface/SoundMeterConstants.h"

namespace android {

namespace {
constexpr int kBins = korvo::kSpectrumBins;
constexpr int kFrameLength = korvo::kFrameSamples;
constexpr int kRingSlots = korvo::kRingSlots;
constexpr useconds_t kTurnPauseUs = 20000;
}  // namespace

WaveformCanvas::WaveformCanvas()
    : Thread(true),
      historyLength(1),
      spectrum(nullptr),
      history(nullptr),
      frameIndex(0),
      historyIndex(0),
      active(false),
      detectionLevel(0),
      rwFlag(0) {
    init_variables();
}

WaveformCanvas::~WaveformCanvas() {
    // The loop reads the tables: it must have ended before they go.
    requestExitAndWait();
    history.clear();
    spectrum.clear();
}

void WaveformCanvas::init_variables() {
    historyIndex = 0;
    detectionLevel.store(0, std::memory_order_relaxed);
    spectrum = new WaveTable_Double(kBins);
    history = new WaveTable_Double_2(kBins, historyLength);
}

bool WaveformCanvas::threadLoop() {
    Mmic_data_t copy;
    int word = 0;
    read_write_audio(&rwFlag, 0, &copy);
    read_write_audio_int(0, &word);
    // The analysis reads the 512 samples that end at the count; a count beyond what the
    // copied ring holds from this slot on is cut there rather than read past the copy.
    const int ringLeft = (kRingSlots - frameIndex) * kFrameLength;
    const int count = copy.count > ringLeft ? ringLeft : copy.count;
    pthread_mutex_lock(&AudioBufferLock);
    drawSpectrum(&copy.data[frameIndex * kFrameLength], count);
    frameIndex = (frameIndex + 1) % kRingSlots;
    pthread_cond_signal(&WaitAudioBuffer);
    pthread_mutex_unlock(&AudioBufferLock);
    usleep(kTurnPauseUs);
    return true;
}

void WaveformCanvas::setActive(bool on) { active.store(on, std::memory_order_relaxed); }

void WaveformCanvas::setDetectionLevel(int value) {
    detectionLevel.store(value, std::memory_order_relaxed);
    std::printf("[%s] detection Level is %d\n", korvo::kCanvasWho, value);
    CANVAS_LOG(ANDROID_LOG_ERROR, "[%s] detection Level is %d\n", value);
}

int WaveformCanvas::getDetectionLevel() { return detectionLevel.load(std::memory_order_relaxed); }

void WaveformCanvas::release() {
    CANVAS_LOG(ANDROID_LOG_DEBUG, "[%s] WaveformCanvas Relese");
}

}  // namespace android
