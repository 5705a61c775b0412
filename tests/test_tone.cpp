// Tone playback: the fixed-point sine generator, the playback callback pumped by hand
// and checked sample by sample against fresh generators, and the engine's caller side
// in every state, its failures and its timed waits.
#include <errno.h>
#include <sndfile.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>

#include <log/log.h>
#include <media/AudioTrack.h>

#include "support/ToneTestSupport.h"

namespace {

using namespace korvo::tonetest;
using Fields = std::vector<int>;
const Samples kSilence(882, 0);

Fields fields(const Gen& g) { return {g.mA1_Q14, g.mS2_0, g.mS1, g.mS2, g.mAmplitude_Q15}; }
// The real-valued recursion with the generator's own coefficient and seed.
double closedForm(const Gen& g, unsigned k) {
    const double w = std::acos(g.mA1_Q14 / 32768.0);
    return -static_cast<double>(g.mS2_0) * std::sin(w * (k + 1)) / std::sin(w);
}

TEST_F(Tone, WaveGenerator) {
    EXPECT_EQ(fields(Gen(44100, 1000, 0.45f)), (Fields{32435, -4543, 0, -4543, 15098}));
    EXPECT_EQ(logOf("MiniToneGenerator"), Strings{"E/WaveGenerator init, mA1_Q14: 32435, mS2_0: -4543, mAmplitude_Q15: 15098"});
    EXPECT_EQ(fields(Gen(44100, 2580, 0.45f)), (Fields{30578, -11499, 0, -11499, 15098}));
    EXPECT_EQ(fields(Gen(44100, 0, 0.45f)), (Fields{32767, 0, 0, 0, 15098}));  // 32768 does not fit
    const std::pair<float, int> gains[] = {{0.3f, 10065}, {0.96f, 32210}, {0.97f, 32500}, {1.0f, 32500}};
    for (const auto& [gain, amp] : gains) EXPECT_EQ(Gen(44100, 3440, gain).mAmplitude_Q15, amp) << gain;
    // A quarter of the rate: 32000, 0, -32000, 0 scaled by 15098 / 32768, shifts rounding down.
    RefWave quarter(44100, 11025);
    EXPECT_EQ(quarter.block(6, START), (Samples{14744, 0, -14745, 0, 14744, 0}));
    EXPECT_EQ(quarter.block(2, CONT), (Samples{-14745, 0}));
    for (unsigned freq : {1000, 3440, 17200}) {
        RefWave w(44100, freq);
        const Samples out = w.block(882, START);
        int peak = 0;
        for (unsigned k = 0; k < out.size(); ++k) {
            ASSERT_NEAR(out[k], w.gen.mAmplitude_Q15 * closedForm(w.gen, k) / 32768.0, 48.0) << freq << " Hz, " << k;
            peak = std::max(peak, std::abs(static_cast<int>(out[k])));
        }
        EXPECT_TRUE(peak >= 14600) << peak;
        EXPECT_TRUE(peak <= 14800) << peak;
    }
    // The fade: amplitude 989462528 - k x 1121839 in Q31, from the seed on a fresh generator.
    RefWave f(44100, 2580);
    const Samples fade = f.block(882, STOP);
    EXPECT_EQ(Samples(fade.begin(), fade.begin() + 4), (Samples{5298, 9876, 13124, 14613}));
    for (unsigned k = 0; k < fade.size(); ++k)
        ASSERT_NEAR(fade[k], (989462528.0 - k * 1121839.0) / 65536.0 / 32768.0 * closedForm(f.gen, k), 24.0) << k;
    EXPECT_LE(std::abs(fade.back()), 20);
    // Continuing: a fresh CONT equals START, any other command continues, 441 + 441 is 882,
    // and a fade continues a running wave.
    EXPECT_EQ(RefWave(44100, 2580).block(882, CONT), RefWave(44100, 2580).block(882, START));
    EXPECT_EQ(RefWave(44100, 2580).block(100, 7), RefWave(44100, 2580).block(100, CONT));
    RefWave h(44100, 3440), g(44100, 3440);
    Samples halves = h.block(441, START);
    halves = halves + h.block(441, CONT);
    EXPECT_EQ(halves, RefWave(44100, 3440).block(882, START));
    g.block(882, START);
    EXPECT_EQ(g.block(882, STOP)[0], h.block(882, CONT)[0]);
    // Count 0: STOP touches nothing, START resets to the seed.
    const Fields before = fields(h.gen);
    int16_t canary = 77;
    h.gen.getSamples(&canary, 0, STOP);
    EXPECT_EQ(fields(h.gen), before);
    h.gen.getSamples(&canary, 0, START);
    EXPECT_EQ(canary, 77);
    EXPECT_EQ(h.block(300, CONT), RefWave(44100, 3440).block(300, START));
    // Samples add into the buffer and wrap around in 16 bits.
    Gen q(44100, 11025, 0.45f);
    q.mAmplitude_Q15 = 10240;  // exactly 10000, 0, -10000, 0
    Samples buf = {30000, 5, -30000, -5};
    q.getSamples(buf.data(), 4, START);
    EXPECT_EQ(buf, (Samples{-25536, 5, 25536, -5}));
}

// The last two buffers of a tone: the tone stops, then the track.
void expectEnd(Engine& gen, const Samples& last) {
    EXPECT_TRUE(pumped(gen, Engine::TONE_STOPPED, last, {"Cbk Stopping"}));
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT, kSilence, {"Stopped Cbk", "Cbk Stopped track"}, 0));
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_FALSE(test::pumpTrack().called);  // a stopped track makes no more callbacks
}

TEST_F(Tone, StopCutsAToneThatStartsPlaysOrRestartsOnly) {
    // A tone starting, playing or restarting is cut to the samples of the time it has run
    // (1 s here); one already stopping or stopped keeps its end.
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    for (const uint16_t state : {Engine::TONE_STARTING, Engine::TONE_PLAYING, Engine::TONE_RESTARTING,
                                 Engine::TONE_STOPPING, Engine::TONE_STOPPED}) {
        pthread_mutex_lock(&gen.mLock);
        clock_gettime(CLOCK_MONOTONIC, &gen.mStartTime);
        gen.mStartTime.tv_sec -= 1;
        gen.mMaxSmp = 12345;
        gen.mState.store(state, std::memory_order_relaxed);
        pthread_mutex_unlock(&gen.mLock);
        auto stopped = stopAsync(gen);
        const uint32_t maxSmp = locked(gen, &Engine::mMaxSmp);
        pthread_mutex_lock(&gen.mLock);  // stopTone waits for a callback: this is it
        pthread_cond_signal(&gen.mWaitCbkCond);
        pthread_mutex_unlock(&gen.mLock);
        ASSERT_TRUE(ready(stopped)) << "state " << state;
        if (state == Engine::TONE_STOPPING || state == Engine::TONE_STOPPED) {
            EXPECT_EQ(maxSmp, 12345u) << "state " << state;
        } else {
            EXPECT_GE(maxSmp, 44100u) << "state " << state;
            EXPECT_LT(maxSmp, 2 * 44100u) << "state " << state;
        }
        gen.mState.store(Engine::TONE_INIT, std::memory_order_relaxed);
    }
}

TEST_F(Tone, LimitedToneBlockByBlock) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave ref(44100, 2580);
    // 100 ms = 4410 samples: blocks 1 to 5 play, block 6 (5292) fades out.
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 0, 100, &p));
    EXPECT_EQ(p.samples, ref.block(882, START));
    EXPECT_EQ(p.sizeBytes, 1764u);
    EXPECT_TRUE(locked(gen, &Engine::mMaxSmp) == 4410u);
    EXPECT_TRUE(locked(gen, &Engine::mNextSegSmp) == kInf);
    EXPECT_TRUE(inOrder(toneLog(), {"startTone", "Clearing mWaveGens:", "prepareWave, duration limited to 100 ms",
                                    "Immediate start, time *", "Wait for start callback", "Starting Cbk",
                                    "Cbk starting track", "Tone started, time *"}));
    for (unsigned block = 2; block <= 5; ++block) EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, ref.block(882, CONT), {}));
    expectEnd(gen, ref.block(882, STOP));
    EXPECT_EQ(test::trackStops(), 1);
    EXPECT_EQ(gen.mWaveGens.size(), 1u);  // the generators stay until the next tone

    // A limit of 0 ms: the first block is past it while starting (a fade from the seed, state
    // only to playing), the next fades on.
    RefWave zero(44100, 2580);
    ASSERT_TRUE(startAndPump(gen, 0, 0, &p));
    EXPECT_EQ(p.samples, zero.block(882, STOP));
    EXPECT_EQ(stateOf(gen), Engine::TONE_PLAYING);
    expectEnd(gen, zero.block(882, STOP));
    // An empty record: silence, starting -> playing -> stopping -> stopped within one call.
    ASSERT_TRUE(startAndPump(gen, 100, -1, &p));
    EXPECT_EQ(p.samples, kSilence);
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    EXPECT_EQ(locked(gen, &Engine::mTotalSmp), 1764u);
    EXPECT_EQ(toneCount("prepareWave, duration limited to -1 ms"), 0);
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT, kSilence, {"Stopped Cbk", "Cbk Stopped track"}, 0));
}

TEST_F(Tone, SegmentsAndLoops) {
    // On 100 ms of one frequency, then 100 ms of another: in block 6 the first fades out
    // and the second starts on the same samples, both generators alive.
    {
        ScopedDescriptor desc(301, {Seg{100, {2580, 0, 0, 0}, 0, 0}, Seg{100, {3440, 0, 0, 0}, 0, 0}});
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        RefWave low(44100, 2580), high(44100, 3440);
        ASSERT_TRUE(startAndPump(gen, 301, -1));
        EXPECT_EQ(gen.mWaveGens.size(), 2u);
        low.block(882, START);
        for (int block = 2; block <= 5; ++block) EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, low.block(882, CONT), {}));
        Samples both = low.block(882, STOP);
        high.gen.getSamples(both.data(), 882, START);
        EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, both,
                           {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                            "Goto next seg loopCnt(0) loopctr(0), CurSeg(1)", "New segment 1, Next Time: 100",
                            "OFF->ON, lGenSmp: 882, lReqSmp: 882"}));
        EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, high.block(882, CONT), {}));
        EXPECT_EQ(locked(gen, &Engine::mNextSegSmp), 8820u);
        drain(gen);
    }
    // 0: 20 ms of 2580 Hz; 1: 40 ms silent, back to 0 twice; 2: 20 ms of 3440 Hz. Per block the
    // command of each wave (-1: silent) and the segment after it.
    ScopedDescriptor desc(302, {Seg{20, {2580, 0, 0, 0}, 0, 0}, Seg{40, {0, 0, 0, 0}, 2, 0}, Seg{20, {3440, 0, 0, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580), high(44100, 3440);
    const int blocks[][3] = {{START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1}, {START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1},
                             {START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1}, {-1, START, 2}, {-1, STOP, 3}};
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 302, -1, &p));
    for (size_t i = 0; i < std::size(blocks); ++i) {
        if (i > 0) p = test::pumpTrack();
        Samples want(882, 0);
        if (blocks[i][0] >= 0) low.gen.getSamples(want.data(), 882, static_cast<unsigned>(blocks[i][0]));
        if (blocks[i][1] >= 0) high.gen.getSamples(want.data(), 882, static_cast<unsigned>(blocks[i][1]));
        EXPECT_EQ(p.samples, want) << "block " << i + 1;
        EXPECT_EQ(locked(gen, &Engine::mCurSegment), blocks[i][2]) << "block " << i + 1;
    }
    EXPECT_TRUE(inOrder(toneLog(), {"Goto next seg loopCnt(2) loopctr(0), CurSeg(1)", "New segment 1, Next Time: 20",
                                    "in if loop loopCnt(2) loopctr(0), CurSeg(1)", "New segment 0, Next Time: 60",
                                    "in if loop loopCnt(2) loopctr(1), CurSeg(1)", "New segment 0, Next Time: 120",
                                    "Goto next seg loopCnt(2) loopctr(2), CurSeg(1)",
                                    "in else loop loopCnt(0) loopctr(0), CurSeg(2)", "New segment 2, Next Time: 180",
                                    "Goto next seg loopCnt(0) loopctr(0), CurSeg(3)", "Last Seg: 3"}));
    expectEnd(gen, kSilence);

    // A loop into a segment past the terminating one: no generator there, the frequency skipped.
    ScopedDescriptor odd(303, {Seg{20, {2580, 0, 0, 0}, 1, 2}, Seg{0, {0, 0, 0, 0}, 0, 0}, Seg{20, {3440, 0, 0, 0}, 0, 0}});
    RefWave only(44100, 2580);
    ASSERT_TRUE(startAndPump(gen, 303, -1, &p));
    EXPECT_EQ(gen.mWaveGens.size(), 1u);
    only.block(882, START);
    EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, only.block(882, STOP),
                       {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                        "in if loop loopCnt(1) loopctr(0), CurSeg(0)", "New segment 2, Next Time: 20",
                        "OFF->ON, lGenSmp: 882, lReqSmp: 882"}));
    EXPECT_TRUE(pumped(gen, Engine::TONE_PLAYING, kSilence,
                       {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                        "Goto next seg loopCnt(0) loopctr(1), CurSeg(3)", "Last Seg: 3"}));
    expectEnd(gen, kSilence);
}

TEST_F(Tone, BlocksRatesAndPrepareWave) {
    // A 20 ms limit shows the block layout in the fade: a remainder under two blocks is one block.
    const std::pair<size_t, std::vector<std::pair<unsigned, unsigned>>> cases[] = {
        {1000, {{1000, STOP}}}, {1763, {{1763, STOP}}}, {1764, {{882, START}, {882, STOP}}}, {2000, {{882, START}, {1118, STOP}}}};
    for (const auto& [buffer, blocks] : cases) {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        RefWave ref(44100, 2580);
        test::PumpResult p;
        ASSERT_TRUE(startAndPump(gen, 0, 20, &p, buffer));
        Samples want;
        for (const auto& [length, command] : blocks) want = want + ref.block(length, command);
        EXPECT_EQ(p.samples, want) << buffer;
        EXPECT_EQ(locked(gen, &Engine::mTotalSmp), buffer);
        drain(gen);
    }
    ScopedDescriptor desc(303, {Seg{30, {1000, 2000, 0, 0}, 0, 0}, Seg{30, {2000, 0, 0, 0}, 0, 0},
                                Seg{kInf, {500, 600, 700, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    pthread_mutex_lock(&gen.mLock);
    EXPECT_FALSE(gen.prepareWave());  // nothing requested
    gen.mpNewToneDesc = &Engine::sToneDescriptors[303];
    gen.mDurationMs = 250;
    EXPECT_TRUE(gen.prepareWave());
    EXPECT_EQ((std::vector<unsigned>{gen.numWaves(0), gen.numWaves(1), gen.numWaves(2), gen.numWaves(3)}),
              (std::vector<unsigned>{3, 2, 4, 0}));
    EXPECT_TRUE(gen.mMaxSmp == 11025u);
    EXPECT_TRUE(gen.mNextSegSmp == 1323u);
    // One generator per frequency, made with the gain of its first segment.
    EXPECT_EQ(gen.mWaveGens.size(), 5u);
    EXPECT_EQ(gen.mWaveGens.valueFor(2000)->mAmplitude_Q15, 10065);
    EXPECT_EQ(gen.mWaveGens.valueFor(500)->mAmplitude_Q15, Gen(44100, 500, 0.9f / 4).mAmplitude_Q15);
    // Past 0xFFFFFFFF / rate ms (97391 at 44100 Hz) whole seconds count.
    for (auto [ms, maxSmp] : std::vector<std::pair<int, unsigned>>{{97391, 97391u * 441u / 10u}, {97392, 97u * 44100u}, {-1, kInf}}) {
        gen.mDurationMs = ms;
        gen.prepareWave();
        EXPECT_EQ(gen.mMaxSmp, maxSmp) << ms;
    }
    // A list that fills every segment has no terminator: it ends after its last segment.
    for (auto& seg : Engine::sToneDescriptors[303].segments) seg = Seg{10, {4000, 0, 0, 0}, 0, 0};
    gen.mDurationMs = 250;
    EXPECT_TRUE(gen.prepareWave());
    EXPECT_EQ(gen.mWaveGens.size(), 1u);
    pthread_mutex_unlock(&gen.mLock);
}

TEST_F(Tone, EngineStartsStopsAndRestarts) {
    {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
        EXPECT_TRUE(gen.mSamplingRate == 44100u);
        EXPECT_TRUE(gen.mProcessSize == 882u);
        EXPECT_TRUE(gen.getMaxToneIndex() == 39);
        EXPECT_FLOAT_EQ(gen.mpAudioTrack->getVolume(), 0.8f);
        EXPECT_EQ(Engine::sToneDescriptors[1].segments[0].waveFreq[0], 3440);
        EXPECT_TRUE(inOrder(logOf("MiniToneGenerator"), {"E/MiniToneGenerator constructor: streamType=3, volume=0.800000",
                                                         "E/zemla Create Track: *", "D/MiniToneGenerator INIT OK, time: *"}));
        for (int code : {-1, 512}) {
            test::clearLog();
            EXPECT_FALSE(gen.startTone(code, 100));
            EXPECT_EQ(logOf("MiniToneGenerator"), Strings{"D/UNKNOWN TONE"});
        }
        test::clearLog();
        gen.stopTone();  // no tone: its line only
        EXPECT_EQ(toneLog(), Strings{"stopTone"});
        EXPECT_TRUE(startAndPump(gen, 511, 100));  // the last record is accepted
        drain(gen);
        test::clearLog();
    }
    EXPECT_EQ(toneLog().size(), 3u);
    EXPECT_TRUE(inOrder(toneLog(), {"MiniToneGenerator destructor", "stopTone", "zemla Delete Track: 0x*"}));

    // A start while a tone plays: the old tone fades out and the new one starts in one buffer.
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580), high(44100, 3440);
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    low.block(882, START);
    auto restarted = std::async(std::launch::async, [&gen] { return gen.startTone(1, -1); });
    ASSERT_TRUE(waitFor([] { return toneCount("Delayed start") == 1; }));
    EXPECT_EQ(stateOf(gen), Engine::TONE_RESTARTING);
    test::PumpResult p = test::pumpTrack(1764);
    ASSERT_TRUE(ready(restarted));
    EXPECT_TRUE(restarted.get());
    EXPECT_EQ(p.samples, low.block(882, STOP) + high.block(882, START));
    EXPECT_EQ(stateOf(gen), Engine::TONE_PLAYING);
    EXPECT_EQ(test::trackStops(), 1);  // never stopped since the first engine
    EXPECT_NE(locked(gen, &Engine::mStartTime).tv_sec, 0);
    EXPECT_TRUE(inOrder(toneLog(), {"Delayed start", "Stop/restart Cbk", "Cbk restarting track", "Clearing mWaveGens:",
                                    "Starting Cbk", "Cbk starting track"}));
    EXPECT_TRUE(inOrder(toneLog(), {"Delayed start", "cond received", "Tone started, time *"}));

    // A stop: the tone lasts as long as it has run. As if it had started 1.5 s ago and
    // had played all but two blocks of it, the fade comes in the first block past that.
    pthread_mutex_lock(&gen.mLock);
    gen.mStartTime.tv_sec -= gen.mStartTime.tv_nsec >= 500000000 ? 1 : 2;
    gen.mStartTime.tv_nsec = (gen.mStartTime.tv_nsec + 500000000) % 1000000000;
    gen.mTotalSmp = 66150 - 2 * 882;
    pthread_mutex_unlock(&gen.mLock);
    auto stopped = stopAsync(gen);
    const uint32_t maxSmp = locked(gen, &Engine::mMaxSmp);
    EXPECT_TRUE(maxSmp >= 66150u) << maxSmp;
    EXPECT_TRUE(maxSmp < 66150u + 44100u) << maxSmp;
    for (int blocks = 0; stateOf(gen) == Engine::TONE_PLAYING && blocks < 200; ++blocks) test::pumpTrack();
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    EXPECT_TRUE(locked(gen, &Engine::mTotalSmp) > maxSmp);
    EXPECT_TRUE(locked(gen, &Engine::mTotalSmp) - 882 <= maxSmp);
    EXPECT_FALSE(ready(stopped, 0));
    test::pumpTrack();
    ASSERT_TRUE(ready(stopped));
    EXPECT_EQ(gen.mWaveGens.size(), 0u);
    // An unknown start time cuts the tone at once.
    ASSERT_TRUE(startAndPump(gen, 0, -1));
    pthread_mutex_lock(&gen.mLock);
    gen.mStartTime.tv_sec = 0;
    pthread_mutex_unlock(&gen.mLock);
    stopped = stopAsync(gen);
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPING);
    drain(gen);
    ASSERT_TRUE(ready(stopped));

    // A start while the previous tone winds down waits for the track to stop, then starts at once.
    ASSERT_TRUE(startAndPump(gen, 0, 0));
    test::pumpTrack();
    ASSERT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    test::clearLog();
    auto started = std::async(std::launch::async, [&gen] { return gen.startTone(1, 100); });
    ASSERT_TRUE(waitFor([] { return toneCount("Start waiting for previous tone to stop") == 1; }));
    EXPECT_EQ(test::pumpTrack().sizeBytes, 0u);
    ASSERT_TRUE(waitFor([] { return toneCount("Wait for start callback") == 1; }));
    EXPECT_EQ(test::pumpTrack().samples, RefWave(44100, 3440).block(882, START));
    ASSERT_TRUE(ready(started));
    EXPECT_TRUE(started.get());
    EXPECT_TRUE(inOrder(toneLog(), {"Start waiting for previous tone to stop", "Cbk Stopped track", "Immediate start, time *"}));
    drain(gen);
}

TEST_F(Tone, EngineFailures) {
    // set() fails: NO_INIT keeps the track for the next start to replace; any other status
    // shows in initCheck, which releases it. Each recovers once the platform does.
    const struct { void (*fail)(android::status_t); android::status_t status; uint16_t state; const char* line; } cases[] = {
        {test::failTrackSet, android::NO_INIT, Engine::TONE_REINIT, "Re-AudioTrack.....mState = TONE_REINIT"},
        {test::failTrackInitCheck, android::BAD_VALUE, Engine::TONE_IDLE, "AudioTrack->initCheck failed"},
        {test::failTrackSet, android::BAD_VALUE, Engine::TONE_IDLE, "AudioTrack->initCheck failed"},
    };
    for (const auto& c : cases) {
        SetUp();
        c.fail(c.status);
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        EXPECT_EQ(stateOf(gen), c.state);
        EXPECT_EQ(gen.mpAudioTrack != nullptr, c.state == Engine::TONE_REINIT);
        EXPECT_TRUE(inOrder(toneLog(), {c.line, "!!!MiniToneGenerator INIT FAILED!!!"}));
        test::clearLog();
        EXPECT_FALSE(gen.startTone(0, 100));
        EXPECT_TRUE(inOrder(toneLog(), {"startTone: try to re-init AudioTrack", "zemla Create Track: *", c.line}));
        EXPECT_EQ(toneCount("startTone"), 0);
        c.fail(0);
        EXPECT_TRUE(startAndPump(gen, 0, 20));
        EXPECT_EQ(test::tracksCreated(), 3);
        drain(gen);
    }
    // start() fails: idle, and the next start makes a new track.
    SetUp();
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    test::failTrackStart(android::INVALID_OPERATION);
    EXPECT_FALSE(gen.startTone(0, 100));
    EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
    EXPECT_TRUE(inOrder(logOf("MiniToneGenerator"), {"E/zemla mpAudioTrack->start() error!: -38", "W/Tone start failed!!!, time *"}));
    test::failTrackStart(0);
    EXPECT_TRUE(startAndPump(gen, 0, 20));
    EXPECT_EQ(test::tracksCreated(), 2);
    drain(gen);

    // The output rate unknown: no track, no tone, until the platform answers.
    SetUp();
    test::failOutputSamplingRate(android::NO_INIT);
    Engine late(AUDIO_STREAM_VOICE_CALL, 0.5f, true);
    EXPECT_EQ(toneLog(), (Strings{"MiniToneGenerator constructor: streamType=0, volume=0.500000", "Unable to marshal AudioFlinger"}));
    EXPECT_TRUE(stateOf(late) == Engine::TONE_IDLE);
    EXPECT_TRUE(late.mpAudioTrack == nullptr);
    EXPECT_TRUE(late.mProcessSize == 0u);
    test::clearLog();
    EXPECT_FALSE(late.startTone(0, 100));
    EXPECT_EQ(toneLog(), Strings{"startTone: output sampling rate unknown, tone refused"});
    test::failOutputSamplingRate(0);
    EXPECT_TRUE(startAndPump(late, 0, 20));
    EXPECT_TRUE(late.mSamplingRate == 44100u);
    EXPECT_TRUE(late.mProcessSize == 882u);
    EXPECT_TRUE(late.getMaxToneIndex() == 39);
    drain(late);

    // Rates above 65535 Hz do not fit the generators: refused with one line, no tone started.
    SetUp();
    test::setOutputSamplingRate(96000);
    Engine fast(AUDIO_STREAM_MUSIC, 0.8f, false);
    test::clearLog();
    EXPECT_FALSE(fast.startTone(0, 100));
    EXPECT_EQ(toneLog(), Strings{"startTone: output sampling rate 96000 Hz is above 65535 Hz, tone refused"});
    EXPECT_TRUE(stateOf(fast) == Engine::TONE_INIT);
    EXPECT_TRUE(!test::trackPlaying());
    EXPECT_TRUE(fast.mWaveGens.size() == 0u);
}

TEST_F(Tone, TimedWaits) {
    const std::string status = ", status " + std::to_string(-ETIMEDOUT);
    // Nobody pumps during the start; before it (0) no tone, (1) a tone plays, (2) one ends by itself.
    const std::pair<int, std::string> cases[] = {
        {0, "--- Immediate start timed out"}, {1, "--- Delayed start timed out"}, {2, "--- start wait for stop timed out"}};
    for (const auto& [before, line] : cases) {
        SetUp();
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        if (before > 0) {
            ASSERT_TRUE(startAndPump(gen, 0, before == 1 ? -1 : 0));
        }
        if (before == 2) test::pumpTrack();
        test::clearLog();
        EXPECT_FALSE(gen.startTone(1, -1));
        EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
        EXPECT_TRUE(inOrder(toneLog(), {"startTone", line + status}));
        // The wait for a stop returns without the failure line.
        EXPECT_EQ(logOf("MiniToneGenerator", "Tone start failed!!!").size(), before == 2 ? 0u : 1u);
        if (before == 1) {  // a callback now finds no tone: an empty buffer, nothing changed
            test::clearLog();
            EXPECT_TRUE(test::pumpTrack().sizeBytes == 0u);
            EXPECT_TRUE(toneLog() == Strings{"Extra Cbk"});
            EXPECT_TRUE(stateOf(gen) == Engine::TONE_IDLE);
        }
    }
    // Callbacks stop while a tone plays (the real playback thread, paused): the stop times out,
    // stops the track and deletes the generators.
    SetUp();
    test::manualTrackCallbacks(false);
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_TRUE(gen.startTone(0, -1));
    test::pauseTrackCallbacks(true);
    test::clearLog();
    gen.stopTone();
    EXPECT_EQ(stateOf(gen), Engine::TONE_IDLE);
    EXPECT_TRUE(inOrder(toneLog(), {"stopTone", "waiting cond", "--- Stop timed out", "Clearing mWaveGens:"}));
    EXPECT_TRUE(test::trackStops() == 1);
    EXPECT_TRUE(!test::trackPlaying());
    EXPECT_TRUE(gen.mWaveGens.size() == 0u);
    test::pauseTrackCallbacks(false);
}

TEST_F(Tone, ThePlaybackThreadIntoAFile) {
    // A limited tone through the real playback thread into the WAV speaker route.
    const std::string path = "/tmp/korvo_tone_" + std::to_string(getpid()) + ".wav";
    setenv("KORVO_SPEAKER", ("wav:" + path).c_str(), 1);
    test::manualTrackCallbacks(false);
    {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        ASSERT_TRUE(gen.startTone(1, 200));
        ASSERT_TRUE(test::waitTrackStopped(5000));
        ASSERT_TRUE(waitFor([&] { return stateOf(gen) == Engine::TONE_INIT; }));
        // Restart and stop while the thread plays; a stop waits for the new tone to settle, as
        // its single wait would be woken by the new tone's first block.
        ASSERT_TRUE(gen.startTone(2, -1));
        EXPECT_TRUE(gen.startTone(3, -1));
        ASSERT_TRUE(waitFor([&] { return stateOf(gen) == Engine::TONE_PLAYING; }));
        gen.stopTone();
        EXPECT_TRUE(stateOf(gen) == Engine::TONE_INIT);
        EXPECT_TRUE(toneCount("--- Stop timed out") == 0);
        ASSERT_TRUE(gen.startTone(3, -1));
        gen.clearAudioTrack();  // stops, then joins the thread
        EXPECT_EQ(gen.mpAudioTrack, nullptr);
    }
    unsetenv("KORVO_SPEAKER");
    SF_INFO info{};
    SNDFILE* f = sf_open(path.c_str(), SFM_READ, &info);
    ASSERT_NE(f, nullptr);
    Samples s(static_cast<size_t>(info.frames));
    s.resize(static_cast<size_t>(sf_readf_short(f, s.data(), info.frames)));
    sf_close(f);
    std::remove(path.c_str());
    EXPECT_TRUE(info.samplerate == 44100);
    EXPECT_TRUE(info.channels == 1);
    // 200 ms: a start block, nine continued blocks and a fade-out block of 3440 Hz, then silence.
    RefWave ref(44100, 3440);
    Samples want = ref.block(882, START);
    for (int b = 0; b < 9; ++b) want = want + ref.block(882, CONT);
    want = want + ref.block(882, STOP);
    // The route writes silence until the track's first block is due: a start that came late
    // (a loaded or emulated machine) begins the file with it.
    const size_t start = static_cast<size_t>(std::find_if(s.begin(), s.end(), [](short v) { return v != 0; }) - s.begin());
    ASSERT_GE(s.size(), start + want.size());
    EXPECT_TRUE(std::equal(want.begin(), want.end(), s.begin() + static_cast<long>(start)));
    size_t silent = start + want.size();
    while (silent < s.size() && s[silent] == 0) ++silent;
    EXPECT_GT(silent, start + want.size());
}

}  // namespace
