#include "envelope/RoomChannel.h"

#include <algorithm>
#include <cmath>

namespace korvo {
namespace envelope {

namespace {

constexpr double kRate = 44100.0;
constexpr int kChunk = 512;

}  // namespace

RoomChannel::RoomChannel(const acoustics::RoomPreset& room, const acoustics::DevicePreset& device, uint64_t seed,
                         Speaker speaker)
    : mSpeaker(std::move(speaker)),
      mDistortion(device.secondDb, device.thirdDb),
      mSpeakerResponse(device.speaker, kRate),
      // The path's delay: the speaker's sound is queued that many samples behind silence.
      mQueued(static_cast<size_t>(std::lround(room.distanceM / acoustics::kSpeedOfSound * kRate)), 0.0f),
      mGain(static_cast<float>(1.0 / room.distanceM)),
      mReverb(room.decaySeconds, room.criticalDistanceM, seed * 7919 + 3, kRate),
      mMicResponse(device.microphone, kRate),
      mRoom(kChunk),
      mReverberant(kChunk),
      mDevice(kChunk),
      mPlayed(kChunk + 64),
      mFetched(kChunk) {}

std::unique_ptr<RoomChannel> RoomChannel::make(const acoustics::RoomPreset& room, const acoustics::DevicePreset& device,
                                               uint64_t seed, Speaker speaker, std::string* error) {
    std::unique_ptr<RoomChannel> c(new RoomChannel(room, device, seed, std::move(speaker)));
    c->mBackground = acoustics::Background::make(room.sounds, seed, kRate, "", error);
    if (!c->mBackground) return nullptr;
    if (device.clockPpm != 0.0) {
        c->mSpeakerClock = acoustics::ClockDrift::forSpeaker(device.clockPpm, error);
        c->mMicClock = acoustics::ClockDrift::forMicrophone(-device.clockPpm, c.get(), error);
        if (!c->mSpeakerClock || !c->mMicClock) return nullptr;
    }
    return c;
}

void RoomChannel::speakerInto(int need) {
    std::vector<int16_t> device(kChunk);
    while (static_cast<int>(mQueued.size()) < need) {
        mSpeaker(mSpoken, kChunk, device.data());
        mSpoken += kChunk;
        for (int i = 0; i < kChunk; ++i) mDevice[static_cast<size_t>(i)] = device[static_cast<size_t>(i)] / 32768.0f;
        mDistortion.process(mDevice.data(), kChunk);
        mSpeakerResponse.process(mDevice.data(), kChunk);
        if (!mSpeakerClock) {
            mQueued.insert(mQueued.end(), mDevice.begin(), mDevice.end());
            continue;
        }
        const long n = mSpeakerClock->push(mDevice.data(), kChunk, mPlayed.data(), static_cast<long>(mPlayed.size()));
        mQueued.insert(mQueued.end(), mPlayed.begin(), mPlayed.begin() + n);
    }
}

void RoomChannel::roomChunk(float* out, int count) {
    speakerInto(count);
    // The direct sound at the path's level; the room reverberates what the speaker put into
    // it, as heard at the microphone's place (the same delay).
    for (int i = 0; i < count; ++i) {
        mRoom[static_cast<size_t>(i)] = mQueued.front();
        mQueued.pop_front();
        out[i] = mGain * mRoom[static_cast<size_t>(i)];
    }
    if (!mReverb.none()) {
        mReverb.process(mRoom.data(), mReverberant.data(), count);
        for (int i = 0; i < count; ++i) out[i] += mReverberant[static_cast<size_t>(i)];
    }
    mBackground->add(out, count);
    mMicResponse.process(out, count);
}

long RoomChannel::fetch(float** data) {
    roomChunk(mFetched.data(), kChunk);
    *data = mFetched.data();
    return kChunk;
}

void RoomChannel::capture(int16_t* out, int count) {
    std::vector<float> heard(static_cast<size_t>(count));
    if (mMicClock) {
        for (long done = 0; done < count;) done += mMicClock->pull(heard.data() + done, count - done);
    } else {
        for (int done = 0; done < count; done += kChunk) roomChunk(heard.data() + done, std::min(kChunk, count - done));
    }
    for (int i = 0; i < count; ++i) {
        out[i] = static_cast<int16_t>(std::nearbyint(std::clamp(double(heard[static_cast<size_t>(i)]) * 32768.0, -32768.0, 32767.0)));
    }
}

}  // namespace envelope
}  // namespace korvo
