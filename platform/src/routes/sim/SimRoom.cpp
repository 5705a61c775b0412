// The sim:ROOM routes: loudspeakers and microphones of processes that meet in a
// room in shared memory (see SimRoomMembership.h and SimRoomSlot.h).
#include <log/log.h>
#include <utils/Errors.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdint>
#include <unistd.h>

#include "routes/RouteBackend.h"
#include "routes/sim/SimAcoustics.h"
#include "routes/sim/SimRoomClock.h"
#include "routes/sim/SimRoomConfig.h"
#include "routes/sim/SimRoomLayout.h"
#include "routes/sim/SimRoomMembership.h"
#include "routes/sim/SimRoomNoise.h"
#include "routes/sim/SimRoomSlot.h"

namespace korvo {
namespace platform {

namespace {

using sim::RoomMembership;

constexpr const char* kTag = "SimRoom";
// Work is done in pieces of this many samples (stack buffers, bounded pacing).
constexpr size_t kChunk = 1024;
// A speaker whose next position is closer to "now" than this starts over at
// now + latency: anything later might miss a microphone that already read it.
constexpr int64_t kResyncMargin = sim::kLatencySamples / 4;
// A microphone more than this far behind drops its backlog, as a capture buffer
// that overran would.
constexpr int64_t kMaxBacklog = sim::kRoomRate;

bool checkRate(uint32_t sampleRate, const char* what) {
    if (sampleRate == sim::kRoomRate) return true;
    __android_log_print(ANDROID_LOG_ERROR, kTag, "sim room %s runs at %u Hz only, not %u Hz", what,
                        unsigned(sim::kRoomRate), unsigned(sampleRate));
    return false;
}

// How often a member looks whether its room is still there.
constexpr int64_t kPresenceCheckSamples = sim::kRoomRate / 4;

// A room removed under its members (by hand, or by a cleaner) is a device that went away.
class Presence {
public:
    // False once the room has gone; looks at most every quarter second of the timeline.
    bool ok(const RoomMembership& room, int64_t position) {
        if (mGone.load(std::memory_order_relaxed)) return false;
        if (position - mLastCheck < kPresenceCheckSamples && mLastCheck != 0) return true;
        mLastCheck = position;
        if (room.stillThere()) return true;
        mGone.store(true, std::memory_order_relaxed);
        return false;
    }
    std::string failure() const { return mGone.load(std::memory_order_relaxed) ? "the room was removed" : ""; }

private:
    int64_t mLastCheck = 0;
    std::atomic<bool> mGone{false};
};

// Room samples (full scale 1) to the ring's int16, clipped at full scale as a converter does.
void toRing(const float* in, long count, int16_t* out) {
    for (long i = 0; i < count; ++i) out[i] = int16_t(std::nearbyint(std::clamp(double(in[i]) * 32768.0, -32768.0, 32767.0)));
}

class SimOutputRoute : public OutputRoute {
public:
    SimOutputRoute(std::unique_ptr<RoomMembership> room, std::unique_ptr<sim::SpeakerAcoustics> acoustics)
        : mRoom(std::move(room)),
          mAcoustics(std::move(acoustics)),
          // A slot left by an earlier speaker may reach into the future; continue after it.
          mNext(mRoom->slot().end.load(std::memory_order_relaxed)) {}

    int open(uint32_t sampleRate) override {
        if (!checkRate(sampleRate, "speaker")) return android::BAD_VALUE;
        mWaiter.rearm();
        return android::OK;
    }

    // Real-time: no allocation; blocks only to pace the caller, until stop().
    int write(const int16_t* samples, size_t count) override {
        if (!mPresence.ok(*mRoom, sim::timelineNow())) return android::DEAD_OBJECT;
        while (count > 0 && !mWaiter.stopped()) {
            const size_t n = std::min(count, kChunk);
            const int64_t now = sim::timelineNow();
            if (mNext < now + kResyncMargin) mNext = now + sim::kLatencySamples;
            size_t placed = n;
            if (mAcoustics) {
                placed = size_t(mAcoustics->play(samples, long(n), mRoomSamples));
                toRing(mRoomSamples, long(placed), mPlaced);
                sim::placeSamples(mRoom->slot(), mNext, mPlaced, placed);
            } else {
                sim::placeSamples(mRoom->slot(), mNext, samples, n);
            }
            mNext += int64_t(placed);
            samples += n;
            count -= n;
            // Ready for more when exactly the latency is left queued.
            if (!mWaiter.waitFor(mNext - sim::kLatencySamples)) break;
        }
        return android::OK;
    }

    void stop() override { mWaiter.stop(); }
    std::string failure() const override { return mPresence.failure(); }

private:
    std::unique_ptr<RoomMembership> mRoom;
    std::unique_ptr<sim::SpeakerAcoustics> mAcoustics;  // none in today's ideal room
    float mRoomSamples[kChunk + 64];
    int16_t mPlaced[kChunk + 64];
    int64_t mNext;  // timeline position of the next sample to write
    sim::TimelineWaiter mWaiter;
    Presence mPresence;
};

class SimCaptureRoute : public CaptureRoute, private acoustics::ClockDrift::Source {
public:
    SimCaptureRoute(std::unique_ptr<RoomMembership> room, const sim::MicSettings& settings,
                    std::unique_ptr<sim::RoomHearing> hearing)
        : mRoom(std::move(room)),
          mGain(std::pow(10.0, settings.gainDb / 20.0)),
          mNoiseRms(settings.noiseDbfs ? 32768.0 * std::pow(10.0, *settings.noiseDbfs / 20.0) : 0.0),
          mNoise(settings.seed),
          mHearing(std::move(hearing)) {}

    // A microphone whose device clock is off the room's.
    bool setClock(double ppm, std::string* error) {
        mClock = acoustics::ClockDrift::forMicrophone(ppm, this, error);
        return mClock != nullptr;
    }

    int open(uint32_t sampleRate) override {
        if (!checkRate(sampleRate, "microphone")) return android::BAD_VALUE;
        mWaiter.rearm();
        mReadPos = sim::timelineNow();  // hears what is played from now on
        mOpened = true;
        return android::OK;
    }

    ssize_t read(int16_t* out, size_t count) override {
        if (!mOpened) return android::NO_INIT;
        const int64_t now = sim::timelineNow();
        if (!mPresence.ok(*mRoom, now)) return android::DEAD_OBJECT;
        if (mClock) return readThroughClock(out, count);
        if (now - mReadPos > kMaxBacklog) mReadPos = now;
        size_t n = count;
        if (!mWaiter.waitFor(mReadPos + int64_t(count))) {
            // Stopped: hand over what has already been heard.
            n = size_t(std::clamp<int64_t>(sim::timelineNow() - mReadPos, 0, int64_t(count)));
        }
        for (size_t done = 0; done < n;) {
            const size_t part = std::min(n - done, kChunk);
            hear(mReadPos, part, out + done);
            mReadPos += int64_t(part);
            done += part;
        }
        return ssize_t(n);
    }

    void stop() override { mWaiter.stop(); }
    std::string failure() const override { return mPresence.failure(); }

private:
    // The device's converter samples the room at its own clock: the room's sound is taken a
    // piece at a time, as the timeline reaches it (fetch below).
    ssize_t readThroughClock(int16_t* out, size_t count) {
        size_t done = 0;
        while (done < count) {
            float device[kChunk];
            const long want = long(std::min(count - done, kChunk));
            const long got = mClock->pull(device, want);
            if (got <= 0) break;
            finish(device, size_t(got), out + done);
            done += size_t(got);
            if (got < want) break;
        }
        return ssize_t(done);
    }

    long fetch(float** data) override {
        const int64_t now = sim::timelineNow();
        if (now - mReadPos > kMaxBacklog) mReadPos = now;
        long n = long(kChunk);
        if (!mWaiter.waitFor(mReadPos + n)) n = long(std::clamp<int64_t>(sim::timelineNow() - mReadPos, 0, n));
        if (n > 0) mHearing->hear(mRoom->layout(), mReadPos, int(n), mFetched);
        mReadPos += n;
        *data = mFetched;
        return n;
    }

    // Mixes every speaker over [position, position + count), count <= kChunk.
    void hear(int64_t position, size_t count, int16_t* out) {
        if (mHearing) {
            float room[kChunk];
            mHearing->hear(mRoom->layout(), position, int(count), room);
            finish(room, count, out);
            return;
        }
        int32_t mix[kChunk] = {};
        int16_t scratch[kChunk];
        for (const sim::SpeakerSlot& slot : mRoom->layout().slots) {
            const sim::SlotSpan span = sim::readSamples(slot, position, count, scratch);
            for (int64_t p = span.from; p < span.to; ++p) mix[p - position] += scratch[p - position];
        }
        for (size_t i = 0; i < count; ++i) out[i] = toSample(double(mix[i]));
    }

    // The microphone's gain and own noise, then its converter's full scale.
    void finish(const float* room, size_t count, int16_t* out) {
        for (size_t i = 0; i < count; ++i) out[i] = toSample(double(room[i]) * 32768.0);
    }

    int16_t toSample(double v) {
        v *= mGain;
        if (mNoiseRms > 0.0) v += mNoiseRms * mNoise.next();
        return int16_t(std::nearbyint(std::clamp(v, -32768.0, 32767.0)));
    }

    std::unique_ptr<RoomMembership> mRoom;
    const double mGain;
    const double mNoiseRms;
    sim::NoiseSource mNoise;
    std::unique_ptr<sim::RoomHearing> mHearing;     // none in today's ideal room
    std::unique_ptr<acoustics::ClockDrift> mClock;  // none on the room's clock
    float mFetched[kChunk];
    int64_t mReadPos = 0;  // timeline position of the next sample to deliver
    bool mOpened = false;
    sim::TimelineWaiter mWaiter;
    Presence mPresence;
};

bool checkSimRoute(const std::string& room, bool speaker, std::string* reason) {
    if (!speaker && !sim::micSettingsFromEnv(reason)) return false;
    if (!sim::acousticSettingsFromEnv(reason)) return false;
    return RoomMembership::check(room, speaker ? RoomMembership::Role::Speaker : RoomMembership::Role::Microphone,
                                 reason);
}

int simRoomSpeakers(const std::string& room, const std::vector<pid_t>& ours, std::string* reason) {
    return RoomMembership::speakers(room, ours, reason);
}

std::unique_ptr<CaptureRoute> makeSimCaptureRoute(const std::string& room, std::string* error) {
    if (!sim::validateRoomName(room, error)) return nullptr;
    const std::optional<sim::MicSettings> settings = sim::micSettingsFromEnv(error);
    if (!settings) return nullptr;
    const std::optional<sim::AcousticSettings> acoustics = sim::acousticSettingsFromEnv(error);
    if (!acoustics) return nullptr;
    std::unique_ptr<sim::RoomHearing> hearing;
    if (!acoustics->ideal()) {
        hearing = sim::RoomHearing::make(*acoustics, settings->seed, sim::processIdentity(getpid()), error);
        if (!hearing) return nullptr;
    }
    auto membership = RoomMembership::join(room, RoomMembership::Role::Microphone, error);
    if (!membership) return nullptr;
    auto route = std::make_unique<SimCaptureRoute>(std::move(membership), *settings, std::move(hearing));
    if (acoustics->clockPpm != 0.0 && !route->setClock(acoustics->clockPpm, error)) return nullptr;
    return route;
}

std::unique_ptr<OutputRoute> makeSimOutputRoute(const std::string& room, std::string* error) {
    const std::optional<sim::AcousticSettings> acoustics = sim::acousticSettingsFromEnv(error);
    if (!acoustics) return nullptr;
    std::unique_ptr<sim::SpeakerAcoustics> speaker;
    if (!acoustics->ideal()) {
        speaker = sim::SpeakerAcoustics::make(*acoustics, error);
        if (!speaker) return nullptr;
    }
    auto membership = RoomMembership::join(room, RoomMembership::Role::Speaker, error);
    if (!membership) return nullptr;
    return std::make_unique<SimOutputRoute>(std::move(membership), std::move(speaker));
}

}  // namespace

extern const RouteBackend kSimBackend;
const RouteBackend kSimBackend = {"sim",
                                  "sim:ROOM",
                                  false,
                                  "a room name (sim:ROOM)",
                                  makeSimCaptureRoute,
                                  makeSimOutputRoute,
                                  checkSimRoute,
                                  sim::validateRoomName,
                                  simRoomSpeakers};

}  // namespace platform
}  // namespace korvo
