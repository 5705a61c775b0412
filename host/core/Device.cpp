#include "host/core/Device.h"

#include <system/audio.h>

#include <algorithm>

#include "host/base/Clock.h"
#include "host/base/Interrupt.h"

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
    // Taken before the warm-up: a decoder of frames hears every frame from the first.
    mTap = std::make_unique<FrameTap>(mPlugin.frameRecordReader());
    mFramesCaptured = mFramesTaken = 0;
    mMeter->setRole(settings.role);
    mMeter->setNeedAck(settings.needAck);
    if (settings.setLevel) mMeter->setDetectionLevel(settings.level);
    // The capture ring starts with whatever memory held, and the analysis thread takes its
    // slots in turn: until every slot holds captured sound, a read-out can show a code
    // nobody said. Capture steps first fill the ring and let the analysis catch up.
    mSteps = 0;
    for (int i = 0; i < kWarmUpSteps && interruption() == Outcome::Done; ++i) step();
    return true;
}

void Device::close() {
    if (mMeter == nullptr) return;
    mMeter->stopRecord();
    mMeter->end_wf_thread();
    mMeter->releaseToneGenerator();
    mPlugin.destroy(mMeter);
    mMeter = nullptr;
    mTap.reset();
}

Outcome Device::interruption() {
    if (interrupted()) return Outcome::Interrupted;
    if (mWatch.failed()) return Outcome::RouteFailed;
    return Outcome::Done;
}

void Device::step() {
    mMeter->processAudio();
    ++mSteps;
    if (const int16_t* frame = mTap->next()) {
        std::copy(frame, frame + korvo::kFrameSamples, mKept[static_cast<size_t>(mFramesCaptured % kKeptFrames)].begin());
        ++mFramesCaptured;
    }
}

int Device::takeFrames(const int16_t** out) {
    const int64_t first = std::max(mFramesTaken, mFramesCaptured - kKeptFrames);
    int n = 0;
    for (int64_t f = first; f < mFramesCaptured; ++f) out[n++] = mKept[static_cast<size_t>(f % kKeptFrames)].data();
    mFramesTaken = mFramesCaptured;
    return n;
}

void Device::sayCode(int code, int durationMs) {
    mMeter->setSpeakerState(0);
    mMeter->SayFreqIdx(code, durationMs);
}

Outcome Device::stepUntil(int64_t deadlineMs) {
    while (monotonicMs() < deadlineMs) {
        const Outcome stop = interruption();
        if (stop != Outcome::Done) return stop;
        step();
    }
    return interruption();
}

int exitStatusOf(Outcome outcome) {
    switch (outcome) {
        case Outcome::Done: return 0;
        case Outcome::Interrupted: return 130;
        case Outcome::TimedOut:
        case Outcome::RouteFailed: return 1;
    }
    return 1;
}

}  // namespace host
}  // namespace korvo
