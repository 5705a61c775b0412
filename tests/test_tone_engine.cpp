// Tone engine, caller side: construction, the output track, startTone/stopTone in
// every state, failures and timed-out waits. Callbacks are pumped by hand from the
// test thread while startTone/stopTone block on another one.
#include <errno.h>
#include <time.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <future>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>
#include <log/log.h>
#include <media/AudioTrack.h>

#include "support/ToneTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace {

namespace test = korvo::platform::test;
using android::MiniToneGenerator;
using korvo::tonetest::countMessage;
using korvo::tonetest::hasLine;
using korvo::tonetest::inOrder;
using korvo::tonetest::RefWave;
using korvo::tonetest::stateOf;
using korvo::tonetest::toneMessages;
using korvo::tonetest::underLock;
using korvo::tonetest::waitForToneMessage;
using korvo::tonetest::waitUntil;
using Gen = MiniToneGenerator::WaveGenerator;

const char* const kTag = "MiniToneGenerator";
constexpr int kTimedOut = -ETIMEDOUT;

class ToneEngineTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        test::captureLog(true);
        test::clearLog();
        test::manualTrackCallbacks(true);
    }
    void TearDown() override { test::resetAll(); }

    template <class F>
    static auto async(F f) {
        return std::async(std::launch::async, f);
    }
    template <class T>
    static bool ready(std::future<T>& f, int seconds = 5) {
        return f.wait_for(std::chrono::seconds(seconds)) == std::future_status::ready;
    }
    // Starts a tone and pumps its first buffer once startTone waits for it.
    static bool startPlaying(MiniToneGenerator& gen, int code, int ms) {
        int waits = countMessage(kTag, "Wait for start callback");
        auto started = async([&gen, code, ms] { return gen.startTone(code, ms); });
        EXPECT_TRUE(waitForToneMessage("Wait for start callback", waits + 1));
        EXPECT_TRUE(test::pumpTrack().called);
        EXPECT_TRUE(ready(started));
        return started.get();
    }
    // Pumps until the tone has ended and the track is stopped.
    static void drain(MiniToneGenerator& gen) {
        for (int i = 0; i < 200 && stateOf(gen) != MiniToneGenerator::TONE_INIT; ++i) test::pumpTrack();
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    }
};

TEST_F(ToneEngineTest, ConstructionAndDestruction) {
    {
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
        EXPECT_EQ(gen.mSamplingRate, 44100u);
        EXPECT_EQ(gen.mProcessSize, 882u);
        EXPECT_EQ(gen.mMaxToneIndex, 39u);
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
        EXPECT_EQ(MiniToneGenerator::sToneDescriptors[1].segments[0].waveFreq[0], 3440);

        EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_ERROR,
                            "MiniToneGenerator constructor: streamType=3, volume=0.800000"));
        char created[64];
        snprintf(created, sizeof created, "zemla Create Track: %p",
                 static_cast<void*>(gen.mpAudioTrack.get()));
        EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_ERROR, created));
        EXPECT_TRUE(inOrder(toneMessages(), {"MiniToneGenerator constructor: *", "zemla Create Track: *",
                                             "MiniToneGenerator INIT OK, time: *"}));
        bool initOkAtDebug = false;
        for (const test::LogLine& l : test::logLines()) {
            if (l.msg.rfind("MiniToneGenerator INIT OK, time: ", 0) == 0) {
                initOkAtDebug = l.prio == ANDROID_LOG_DEBUG;
            }
        }
        EXPECT_TRUE(initOkAtDebug);

        // stopTone with no tone logs its line only.
        test::clearLog();
        gen.stopTone();
        EXPECT_EQ(toneMessages(), std::vector<std::string>{"stopTone"});
        test::clearLog();
    }
    std::vector<std::string> log = toneMessages();
    ASSERT_EQ(log.size(), 3u);
    EXPECT_EQ(log[0], "MiniToneGenerator destructor");
    EXPECT_EQ(log[1], "stopTone");
    EXPECT_EQ(log[2].rfind("zemla Delete Track: 0x", 0), 0u) << log[2];
}

TEST_F(ToneEngineTest, UnknownCodes) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    for (int code : {-1, 512, -1000, 100000}) {
        test::clearLog();
        EXPECT_FALSE(gen.startTone(code, 100)) << code;
        EXPECT_EQ(toneMessages(), std::vector<std::string>{"UNKNOWN TONE"}) << code;
        EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_DEBUG, "UNKNOWN TONE"));
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
        EXPECT_EQ(gen.mpNewToneDesc, nullptr);
    }
    // 511, the last record, is accepted (an empty record: it ends by itself).
    EXPECT_TRUE(startPlaying(gen, 511, 100));
    EXPECT_EQ(gen.mpToneDesc, &MiniToneGenerator::sToneDescriptors[511]);
    drain(gen);
}

TEST_F(ToneEngineTest, RestartWhilePlaying) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f);
    RefWave high(44100, 3440, 0.45f);
    ASSERT_TRUE(startPlaying(gen, 0, -1));
    low.block(882, Gen::WAVEGEN_START);
    EXPECT_TRUE(test::pumpTrack().called);
    low.block(882, Gen::WAVEGEN_CONT);

    test::clearLog();
    auto restarted = async([&gen] { return gen.startTone(1, -1); });
    ASSERT_TRUE(waitForToneMessage("Delayed start"));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_RESTARTING);
    EXPECT_EQ(underLock(gen, [&] { return gen.mStartTime.tv_sec; }), 0);

    // One buffer of two blocks: the old tone fades out, the new one starts.
    test::PumpResult p = test::pumpTrack(1764);
    ASSERT_TRUE(ready(restarted));
    EXPECT_TRUE(restarted.get());
    std::vector<int16_t> want = low.block(882, Gen::WAVEGEN_STOP);
    std::vector<int16_t> second = high.block(882, Gen::WAVEGEN_START);
    want.insert(want.end(), second.begin(), second.end());
    EXPECT_EQ(p.samples, want);
    EXPECT_EQ(p.sizeBytes, 3528u);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);
    EXPECT_TRUE(test::trackPlaying());  // the track was never stopped
    EXPECT_EQ(test::trackStops(), 0);
    EXPECT_EQ(gen.mpToneDesc, &MiniToneGenerator::sToneDescriptors[1]);
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 1u);
    EXPECT_NE(underLock(gen, [&] { return gen.mStartTime.tv_sec; }), 0);
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"startTone", "Delayed start", "Stop/restart Cbk", "Cbk restarting track",
                         "Clearing mWaveGens:", "Starting Cbk", "Cbk starting track"}));
    EXPECT_TRUE(inOrder(toneMessages(), {"Delayed start", "cond received", "Tone started, time *"}));

    // Stopped while playing: the fade comes once the elapsed samples are produced.
    auto stopped = async([&gen] { gen.stopTone(); });
    ASSERT_TRUE(waitForToneMessage("waiting cond"));
    drain(gen);
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 0u);
}

TEST_F(ToneEngineTest, StopToneMidTone) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startPlaying(gen, 0, -1));
    EXPECT_EQ(underLock(gen, [&] { return gen.mMaxSmp; }), MiniToneGenerator::TONEGEN_INF + 0u);

    // As if the tone had started 1.5 s ago and had played all but two blocks of it.
    underLock(gen, [&] {
        gen.mStartTime.tv_sec -= 1;
        gen.mStartTime.tv_nsec -= 500000000;
        if (gen.mStartTime.tv_nsec < 0) {
            gen.mStartTime.tv_nsec += 1000000000;
            gen.mStartTime.tv_sec -= 1;
        }
        gen.mTotalSmp = 66150 - 2 * 882;
        return 0;
    });
    test::clearLog();
    auto stopped = async([&gen] { gen.stopTone(); });
    ASSERT_TRUE(waitForToneMessage("waiting cond"));
    uint32_t maxSmp = underLock(gen, [&] { return gen.mMaxSmp; });
    EXPECT_GE(maxSmp, 66150u);
    EXPECT_LT(maxSmp, 66150u + 44100u);  // the test's own delay, well below a second
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);

    // The fade is the first block past mMaxSmp.
    int blocks = 0;
    while (stateOf(gen) == MiniToneGenerator::TONE_PLAYING && blocks < 200) {
        test::pumpTrack();
        ++blocks;
    }
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    uint32_t total = underLock(gen, [&] { return gen.mTotalSmp; });
    EXPECT_GT(total, maxSmp);
    EXPECT_LE(total - 882, maxSmp);
    EXPECT_FALSE(ready(stopped, 0));

    test::pumpTrack();
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 0u);
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"stopTone", "waiting cond", "Cbk Stopping", "Stopped Cbk", "Cbk Stopped track",
                         "Clearing mWaveGens:"}));
    EXPECT_EQ(test::trackStops(), 1);
}

TEST_F(ToneEngineTest, StopToneElapsedTimeRules) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);

    // Past 0x7FFFFFFF / rate seconds (48695 at 44100 Hz) whole seconds count.
    ASSERT_TRUE(startPlaying(gen, 0, -1));
    underLock(gen, [&] {
        gen.mStartTime.tv_sec -= 50000;
        return 0;
    });
    auto stopped = async([&gen] { gen.stopTone(); });
    ASSERT_TRUE(waitForToneMessage("waiting cond"));
    EXPECT_EQ(underLock(gen, [&] { return gen.mMaxSmp; }), 50000u * 44100u);
    underLock(gen, [&] {
        gen.mTotalSmp = 50000u * 44100u;
        return 0;
    });
    drain(gen);
    ASSERT_TRUE(ready(stopped));

    // Start time unknown: the tone is cut at the next block.
    ASSERT_TRUE(startPlaying(gen, 0, -1));
    underLock(gen, [&] {
        gen.mStartTime.tv_sec = 0;
        return 0;
    });
    test::clearLog();
    stopped = async([&gen] { gen.stopTone(); });
    ASSERT_TRUE(waitForToneMessage("waiting cond"));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPING);
    test::pumpTrack();
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    test::pumpTrack();
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_TRUE(inOrder(toneMessages(), {"stopTone", "waiting cond", "Stop/restart Cbk", "Cbk Stopping",
                                         "Stopped Cbk", "Cbk Stopped track", "Clearing mWaveGens:"}));

    // stopTone while the tone ends by itself only waits.
    ASSERT_TRUE(startPlaying(gen, 0, 0));
    test::pumpTrack();
    ASSERT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    test::clearLog();
    stopped = async([&gen] { gen.stopTone(); });
    ASSERT_TRUE(waitForToneMessage("waiting cond"));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    test::pumpTrack();
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
}

TEST_F(ToneEngineTest, StartWhilePreviousToneStops) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startPlaying(gen, 0, 0));
    test::pumpTrack();
    ASSERT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);

    test::clearLog();
    auto started = async([&gen] { return gen.startTone(1, 100); });
    ASSERT_TRUE(waitForToneMessage("Start waiting for previous tone to stop"));
    // The callback stops the track, which wakes startTone into an immediate start.
    test::PumpResult p = test::pumpTrack();
    EXPECT_EQ(p.sizeBytes, 0u);
    ASSERT_TRUE(waitForToneMessage("Wait for start callback"));
    EXPECT_TRUE(test::trackPlaying());
    p = test::pumpTrack();
    ASSERT_TRUE(ready(started));
    EXPECT_TRUE(started.get());
    EXPECT_EQ(p.samples, RefWave(44100, 3440, 0.45f).block(882, Gen::WAVEGEN_START));
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"startTone", "Start waiting for previous tone to stop", "Stopped Cbk",
                         "Cbk Stopped track", "Clearing mWaveGens:", "Immediate start, time *",
                         "Wait for start callback", "Starting Cbk", "Cbk starting track",
                         "Tone started, time *"}));
    EXPECT_EQ(test::trackStops(), 1);
    drain(gen);
    EXPECT_EQ(test::trackStops(), 2);
}

TEST_F(ToneEngineTest, NoInitFromSetKeepsTheTrack) {
    test::failTrackSet(android::NO_INIT);
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_REINIT);
    EXPECT_NE(gen.mpAudioTrack, nullptr);
    EXPECT_TRUE(inOrder(toneMessages(), {"zemla Create Track: *", "Re-AudioTrack.....mState = TONE_REINIT",
                                         "!!!MiniToneGenerator INIT FAILED!!!"}));
    EXPECT_EQ(countMessage(kTag, "AudioTrack->initCheck failed"), 0);

    // Still failing: no further message, false.
    test::clearLog();
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(toneMessages()[0], "startTone: try to re-init AudioTrack");
    EXPECT_EQ(toneMessages().back(), "Re-AudioTrack.....mState = TONE_REINIT");
    EXPECT_EQ(test::tracksCreated(), 2);

    // The next start creates a track again and plays.
    test::failTrackSet(0);
    test::clearLog();
    EXPECT_TRUE(startPlaying(gen, 0, 20));
    EXPECT_EQ(test::tracksCreated(), 3);
    EXPECT_TRUE(inOrder(toneMessages(), {"startTone: try to re-init AudioTrack", "zemla Create Track: *",
                                         "startTone", "Immediate start, time *"}));
    drain(gen);
}

TEST_F(ToneEngineTest, InitCheckFailureReleasesTheTrack) {
    {
        test::failTrackInitCheck(android::BAD_VALUE);
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
        EXPECT_EQ(gen.mpAudioTrack, nullptr);
        std::vector<std::string> log = toneMessages();
        ASSERT_GE(log.size(), 4u);
        EXPECT_EQ(log[log.size() - 3], "AudioTrack->initCheck failed");
        EXPECT_EQ(log[log.size() - 2].rfind("zemla Init failed: 0x", 0), 0u);
        EXPECT_EQ(log.back(), "!!!MiniToneGenerator INIT FAILED!!!");

        test::clearLog();
        EXPECT_FALSE(gen.startTone(0, 100));
        log = toneMessages();
        EXPECT_EQ(log.front(), "startTone: try to re-init AudioTrack");
        EXPECT_EQ(log.back().rfind("zemla Init failed: ", 0), 0u);
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);

        // Recovers once the platform does.
        test::failTrackInitCheck(0);
        EXPECT_TRUE(startPlaying(gen, 0, 20));
        drain(gen);
    }
    {
        // Any other failure of set() shows in initCheck.
        test::failTrackSet(android::BAD_VALUE);
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
        EXPECT_EQ(gen.mpAudioTrack, nullptr);
        test::failTrackSet(0);
    }
    {
        // From TONE_INIT: the state stays, the track goes.
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        ASSERT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
        test::failTrackInitCheck(android::NO_INIT);
        EXPECT_FALSE(gen.initAudioTrack());
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
        EXPECT_EQ(gen.mpAudioTrack, nullptr);
        test::failTrackInitCheck(0);
    }
}

TEST_F(ToneEngineTest, TrackStartFailure) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    test::failTrackStart(android::INVALID_OPERATION);
    test::clearLog();
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_ERROR, "zemla mpAudioTrack->start() error!: -38"));
    std::vector<test::LogLine> lines = test::logLines();
    ASSERT_FALSE(lines.empty());
    EXPECT_EQ(lines.back().prio, ANDROID_LOG_WARN);
    EXPECT_EQ(lines.back().msg.rfind("Tone start failed!!!, time ", 0), 0u);
    EXPECT_FALSE(test::trackPlaying());

    // TONE_IDLE: the next start makes a new track.
    test::failTrackStart(0);
    EXPECT_TRUE(startPlaying(gen, 0, 20));
    EXPECT_EQ(test::tracksCreated(), 2);
    drain(gen);
}

TEST_F(ToneEngineTest, OutputRateUnknown) {
    test::failOutputSamplingRate(android::NO_INIT);
    MiniToneGenerator gen(AUDIO_STREAM_VOICE_CALL, 0.5f, true);
    EXPECT_EQ(toneMessages(), (std::vector<std::string>{
                                  "MiniToneGenerator constructor: streamType=0, volume=0.500000",
                                  "Unable to marshal AudioFlinger"}));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    EXPECT_EQ(gen.mpAudioTrack, nullptr);
    EXPECT_EQ(test::tracksCreated(), 0);
    // Defined values for everything that depends on the rate.
    EXPECT_EQ(gen.mSamplingRate, 0u);
    EXPECT_EQ(gen.mProcessSize, 0u);
    EXPECT_EQ(gen.mMaxToneIndex, 0u);
    EXPECT_EQ(gen.mpToneDesc, nullptr);
    EXPECT_EQ(gen.mpNewToneDesc, nullptr);
    EXPECT_FLOAT_EQ(gen.mVolume, 0.5f);
    EXPECT_EQ(gen.mStreamType, AUDIO_STREAM_VOICE_CALL);

    // No tone while the rate stays unknown.
    test::clearLog();
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(toneMessages(),
              std::vector<std::string>{"startTone: output sampling rate unknown, tone refused"});
    EXPECT_EQ(test::tracksCreated(), 0);
    gen.stopTone();

    // Once the platform answers, the engine completes its set-up and plays.
    test::failOutputSamplingRate(0);
    EXPECT_TRUE(startPlaying(gen, 0, 20));
    EXPECT_EQ(gen.mSamplingRate, 44100u);
    EXPECT_EQ(gen.mProcessSize, 882u);
    EXPECT_EQ(gen.mMaxToneIndex, 39u);
    EXPECT_TRUE(gen.mThreadCanCallRuntime);
    drain(gen);
}

// ---- the timed waits (3 s each) ----------------------------------------------

TEST_F(ToneEngineTest, ImmediateStartTimesOut) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    auto t0 = std::chrono::steady_clock::now();
    EXPECT_FALSE(gen.startTone(0, -1));  // nobody pumps
    EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(2900));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_ERROR,
                        "--- Immediate start timed out, status " + std::to_string(kTimedOut)));
    EXPECT_EQ(toneMessages().back().rfind("Tone start failed!!!, time ", 0), 0u);
    // The track is left running; the next start replaces it.
    EXPECT_TRUE(test::trackPlaying());
    EXPECT_TRUE(startPlaying(gen, 1, 20));
    EXPECT_EQ(test::tracksCreated(), 2);
    drain(gen);
}

TEST_F(ToneEngineTest, DelayedStartTimesOut) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startPlaying(gen, 0, -1));
    EXPECT_FALSE(gen.startTone(1, -1));  // nobody pumps
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    EXPECT_TRUE(hasLine(kTag, ANDROID_LOG_ERROR,
                        "--- Delayed start timed out, status " + std::to_string(kTimedOut)));
    EXPECT_EQ(countMessage(kTag, "cond received"), 0);
    EXPECT_EQ(toneMessages().back().rfind("Tone start failed!!!, time ", 0), 0u);
    // A callback now finds no tone to play.
    test::clearLog();
    EXPECT_EQ(test::pumpTrack().sizeBytes, 0u);
    EXPECT_EQ(toneMessages(), std::vector<std::string>{"Extra Cbk"});
}

TEST_F(ToneEngineTest, StartWaitingForStopTimesOut) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(startPlaying(gen, 0, 0));
    test::pumpTrack();
    ASSERT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    test::clearLog();
    EXPECT_FALSE(gen.startTone(1, -1));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    // Returns straight away: no "Tone start failed" line.
    EXPECT_EQ(toneMessages(), (std::vector<std::string>{
                                  "startTone", "Start waiting for previous tone to stop",
                                  "--- start wait for stop timed out, status " +
                                      std::to_string(kTimedOut)}));
}

TEST_F(ToneEngineTest, StopTimesOutWhenCallbacksStop) {
    // The real playback thread, paused as a device that stopped calling back.
    test::manualTrackCallbacks(false);
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(gen.startTone(0, -1));
    test::pauseTrackCallbacks(true);
    test::clearLog();
    gen.stopTone();
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_IDLE);
    // A callback already under way when the pause came may still have made its block.
    EXPECT_TRUE(inOrder(toneMessages(), {"stopTone", "waiting cond", "--- Stop timed out",
                                         "Clearing mWaveGens:"}));
    EXPECT_EQ(test::trackStops(), 1);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 0u);
    test::pauseTrackCallbacks(false);
}

// ---- the real playback thread ------------------------------------------------

TEST_F(ToneEngineTest, PlaysOnThePlaybackThread) {
    test::manualTrackCallbacks(false);
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(gen.startTone(0, 100));
    ASSERT_TRUE(test::waitTrackStopped(5000));
    ASSERT_TRUE(waitUntil([&] { return stateOf(gen) == MiniToneGenerator::TONE_INIT; }));

    // Restart and stop while the thread plays.
    ASSERT_TRUE(gen.startTone(1, -1));
    EXPECT_TRUE(gen.startTone(2, -1));
    EXPECT_EQ(underLock(gen, [&] { return gen.mpToneDesc; }), &MiniToneGenerator::sToneDescriptors[2]);
    // The wait has no loop: any broadcast ends it, so a stop made before the new
    // tone's first block would be woken by that block. Let the tone settle first.
    ASSERT_TRUE(waitUntil([&] { return stateOf(gen) == MiniToneGenerator::TONE_PLAYING; }));
    gen.stopTone();
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(countMessage(kTag, "--- Stop timed out"), 0);
    EXPECT_EQ(countMessage(kTag, "cond received"), 1);

    // Destroyed while playing: stops, then joins the thread.
    ASSERT_TRUE(gen.startTone(3, -1));
    gen.clearAudioTrack();
    EXPECT_EQ(gen.mpAudioTrack, nullptr);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_TRUE(inOrder(toneMessages(), {"stopTone", "waiting cond", "zemla clearAudioTrack, Delete Track: *"}));
}

}  // namespace
