// Output track of the platform stand-in: set(), the playback thread and its pace,
// stop() from the callback or while it blocks, destruction, manual pumping, and the
// samples that reach the speaker route.
#include <future>
#include <mutex>

#include <log/log.h>
#include <media/AudioSystem.h>
#include <media/AudioTrack.h>

#include "support/PlatformTestSupport.h"

using namespace android;
using namespace korvo::platformtest;

namespace {

// What a test's callback sees and does.
struct Probe {
    std::atomic<int> calls{0}, badEvents{0};
    std::atomic<size_t> lastSize{0}, lastFrames{0};
    std::atomic<bool> calledWhileStopped{false}, entered{false};
    std::atomic<std::thread::id> lastThread{};
    int stopAt = 0;              // stop() the track from inside call n
    int dropAt = 0;              // drop the last reference from inside call n
    int emptyAt = 0;             // report nothing produced in call n
    size_t shortBytes = 0;       // report only this many bytes (0: all)
    std::mutex* gate = nullptr;  // taken in every call
    AudioTrack* track = nullptr;
    sp<AudioTrack> owner;
};

// Fills sample i of call c with c * 1000 + i (mod 2^16).
void probeCallback(int event, void* user, void* info) {
    Probe* p = static_cast<Probe*>(user);
    if (event != AudioTrack::EVENT_MORE_DATA) {
        p->badEvents++;
        return;
    }
    if (p->track != nullptr && p->track->stopped()) p->calledWhileStopped = true;
    p->entered = true;
    if (p->gate) std::lock_guard<std::mutex> lk(*p->gate);
    AudioTrack::Buffer* b = static_cast<AudioTrack::Buffer*>(info);
    int call = ++p->calls;
    p->lastSize = b->size;
    p->lastFrames = b->frameCount;
    p->lastThread = std::this_thread::get_id();
    for (size_t i = 0; i < b->size / 2; ++i) b->i16[i] = static_cast<short>(call * 1000 + static_cast<int>(i));
    if (p->shortBytes) b->size = p->shortBytes;
    if (call == p->emptyAt) b->size = 0;
    if (call == p->stopAt && p->track) p->track->stop();
    if (call == p->dropAt) p->owner.clear();
}

// The samples of the given calls' buffers (call, samples) joined in order; call 0 is silence.
std::vector<int16_t> probeSamples(std::initializer_list<std::pair<int, size_t>> calls) {
    std::vector<int16_t> s;
    for (const auto& [call, n] : calls) {
        for (size_t i = 0; i < n; ++i) s.push_back(static_cast<int16_t>(call ? call * 1000 + static_cast<int>(i) : 0));
    }
    return s;
}

status_t setUp(AudioTrack& t, Probe* p, uint32_t rate = 0) {
    return t.set(AUDIO_STREAM_MUSIC, rate, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_OUT_MONO, 0,
                 AUDIO_OUTPUT_FLAG_FAST, probeCallback, p, 0, nullptr, false, AUDIO_SESSION_ALLOCATE,
                 AudioTrack::TRANSFER_CALLBACK, nullptr, -1, -1, nullptr, false, 1.0f);
}

// A track set up for `p`, which it also records as the track to stop from the callback.
sp<AudioTrack> trackFor(Probe& p) {
    sp<AudioTrack> t = new AudioTrack();
    p.track = t.get();
    EXPECT_EQ(setUp(*t, &p), OK);
    return t;
}

using PlatformTrackTest = PlatformFixture;

TEST_F(PlatformTrackTest, OutputRateSetInitCheckAndBadRoute) {
    uint32_t rate = 1;
    EXPECT_EQ(AudioSystem::getOutputSamplingRate(&rate, AUDIO_STREAM_MUSIC), OK);
    EXPECT_EQ(rate, 44100u);
    EXPECT_EQ(AudioSystem::getOutputSamplingRate(nullptr), BAD_VALUE);
    test::setOutputSamplingRate(48000);
    EXPECT_EQ(AudioSystem::getOutputSamplingRate(&rate), OK);
    EXPECT_EQ(rate, 48000u);
    test::failOutputSamplingRate(NO_INIT);
    rate = 7;
    EXPECT_EQ(AudioSystem::getOutputSamplingRate(&rate), NO_INIT);
    EXPECT_EQ(rate, 7u);
    test::resetAll();
    EXPECT_EQ(AudioSystem::getOutputSamplingRate(&rate), OK);
    EXPECT_EQ(rate, 44100u);

    Probe p;
    sp<AudioTrack> t = new AudioTrack();
    EXPECT_EQ(t->initCheck(), NO_INIT);  // not set yet
    EXPECT_EQ(setUp(*t, &p), OK);
    EXPECT_EQ(t->initCheck(), OK);
    EXPECT_EQ(t->getSampleRate(), 44100u);
    EXPECT_TRUE(t->stopped());
    EXPECT_EQ(setUp(*t, &p), INVALID_OPERATION);  // set once
    // The volume is kept, the samples are not scaled.
    EXPECT_EQ(t->setVolume(0.8f), OK);
    EXPECT_FLOAT_EQ(t->getVolume(), 0.8f);
    EXPECT_EQ(t->setVolume(1.5f), BAD_VALUE);
    EXPECT_FLOAT_EQ(t->getVolume(), 0.8f);

    test::setOutputSamplingRate(48000);
    t = new AudioTrack();
    EXPECT_EQ(setUp(*t, &p), OK);
    EXPECT_EQ(t->getSampleRate(), 48000u);
    t = new AudioTrack();
    EXPECT_EQ(setUp(*t, &p, 22050), OK);  // an explicit rate wins
    EXPECT_EQ(t->getSampleRate(), 22050u);
    test::setOutputSamplingRate(0);

    t = new AudioTrack();  // only mono 16-bit
    EXPECT_EQ(t->set(AUDIO_STREAM_MUSIC, 0, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_OUT_STEREO), BAD_VALUE);
    EXPECT_EQ(t->initCheck(), BAD_VALUE);

    // Forced failures of set, of initCheck, and of the output rate that rate 0 needs.
    struct Forced {
        void (*force)(status_t);
        status_t status, set, init;
    };
    for (const Forced& row : {Forced{test::failTrackSet, NO_INIT, NO_INIT, NO_INIT},
                              Forced{test::failTrackInitCheck, BAD_VALUE, OK, BAD_VALUE},
                              Forced{test::failOutputSamplingRate, DEAD_OBJECT, DEAD_OBJECT, DEAD_OBJECT}}) {
        row.force(row.status);
        t = new AudioTrack();
        EXPECT_EQ(setUp(*t, &p), row.set);
        EXPECT_EQ(t->initCheck(), row.init);
        if (row.set != OK) {
            EXPECT_EQ(t->start(), row.set);  // a track that was not set does not start
        }
        row.force(0);
        EXPECT_EQ(t->initCheck(), row.set);  // a forced initCheck lasts while forced
    }
    EXPECT_EQ(test::tracksCreated(), 7);

    // A bad route text: set fails and says why.
    setenv("KORVO_SPEAKER", "loudspeaker", 1);
    test::captureLog(true);
    t = new AudioTrack();
    EXPECT_EQ(setUp(*t, &p), BAD_VALUE);
    EXPECT_EQ(t->initCheck(), BAD_VALUE);
    std::vector<test::LogLine> lines = test::logLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].tag, "AudioTrack");
    EXPECT_EQ(lines[0].prio, ANDROID_LOG_ERROR);
    EXPECT_NE(lines[0].msg.find("loudspeaker"), std::string::npos) << lines[0].msg;
    EXPECT_EQ(t->start(), BAD_VALUE);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(p.calls, 0);
}

TEST_F(PlatformTrackTest, PlaybackThreadPacesTheCallbacks) {
    Probe p;
    sp<AudioTrack> t = trackFor(p);
    auto t0 = std::chrono::steady_clock::now();
    ASSERT_EQ(t->start(), OK);
    EXPECT_TRUE(test::trackPlaying());
    EXPECT_FALSE(t->stopped());
    ASSERT_TRUE(waitUntil([&] { return p.calls >= 11; }));
    // Ten 20 ms buffers written after the first: at least about 200 ms at real time.
    EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(180));
    EXPECT_EQ(p.lastSize, 1764u);
    EXPECT_EQ(p.lastFrames, 882u);
    EXPECT_NE(p.lastThread.load(), std::this_thread::get_id());
    EXPECT_EQ(p.badEvents, 0);

    test::setTrackBufferSamples(441);
    int now = p.calls;
    ASSERT_TRUE(waitUntil([&] { return p.calls >= now + 2; }));
    EXPECT_EQ(p.lastSize, 882u);

    t->stop();
    EXPECT_TRUE(t->stopped());
    EXPECT_TRUE(test::waitTrackStopped(100));
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(test::trackStops(), 1);
}

TEST_F(PlatformTrackTest, StopFromInsideTheCallbackOrWhileItBlocks) {
    Probe p;
    p.stopAt = 3;
    sp<AudioTrack> t = trackFor(p);
    ASSERT_EQ(t->start(), OK);
    ASSERT_TRUE(test::waitTrackStopped(5000));
    EXPECT_EQ(p.calls, 3);
    // Nothing more arrives while stopped (a bounded look for what must not happen).
    EXPECT_FALSE(waitUntil([&] { return p.calls > 3; }, 100));
    // start() resumes the same thread.
    ASSERT_EQ(t->start(), OK);
    ASSERT_TRUE(waitUntil([&] { return p.calls >= 6; }));
    EXPECT_FALSE(p.calledWhileStopped);
    t->stop();

    // stop() never waits for a callback that blocks on a gate this thread holds.
    std::mutex gate;
    Probe q;
    q.gate = &gate;
    sp<AudioTrack> u = trackFor(q);
    std::unique_lock<std::mutex> held(gate);
    ASSERT_EQ(u->start(), OK);
    ASSERT_TRUE(waitUntil([&] { return q.entered.load(); }));
    auto stopped = std::async(std::launch::async, [&] { u->stop(); });
    EXPECT_EQ(stopped.wait_for(std::chrono::seconds(2)), std::future_status::ready);
    held.unlock();
    stopped.wait();
    EXPECT_TRUE(u->stopped());
    EXPECT_TRUE(waitUntil([&] { return q.calls >= 1; }));
}

TEST_F(PlatformTrackTest, DestructionJoinsOrDetaches) {
    {
        // Destroyed while playing: the thread is joined, no callback follows.
        Probe p;
        sp<AudioTrack> t = new AudioTrack();
        ASSERT_EQ(setUp(*t, &p), OK);
        ASSERT_EQ(t->start(), OK);
        ASSERT_TRUE(waitUntil([&] { return p.calls >= 2; }));
        t.clear();
        int after = p.calls;
        EXPECT_FALSE(waitUntil([&] { return p.calls > after; }, 60));
    }
    // The callback drops the last reference: the track goes on its own thread.
    Probe p;
    p.dropAt = 2;
    p.owner = new AudioTrack();
    ASSERT_EQ(setUp(*p.owner, &p), OK);
    ASSERT_EQ(p.owner->start(), OK);
    ASSERT_TRUE(waitUntil([&] { return p.calls >= 2; }));
    EXPECT_FALSE(waitUntil([&] { return p.calls > 2; }, 60));
    EXPECT_FALSE(test::trackPlaying());
}

TEST_F(PlatformTrackTest, ManualPumping) {
    test::manualTrackCallbacks(true);
    Probe pa, pb;
    sp<AudioTrack> a = new AudioTrack(), b = new AudioTrack();
    ASSERT_EQ(setUp(*a, &pa), OK);
    ASSERT_EQ(setUp(*b, &pb), OK);
    EXPECT_FALSE(test::pumpTrack().called);  // nothing started

    ASSERT_EQ(a->start(), OK);
    ASSERT_EQ(b->start(), OK);
    EXPECT_FALSE(waitUntil([&] { return pa.calls + pb.calls > 0; }, 60));  // no thread

    // The newest started track, on the calling thread.
    test::PumpResult r = test::pumpTrack();
    EXPECT_TRUE(r.called);
    EXPECT_EQ(pb.calls, 1);
    EXPECT_EQ(pa.calls, 0);
    EXPECT_EQ(pb.lastThread.load(), std::this_thread::get_id());
    EXPECT_EQ(r.sizeBytes, 1764u);
    EXPECT_EQ(r.samples, probeSamples({{1, 882}}));
    r = test::pumpTrack(100);
    EXPECT_EQ(r.sizeBytes, 200u);
    EXPECT_EQ(r.samples, probeSamples({{2, 100}}));

    // The newest track is stopped: no fallback to an older one.
    b->stop();
    EXPECT_TRUE(test::waitTrackStopped(0));
    EXPECT_FALSE(test::pumpTrack().called);
    EXPECT_FALSE(test::trackPlaying());
    ASSERT_EQ(a->start(), OK);
    EXPECT_TRUE(test::pumpTrack().called);
    EXPECT_EQ(pa.calls, 1);
    EXPECT_FALSE(test::trackPlaying());  // the newest created track (b) is stopped
    b.clear();
    EXPECT_TRUE(test::trackPlaying());  // now a is the newest
    EXPECT_FALSE(test::waitTrackStopped(20));
    EXPECT_EQ(test::tracksCreated(), 2);
    EXPECT_EQ(test::trackStops(), 1);

    // A track destroyed while another thread pumps it.
    auto pumper = std::async(std::launch::async, [&] {
        int n = 0;
        while (test::pumpTrack(64).called) ++n;
        return n;
    });
    ASSERT_TRUE(waitUntil([&] { return pa.calls >= 4; }));
    a.clear();
    ASSERT_EQ(pumper.wait_for(std::chrono::seconds(5)), std::future_status::ready);
    EXPECT_GE(pumper.get(), 2);
    int calls = pa.calls;
    EXPECT_FALSE(test::pumpTrack().called);
    EXPECT_EQ(pa.calls, calls);
}

TEST_F(PlatformTrackTest, SamplesReachTheWavRouteUnchanged) {
    const std::string path = mFiles.path("out.wav");
    setenv("KORVO_SPEAKER", ("wav:" + path).c_str(), 1);
    test::manualTrackCallbacks(true);
    {
        Probe p;
        p.emptyAt = 3;
        sp<AudioTrack> t = trackFor(p);
        ASSERT_EQ(t->setVolume(0.8f), OK);
        ASSERT_EQ(t->start(), OK);
        test::pumpTrack();  // call 1: 882 samples
        test::pumpTrack();  // call 2
        test::pumpTrack();  // call 3 produces nothing: silence of the buffer length
        p.shortBytes = 100;
        test::pumpTrack();  // call 4: only 50 samples
    }
    const auto wav = readWav(path);
    ASSERT_TRUE(wav.ok);
    EXPECT_EQ(wav.rate, 44100);
    EXPECT_EQ(wav.samples, probeSamples({{1, 882}, {2, 882}, {0, 882}, {4, 50}}));
}

TEST_F(PlatformTrackTest, PausedThreadsMakeNoCallbacks) {
    Probe p;
    sp<AudioTrack> t = trackFor(p);
    test::pauseTrackCallbacks(true);
    ASSERT_EQ(t->start(), OK);
    EXPECT_FALSE(waitUntil([&] { return p.calls > 0; }, 100));
    EXPECT_TRUE(test::trackPlaying());
    // resetAll lifts the pause.
    test::resetAll();
    EXPECT_TRUE(waitUntil([&] { return p.calls >= 2; }));
    EXPECT_EQ(test::tracksCreated(), 0);  // counters start again
}

}  // namespace
