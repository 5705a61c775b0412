// The meter object's ownership of its tone generator.
#include <log/log.h>

#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

namespace {
const char* const kTag = "TQX";
const char* const kWho = "SoundMeter";

void destroyGenerator(android::MiniToneGenerator* generator) {
    generator->clearAudioTrack();
    delete generator;
}
}  // namespace

void SoundMeter::makeToneGenerator(audio_stream_type_t streamType) {
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] makeToneGenerator", kWho);
    // A generator the host did not release first would be lost: it is released here instead.
    if (toneGenerator != nullptr) destroyGenerator(toneGenerator);
    toneGenerator = new android::MiniToneGenerator(streamType, 0.8f, false);
}

void SoundMeter::releaseToneGenerator() {
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] releaseToneGenerator", kWho);
    if (toneGenerator == nullptr) return;
    destroyGenerator(toneGenerator);
    toneGenerator = nullptr;
}
