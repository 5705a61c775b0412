// Tone engine, caller side: construction, the output track, startTone/stopTone in
// every state, failures and timed-out waits. Callbacks are pumped by hand from the
// test thread while startTone/stopTone block on another one.
#include <errno.h>

#include <chrono>
#include <cstdio>
#include <tuple>

#include <log/log.h>
#include <media/AudioTrack.h>

#include "support/ToneTestSupport.h"

namespace {

using namespace korvo::tonetest;
using ToneEngineTest = ToneTest;

// The fields that follow the output rate: rate, block size, last tone code.
std::tuple<uint32_t, uint32_t, uint32_t> rateFields(const Engine& gen) {
    return {gen.mSamplingRate, gen.mProcessSize, gen.mMaxToneIndex};
}

time_t startSec(Engine& gen) {
    return underLock(gen, [&] { return gen.mStartTime.tv_sec; });
}

TEST_F(ToneEngineTest, ConstructionDestructionAndUnknownCodes) {
    {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
        EXPECT_EQ(rateFields(gen), std::make_tuple(44100u, 882u, 39u));
        EXPECT_EQ(gen.getMaxToneIndex(), 39);
        EXPECT_EQ(gen.mpToneDesc, nullptr);
        EXPECT_EQ(gen.mpNewToneDesc, nullptr);
        EXPECT_EQ(gen.mStreamType, AUDIO_STREAM_MUSIC);
        EXPECT_FALSE(gen.mThreadCanCallRuntime);
        ASSERT_NE(gen.mpAudioTrack, nullptr);
        EXPECT_FLOAT_EQ(gen.mpAudioTrack->getVolume(), 0.8f);
        EXPECT_EQ(gen.mpAudioTrack->getSampleRate(), 44100u);
        EXPECT_EQ(test::tracksCreated(), 1);
        EXPECT_FALSE(test::trackPlaying());
        // The table is laid down: code 1 is 3440 Hz.
        EXPECT_EQ(Engine::sToneDescriptors[1].segments[0].waveFreq[0], 3440);
        char created[64];
        snprintf(created, sizeof created, "zemla Create Track: %p", static_cast<void*>(gen.mpAudioTrack.get()));
        EXPECT_TRUE(hasToneLine(ANDROID_LOG_ERROR, created));
        EXPECT_TRUE(
            hasToneLine(ANDROID_LOG_ERROR, "MiniToneGenerator constructor: streamType=3, volume=0.800000"));
        EXPECT_TRUE(hasToneLine(ANDROID_LOG_DEBUG, "MiniToneGenerator INIT OK, time: *"));
        EXPECT_TRUE(inOrder(toneMessages(), {"MiniToneGenerator constructor: *", "zemla Create Track: *",
                                             "MiniToneGenerator INIT OK, time: *"}));
        for (int code : {-1, 512, -1000, 100000}) {
            test::clearLog();
            EXPECT_FALSE(gen.startTone(code, 100)) << code;
            EXPECT_EQ(toneMessages(), Lines{"UNKNOWN TONE"}) << code;
            EXPECT_TRUE(hasToneLine(ANDROID_LOG_DEBUG, "UNKNOWN TONE"));
            EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
            EXPECT_EQ(gen.mpNewToneDesc, nullptr);
        }
        // stopTone with no tone logs its line only.
        test::clearLog();
        gen.stopTone();
        EXPECT_EQ(toneMessages(), Lines{"stopTone"});
        // 511, the last record, is accepted (an empty record: it ends by itself).
        EXPECT_TRUE(startAndPump(gen, 511, 100));
        EXPECT_EQ(gen.mpToneDesc, &Engine::sToneDescriptors[511]);
        drain(gen);
        test::clearLog();
    }
    EXPECT_TRUE(
        linesAre(toneMessages(), {"MiniToneGenerator destructor", "stopTone", "zemla Delete Track: 0x*"}));
}

TEST_F(ToneEngineTest, RestartWhilePlaying) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f), high(44100, 3440, 0.45f);
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    EXPECT_TRUE(test::pumpTrack().called);
    low.block(2 * 882, START);  // the two buffers so far
    test::clearLog();
    auto restarted = async([&gen] { return gen.startTone(1, -1); });
    ASSERT_TRUE(waitForToneMessage("Delayed start"));
    EXPECT_EQ(stateOf(gen), Engine::TONE_RESTARTING);
    EXPECT_EQ(startSec(gen), 0);

    // One buffer of two blocks: the old tone fades out, the new one starts.
    test::PumpResult p = test::pumpTrack(1764);
    ASSERT_TRUE(ready(restarted));
    EXPECT_TRUE(restarted.get());
    Samples want = low.block(882, STOP);
    append(want, high.block(882, START));
    EXPECT_EQ(p.samples, want);
    EXPECT_EQ(p.sizeBytes, 3528u);
    EXPECT_EQ(stateOf(gen), Engine::TONE_PLAYING);
    EXPECT_TRUE(test::trackPlaying());  // the track was never stopped
    EXPECT_EQ(test::trackStops(), 0);
    EXPECT_EQ(gen.mpToneDesc, &Engine::sToneDescriptors[1]);
    EXPECT_EQ(genCount(gen), 1u);
    EXPECT_NE(startSec(gen), 0);
    EXPECT_TRUE(inOrder(toneMessages(), {"startTone", "Delayed start", "Stop/restart Cbk",
                                         "Cbk restarting track", "Clearing mWaveGens:", "Starting Cbk",
                                         "Cbk starting track"}));
    EXPECT_TRUE(inOrder(toneMessages(), {"Delayed start", "cond received", "Tone started, time *"}));

    // Stopped while playing: the fade comes once the elapsed samples are produced.
    auto stopped = stopAsync(gen);
    drain(gen);
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(genCount(gen), 0u);
}

TEST_F(ToneEngineTest, StopToneElapsedTimeRules) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    EXPECT_EQ(locked(gen, &Engine::mMaxSmp), kInf);
    // As if the tone had started 1.5 s ago and had played all but two blocks of it.
    underLock(gen, [&] {
        gen.mStartTime.tv_sec -= gen.mStartTime.tv_nsec >= 500000000 ? 1 : 2;
        gen.mStartTime.tv_nsec = (gen.mStartTime.tv_nsec + 500000000) % 1000000000;
        gen.mTotalSmp = 66150 - 2 * 882;
    });
    test::clearLog();
    auto stopped = stopAsync(gen);
    uint32_t maxSmp = locked(gen, &Engine::mMaxSmp);
    EXPECT_GE(maxSmp, 66150u);
    EXPECT_LT(maxSmp, 66150u + 44100u);  // the test's own delay, well below a second
    EXPECT_EQ(stateOf(gen), Engine::TONE_PLAYING);
    // The fade is the first block past mMaxSmp.
    for (int blocks = 0; stateOf(gen) == Engine::TONE_PLAYING && blocks < 200; ++blocks) test::pumpTrack();
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    uint32_t total = locked(gen, &Engine::mTotalSmp);
    EXPECT_GT(total, maxSmp);
    EXPECT_LE(total - 882, maxSmp);
    EXPECT_FALSE(ready(stopped, 0));
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT));
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(genCount(gen), 0u);
    EXPECT_TRUE(inOrder(toneMessages(), {"stopTone", "waiting cond", "Cbk Stopping", "Stopped Cbk",
                                         "Cbk Stopped track", "Clearing mWaveGens:"}));
    EXPECT_EQ(test::trackStops(), 1);

    // Past 0x7FFFFFFF / rate seconds (48695 at 44100 Hz) whole seconds count.
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    underLock(gen, [&] { gen.mStartTime.tv_sec -= 50000; });
    stopped = stopAsync(gen);
    EXPECT_EQ(locked(gen, &Engine::mMaxSmp), 50000u * 44100u);
    underLock(gen, [&] { gen.mTotalSmp = 50000u * 44100u; });
    drain(gen);
    ASSERT_TRUE(ready(stopped));

    // Start time unknown: the tone is cut at the next block.
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    underLock(gen, [&] { gen.mStartTime.tv_sec = 0; });
    test::clearLog();
    stopped = stopAsync(gen);
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPING);
    EXPECT_TRUE(pumped(gen, Engine::TONE_STOPPED));
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT));
    ASSERT_TRUE(ready(stopped));
    EXPECT_TRUE(inOrder(toneMessages(), {"stopTone", "waiting cond", "Stop/restart Cbk", "Cbk Stopping",
                                         "Stopped Cbk", "Cbk Stopped track", "Clearing mWaveGens:"}));

    // stopTone while the tone ends by itself only waits.
    ASSERT_TRUE(startAndPump(gen, 0, 0));
    ASSERT_TRUE(pumped(gen, Engine::TONE_STOPPED));
    stopped = stopAsync(gen);
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT));
    ASSERT_TRUE(ready(stopped));
}

TEST_F(ToneEngineTest, StartWhilePreviousToneStops) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startAndPump(gen, 0, 0));
    test::pumpTrack();
    test::clearLog();
    auto started = async([&gen] { return gen.startTone(1, 100); });
    ASSERT_TRUE(waitForToneMessage("Start waiting for previous tone to stop"));
    // The callback stops the track, which wakes startTone into an immediate start.
    EXPECT_EQ(test::pumpTrack().sizeBytes, 0u);
    ASSERT_TRUE(waitForToneMessage("Wait for start callback"));
    EXPECT_TRUE(test::trackPlaying());
    test::PumpResult p = test::pumpTrack();
    ASSERT_TRUE(ready(started));
    EXPECT_TRUE(started.get());
    EXPECT_EQ(p.samples, RefWave(44100, 3440, 0.45f).block(882, START));
    EXPECT_TRUE(inOrder(toneMessages(), {"startTone", "Start waiting for previous tone to stop", "Stopped Cbk",
                                         "Cbk Stopped track", "Clearing mWaveGens:", "Immediate start, time *",
                                         "Wait for start callback", "Starting Cbk", "Cbk starting track",
                                         "Tone started, time *"}));
    EXPECT_EQ(test::trackStops(), 1);
    drain(gen);
    EXPECT_EQ(test::trackStops(), 2);
}

TEST_F(ToneEngineTest, TrackFailures) {
    // Failures of set() at construction: NO_INIT keeps the track for the next start to
    // replace; any other status shows in initCheck, which releases it.
    struct Case {
        void (*fail)(android::status_t);
        android::status_t status;
        uint16_t state;
        Lines initLog, startLog;  // the end of construction; a start while still failing
    };
    const Lines initCheckLog = {"AudioTrack->initCheck failed", "zemla Init failed: 0x*",
                                "!!!MiniToneGenerator INIT FAILED!!!"};
    const Lines reinitLog = {"startTone: try to re-init AudioTrack", "zemla Create Track: *"};
    const Case cases[] = {
        {test::failTrackSet, android::NO_INIT, Engine::TONE_REINIT,
         {"zemla Create Track: *", "Re-AudioTrack.....mState = TONE_REINIT",
          "!!!MiniToneGenerator INIT FAILED!!!"},
         {reinitLog[0], reinitLog[1], "Re-AudioTrack.....mState = TONE_REINIT"}},
        {test::failTrackInitCheck, android::BAD_VALUE, Engine::TONE_IDLE, initCheckLog,
         {reinitLog[0], reinitLog[1], initCheckLog[0], initCheckLog[1]}},
        {test::failTrackSet, android::BAD_VALUE, Engine::TONE_IDLE, initCheckLog,
         {reinitLog[0], reinitLog[1], initCheckLog[0], initCheckLog[1]}},
    };
    for (const Case& c : cases) {
        SetUp();
        c.fail(c.status);
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), c.state);
        EXPECT_EQ(gen.mpAudioTrack != nullptr, c.state == Engine::TONE_REINIT);
        Lines log = toneMessages();
        ASSERT_GE(log.size(), 4u);
        EXPECT_TRUE(linesAre(Lines(log.end() - 3, log.end()), c.initLog));
        test::clearLog();
        EXPECT_FALSE(gen.startTone(0, 100));
        EXPECT_TRUE(linesAre(toneMessages(), c.startLog));
        EXPECT_EQ(stateOf(gen), c.state);
        EXPECT_EQ(test::tracksCreated(), 2);
        // Recovers once the platform does.
        c.fail(0);
        test::clearLog();
        EXPECT_TRUE(startAndPump(gen, 0, 20));
        EXPECT_EQ(test::tracksCreated(), 3);
        EXPECT_TRUE(
            inOrder(toneMessages(), {reinitLog[0], reinitLog[1], "startTone", "Immediate start, time *"}));
        drain(gen);
    }
    {
        // From TONE_INIT: the state stays, the track goes.
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        ASSERT_EQ(stateOf(gen), Engine::TONE_INIT);
        test::failTrackInitCheck(android::NO_INIT);
        EXPECT_FALSE(gen.initAudioTrack());
        EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
        EXPECT_EQ(gen.mpAudioTrack, nullptr);
    }
    // start() fails: TONE_IDLE, and the next start makes a new track.
    SetUp();
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    test::failTrackStart(android::INVALID_OPERATION);
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
    EXPECT_TRUE(hasToneLine(ANDROID_LOG_ERROR, "zemla mpAudioTrack->start() error!: -38"));
    EXPECT_TRUE(lastToneLine(ANDROID_LOG_WARN, "Tone start failed!!!, time *"));
    EXPECT_FALSE(test::trackPlaying());
    test::failTrackStart(0);
    EXPECT_TRUE(startAndPump(gen, 0, 20));
    EXPECT_EQ(test::tracksCreated(), 2);
    drain(gen);
}

TEST_F(ToneEngineTest, OutputRateUnknown) {
    test::failOutputSamplingRate(android::NO_INIT);
    Engine gen(AUDIO_STREAM_VOICE_CALL, 0.5f, true);
    EXPECT_EQ(toneMessages(), (Lines{"MiniToneGenerator constructor: streamType=0, volume=0.500000",
                                     "Unable to marshal AudioFlinger"}));
    EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
    EXPECT_EQ(gen.mpAudioTrack, nullptr);
    // Defined values for everything that depends on the rate.
    EXPECT_EQ(rateFields(gen), std::make_tuple(0u, 0u, 0u));
    EXPECT_EQ(gen.mpToneDesc, nullptr);
    EXPECT_EQ(gen.mpNewToneDesc, nullptr);
    EXPECT_FLOAT_EQ(gen.mVolume, 0.5f);
    EXPECT_EQ(gen.mStreamType, AUDIO_STREAM_VOICE_CALL);
    // No tone while the rate stays unknown.
    test::clearLog();
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(toneMessages(), Lines{"startTone: output sampling rate unknown, tone refused"});
    EXPECT_EQ(test::tracksCreated(), 0);
    gen.stopTone();
    // Once the platform answers, the engine completes its set-up and plays.
    test::failOutputSamplingRate(0);
    EXPECT_TRUE(startAndPump(gen, 0, 20));
    EXPECT_EQ(rateFields(gen), std::make_tuple(44100u, 882u, 39u));
    EXPECT_TRUE(gen.mThreadCanCallRuntime);
    drain(gen);
}

// ---- the timed waits (3 s each) ----------------------------------------------

TEST_F(ToneEngineTest, StartWaitsTimeOut) {
    const std::string status = ", status " + std::to_string(-ETIMEDOUT);
    // Nobody pumps during the start; before it (0) no tone, (1) a tone plays, (2) one ends by itself.
    const std::pair<int, std::string> cases[] = {
        {0, "--- Immediate start timed out"},
        {1, "--- Delayed start timed out"},
        {2, "--- start wait for stop timed out"}};
    for (const auto& [before, line] : cases) {
        SCOPED_TRACE(line);
        SetUp();
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        if (before > 0) {
            ASSERT_TRUE(startAndPump(gen, 0, before == 1 ? -1 : 0));
        }
        if (before == 2) test::pumpTrack();
        test::clearLog();
        auto t0 = std::chrono::steady_clock::now();
        EXPECT_FALSE(gen.startTone(1, -1));
        EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(2900));
        EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
        EXPECT_TRUE(hasToneLine(ANDROID_LOG_ERROR, line + status));
        if (before == 2) {
            // Returns without a "Tone start failed" line.
            EXPECT_EQ(toneMessages(),
                      (Lines{"startTone", "Start waiting for previous tone to stop", line + status}));
            continue;
        }
        EXPECT_TRUE(lastToneLine(ANDROID_LOG_WARN, "Tone start failed!!!, time *"));
        if (before == 0) {
            // The track is left running; the next start replaces it.
            EXPECT_TRUE(test::trackPlaying());
            EXPECT_TRUE(startAndPump(gen, 1, 20));
            EXPECT_EQ(test::tracksCreated(), 2);
            drain(gen);
        } else {
            EXPECT_EQ(toneCount("cond received"), 0);
            // A callback now finds no tone to play.
            test::clearLog();
            EXPECT_EQ(test::pumpTrack().sizeBytes, 0u);
            EXPECT_EQ(toneMessages(), Lines{"Extra Cbk"});
        }
    }
}

TEST_F(ToneEngineTest, StopTimesOutWhenCallbacksStop) {
    // The real playback thread, paused as a device that stopped calling back.
    test::manualTrackCallbacks(false);
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(gen.startTone(0, -1));
    test::pauseTrackCallbacks(true);
    test::clearLog();
    gen.stopTone();
    EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
    // A callback already under way when the pause came may still have made its block.
    EXPECT_TRUE(
        inOrder(toneMessages(), {"stopTone", "waiting cond", "--- Stop timed out", "Clearing mWaveGens:"}));
    EXPECT_EQ(test::trackStops(), 1);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(genCount(gen), 0u);
    test::pauseTrackCallbacks(false);
}

// ---- the real playback thread ------------------------------------------------

TEST_F(ToneEngineTest, PlaysOnThePlaybackThread) {
    test::manualTrackCallbacks(false);
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(gen.startTone(0, 100));
    ASSERT_TRUE(test::waitTrackStopped(5000));
    ASSERT_TRUE(waitUntil([&] { return stateOf(gen) == Engine::TONE_INIT; }));
    // Restart and stop while the thread plays.
    ASSERT_TRUE(gen.startTone(1, -1));
    EXPECT_TRUE(gen.startTone(2, -1));
    EXPECT_EQ(locked(gen, &Engine::mpToneDesc), &Engine::sToneDescriptors[2]);
    // The wait has no loop: any broadcast ends it, so a stop made before the new
    // tone's first block would be woken by that block. Let the tone settle first.
    ASSERT_TRUE(waitUntil([&] { return stateOf(gen) == Engine::TONE_PLAYING; }));
    gen.stopTone();
    EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(toneCount("--- Stop timed out"), 0);
    EXPECT_EQ(toneCount("cond received"), 1);
    // Destroyed while playing: stops, then joins the thread.
    ASSERT_TRUE(gen.startTone(3, -1));
    gen.clearAudioTrack();
    EXPECT_EQ(gen.mpAudioTrack, nullptr);
    EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
    EXPECT_TRUE(
        inOrder(toneMessages(), {"stopTone", "waiting cond", "zemla clearAudioTrack, Delete Track: *"}));
}

}  // namespace
