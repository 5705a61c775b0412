#include "routes/sim/SimAcoustics.h"

#include <algorithm>
#include <cmath>

#include "routes/sim/SimRoomSlot.h"

namespace korvo {
namespace platform {
namespace sim {

namespace {

constexpr float kFullScale = 32768.0f;

}  // namespace

SpeakerAcoustics::SpeakerAcoustics(const AcousticSettings& settings)
    : mDistortion(settings.device->secondDb, settings.device->thirdDb), mResponse(settings.device->speaker, kRoomRate) {}

std::unique_ptr<SpeakerAcoustics> SpeakerAcoustics::make(const AcousticSettings& settings, std::string* error) {
    std::unique_ptr<SpeakerAcoustics> s(new SpeakerAcoustics(settings));
    if (settings.clockPpm != 0.0) {
        s->mClock = acoustics::ClockDrift::forSpeaker(settings.clockPpm, error);
        if (!s->mClock) return nullptr;
    }
    return s;
}

long SpeakerAcoustics::play(const int16_t* in, long count, float* out) {
    float* work = mClock ? mScratch : out;
    for (long i = 0; i < count; ++i) work[i] = static_cast<float>(in[i]) / kFullScale;
    mDistortion.process(work, static_cast<int>(count));
    mResponse.process(work, static_cast<int>(count));
    if (!mClock) return count;
    return mClock->push(work, count, out, count + 64);
}

RoomHearing::RoomHearing(const AcousticSettings& settings, uint64_t seed, uint64_t ownIdentity)
    : mOwn(ownIdentity),
      mPeerGain(static_cast<float>(1.0 / settings.distanceM)),
      mSelfGain(settings.device->selfDistanceM > 0.0 ? static_cast<float>(1.0 / settings.device->selfDistanceM) : mPeerGain),
      mPeerDelay(std::lround(settings.distanceM / acoustics::kSpeedOfSound * kRoomRate)),
      mSelfDelay(settings.device->selfDistanceM > 0.0 ? std::lround(settings.device->selfDistanceM / acoustics::kSpeedOfSound * kRoomRate)
                                                       : mPeerDelay),
      mReverb(settings.room->decaySeconds, settings.room->criticalDistanceM, seed * 7919 + 3, kRoomRate),
      mResponse(settings.device->microphone, kRoomRate) {}

std::unique_ptr<RoomHearing> RoomHearing::make(const AcousticSettings& settings, uint64_t seed, uint64_t ownIdentity,
                                               std::string* error) {
    std::unique_ptr<RoomHearing> h(new RoomHearing(settings, seed, ownIdentity));
    h->mBackground = acoustics::Background::make(settings.room->sounds, seed, kRoomRate, settings.musicFile, error);
    if (!h->mBackground) return nullptr;
    return h;
}

void RoomHearing::hear(const RoomLayout& room, int64_t position, int count, float* out) {
    int16_t scratch[kAcousticChunk];
    std::fill(out, out + count, 0.0f);
    std::fill(mToReverb, mToReverb + count, 0.0f);
    for (const SpeakerSlot& slot : room.slots) {
        const bool own = slot.owner.load(std::memory_order_relaxed) == mOwn;
        const int64_t from = position - (own ? mSelfDelay : mPeerDelay);
        const float gain = own ? mSelfGain : mPeerGain;
        const SlotSpan span = readSamples(slot, from, static_cast<size_t>(count), scratch);
        for (int64_t p = span.from; p < span.to; ++p) {
            const float x = scratch[p - from] / kFullScale;
            out[p - from] += gain * x;
            mToReverb[p - from] += x;
        }
    }
    if (!mReverb.none()) {
        mReverb.process(mToReverb, mReverberant, count);
        for (int i = 0; i < count; ++i) out[i] += mReverberant[i];
    }
    mBackground->add(out, count);
    mResponse.process(out, count);
}

}  // namespace sim
}  // namespace platform
}  // namespace korvo
