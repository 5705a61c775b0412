// The meter object's ownership of its tone generator.
#include "common/LogTags.h"
#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

namespace {

void destroyGenerator(android::MiniToneGenerator* generator) {
    generator->clearAudioTrack();
    delete generator;
}

}  // namespace

void SoundMeter::makeToneGenerator(audio_stream_type_t streamType) {
    METER_LOGD("[%s] makeToneGenerator");
    // A generator the host did not release first would be lost: it is released here instead.
    if (toneGenerator != nullptr) destroyGenerator(toneGenerator);
    toneGenerator = new android::MiniToneGenerator(streamType, 0.8f, false);
}

void SoundMeter::releaseToneGenerator() {
    METER_LOGD("[%s] releaseToneGenerator");
    if (toneGenerator == nullptr) return;
    destroyGenerator(toneGenerator);
    toneGenerator = nullptr;
}
