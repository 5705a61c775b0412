// Playback callback driven by hand: blocks, segments, loops, limits and fades, checked
// sample by sample against fresh generators fed with the expected commands.
#include <iterator>

#include <log/log.h>
#include <media/AudioTrack.h>

#include "support/ToneTestSupport.h"

namespace {

using namespace korvo::tonetest;
using android::AudioTrack;
using ToneCallbackTest = ToneTest;

const Samples kSilence(882, 0);
constexpr uint16_t kPlaying = Engine::TONE_PLAYING;

// The last two buffers of a tone: the tone stops, then the track.
void expectEnd(Engine& gen, const Samples& last) {
    EXPECT_TRUE(pumped(gen, Engine::TONE_STOPPED, last, {"Cbk Stopping"}));
    EXPECT_TRUE(test::trackPlaying());
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT, kSilence, {"Stopped Cbk", "Cbk Stopped track"}, 0));
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(test::trackStops(), 1);
}

TEST_F(ToneCallbackTest, LimitedToneBlockByBlock) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave ref(44100, 2580, 0.45f);
    // 100 ms = 4410 samples: blocks 1 to 5 play, block 6 (5292) fades out.
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 0, 100, &p));
    EXPECT_EQ(p.sizeBytes, 1764u);
    EXPECT_EQ(p.samples, ref.block(882, START));
    EXPECT_EQ(stateOf(gen), kPlaying);
    EXPECT_EQ(locked(gen, &Engine::mMaxSmp), 4410u);
    EXPECT_EQ(locked(gen, &Engine::mNextSegSmp), kInf);
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"startTone", "Clearing mWaveGens:", "prepareWave, duration limited to 100 ms",
                         "Immediate start, time *", "Wait for start callback", "Starting Cbk",
                         "Cbk starting track", "Tone started, time *"}));
    for (unsigned block = 2; block <= 5; ++block) {
        EXPECT_TRUE(pumped(gen, kPlaying, ref.block(882, CONT), {})) << block;
        EXPECT_EQ(locked(gen, &Engine::mTotalSmp), 882u * block);
    }
    expectEnd(gen, ref.block(882, STOP));
    // A stopped track makes no more callbacks; the generators stay until the next tone.
    EXPECT_FALSE(test::pumpTrack().called);
    EXPECT_EQ(genCount(gen), 1u);
}

TEST_F(ToneCallbackTest, LimitOfZeroMsAndEmptyDescriptor) {
    {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        RefWave ref(44100, 2580, 0.45f);
        test::PumpResult p;
        // The first block is already past the limit while the tone is still starting:
        // a fade from the generator's initial state, and the state only moves to playing.
        ASSERT_TRUE(startAndPump(gen, 0, 0, &p));
        EXPECT_EQ(toneCount("prepareWave, duration limited to 0 ms"), 1);
        EXPECT_EQ(p.samples, ref.block(882, STOP));
        EXPECT_EQ(stateOf(gen), kPlaying);
        expectEnd(gen, ref.block(882, STOP));
    }
    SetUp();
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_EQ(Engine::sToneDescriptors[100].segments[0].duration, 0u);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 100, -1, &p));
    EXPECT_EQ(toneCount("prepareWave, duration limited to -1 ms"), 0);
    EXPECT_EQ(p.samples, kSilence);
    EXPECT_EQ(p.sizeBytes, 1764u);
    // Starting -> playing -> stopping -> stopped, without moving in the buffer.
    EXPECT_EQ(stateOf(gen), Engine::TONE_STOPPED);
    EXPECT_EQ(locked(gen, &Engine::mTotalSmp), 1764u);
    EXPECT_TRUE(inOrder(toneMessages(), {"Starting Cbk", "Cbk starting track", "Cbk Stopping"}));
    EXPECT_EQ(genCount(gen), 0u);
    EXPECT_TRUE(pumped(gen, Engine::TONE_INIT, kSilence, {"Stopped Cbk", "Cbk Stopped track"}, 0));
    EXPECT_FALSE(test::trackPlaying());
}

TEST_F(ToneCallbackTest, OnOffSegments) {
    ScopedDescriptor desc(300, {Seg{100, {2580, 0, 0, 0}, 0, 0}, Seg{100, {0, 0, 0, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave ref(44100, 2580, 0.45f);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 300, -1, &p));
    EXPECT_EQ(p.samples, ref.block(882, START));
    EXPECT_EQ(locked(gen, &Engine::mNextSegSmp), 4410u);
    for (int block = 2; block <= 5; ++block) {
        EXPECT_TRUE(pumped(gen, kPlaying, ref.block(882, CONT), {})) << block;
    }
    EXPECT_EQ(locked(gen, &Engine::mTotalSmp), 4410u);  // reached, not passed
    // Block 6 (5292): the fade-out of segment 0, into the silent segment 1.
    EXPECT_TRUE(pumped(gen, kPlaying, ref.block(882, STOP),
                       {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                        "Goto next seg loopCnt(0) loopctr(0), CurSeg(1)", "New segment 1, Next Time: 100"}));
    EXPECT_EQ(locked(gen, &Engine::mNextSegSmp), 8820u);
    EXPECT_EQ(locked(gen, &Engine::mCurSegment), 1u);
    for (int block = 7; block <= 10; ++block) EXPECT_TRUE(pumped(gen, kPlaying, kSilence, {})) << block;
    // Block 11 (9702): the change to the terminating segment.
    EXPECT_TRUE(pumped(gen, kPlaying, kSilence,
                       {"End Segment, time: *", "Goto next seg loopCnt(0) loopctr(0), CurSeg(2)",
                        "Last Seg: 2"}));
    expectEnd(gen, kSilence);
}

TEST_F(ToneCallbackTest, LoopSegments) {
    // 0: 20 ms of 2580 Hz; 1: 40 ms of silence, back to 0 twice; 2: 20 ms of 3440 Hz.
    ScopedDescriptor desc(301, {Seg{20, {2580, 0, 0, 0}, 0, 0}, Seg{40, {0, 0, 0, 0}, 2, 0},
                                Seg{20, {3440, 0, 0, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f), high(44100, 3440, 0.45f);
    // Per block: command of each wave (-1: not played) and the segment after it. One
    // segment change per block boundary past each segment's end.
    const int blocks[][3] = {{START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1}, {START, -1, 0},
                             {STOP, -1, 1},  {-1, -1, 1},   {START, -1, 0}, {STOP, -1, 1},
                             {-1, -1, 1},    {-1, START, 2}, {-1, STOP, 3}};
    std::vector<unsigned> segments;
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 301, -1, &p));
    EXPECT_EQ(genCount(gen), 2u);
    for (size_t i = 0; i < std::size(blocks); ++i) {
        if (i > 0) p = test::pumpTrack();
        Samples want(882, 0);
        if (blocks[i][0] >= 0) low.addInto(want, static_cast<unsigned>(blocks[i][0]));
        if (blocks[i][1] >= 0) high.addInto(want, static_cast<unsigned>(blocks[i][1]));
        EXPECT_EQ(p.samples, want) << "block " << i + 1;
        unsigned seg = locked(gen, &Engine::mCurSegment);
        EXPECT_EQ(seg, static_cast<unsigned>(blocks[i][2])) << "block " << i + 1;
        if (segments.empty() || segments.back() != seg) segments.push_back(seg);
    }
    EXPECT_EQ(segments, (std::vector<unsigned>{0, 1, 0, 1, 0, 1, 2, 3}));
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"Goto next seg loopCnt(2) loopctr(0), CurSeg(1)", "New segment 1, Next Time: 20",
                         "in if loop loopCnt(2) loopctr(0), CurSeg(1)", "New segment 0, Next Time: 60",
                         "OFF->ON, lGenSmp: 882, lReqSmp: 882",
                         "Goto next seg loopCnt(2) loopctr(1), CurSeg(1)", "New segment 1, Next Time: 80",
                         "in if loop loopCnt(2) loopctr(1), CurSeg(1)", "New segment 0, Next Time: 120",
                         "Goto next seg loopCnt(2) loopctr(2), CurSeg(1)", "New segment 1, Next Time: 140",
                         "in else loop loopCnt(0) loopctr(0), CurSeg(2)", "New segment 2, Next Time: 180",
                         "OFF->ON, lGenSmp: 882, lReqSmp: 882", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                         "Goto next seg loopCnt(0) loopctr(0), CurSeg(3)", "Last Seg: 3"}));
    EXPECT_EQ(toneCount("End Segment, time: 0"), 0);
    EXPECT_EQ(stateOf(gen), kPlaying);
    expectEnd(gen, kSilence);
}

TEST_F(ToneCallbackTest, FrequencyWithoutGeneratorIsSkipped) {
    // Segment 0 loops once into segment 2, which lies past the terminating segment:
    // prepareWave made no generator for 3440 Hz, and the walk skips it.
    ScopedDescriptor desc(302, {Seg{20, {2580, 0, 0, 0}, 1, 2}, Seg{0, {0, 0, 0, 0}, 0, 0},
                                Seg{20, {3440, 0, 0, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 302, -1, &p));
    EXPECT_EQ(p.samples, low.block(882, START));
    EXPECT_EQ(genCount(gen), 1u);
    EXPECT_TRUE(pumped(gen, kPlaying, low.block(882, STOP),  // only the fade of 2580 Hz
                       {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                        "in if loop loopCnt(1) loopctr(0), CurSeg(0)", "New segment 2, Next Time: 20",
                        "OFF->ON, lGenSmp: 882, lReqSmp: 882"}));
    EXPECT_EQ(locked(gen, &Engine::mCurSegment), 2u);
    // The loop counter is only reset when a loop completes: still 1 here.
    EXPECT_TRUE(pumped(gen, kPlaying, kSilence,
                       {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                        "Goto next seg loopCnt(0) loopctr(1), CurSeg(3)", "Last Seg: 3"}));
    expectEnd(gen, kSilence);
}

TEST_F(ToneCallbackTest, BlockSplitting) {
    // With a 20 ms limit (882 samples) the block layout shows in the fade: a block
    // past the limit while starting fades from the seed; after a full first block
    // the fade covers exactly the second block.
    const std::pair<size_t, std::vector<std::pair<unsigned, unsigned>>> cases[] = {  // (length, command)
        {1000, {{1000, STOP}}},
        {1763, {{1763, STOP}}},
        {1764, {{882, START}, {882, STOP}}},
        {2000, {{882, START}, {1118, STOP}}}};
    for (const auto& [buffer, blocks] : cases) {
        SCOPED_TRACE(buffer);
        SetUp();
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        RefWave ref(44100, 2580, 0.45f);
        test::PumpResult p;
        ASSERT_TRUE(startAndPump(gen, 0, 20, &p, buffer));
        Samples want;
        for (const auto& [length, command] : blocks) append(want, ref.block(length, command));
        EXPECT_EQ(p.samples, want);
        EXPECT_EQ(locked(gen, &Engine::mTotalSmp), buffer);
        EXPECT_EQ(stateOf(gen), blocks.size() == 2 ? Engine::TONE_STOPPED : Engine::TONE_PLAYING);
        drain(gen, 20);
    }
}

TEST_F(ToneCallbackTest, OutputAt48000Hz) {
    test::setOutputSamplingRate(48000);
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    EXPECT_EQ(gen.mSamplingRate, 48000u);
    EXPECT_EQ(gen.mProcessSize, 960u);
    RefWave ref(48000, 2580, 0.45f);
    test::PumpResult p;
    // The track's own buffers are 20 ms at 48000 Hz too.
    ASSERT_TRUE(startAndPump(gen, 0, 20, &p));
    EXPECT_EQ(p.sizeBytes, 1920u);
    EXPECT_EQ(p.samples, ref.block(960, START));
    EXPECT_EQ(locked(gen, &Engine::mMaxSmp), 960u);
    EXPECT_TRUE(pumped(gen, Engine::TONE_STOPPED, ref.block(960, STOP), {"Cbk Stopping"}, 1920));
    drain(gen, 20);
}

TEST_F(ToneCallbackTest, IgnoredEventsAndExtraCallbacks) {
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    Samples buf(882, 7);
    AudioTrack::Buffer b;
    b.frameCount = buf.size();
    b.size = buf.size() * 2;
    b.i16 = buf.data();
    // Other events and empty buffers change nothing.
    Engine::audioCallback(AudioTrack::EVENT_UNDERRUN, &gen, &b);
    EXPECT_EQ(buf, Samples(882, 7));
    EXPECT_EQ(b.size, 1764u);
    b.size = 0;
    Engine::audioCallback(AudioTrack::EVENT_MORE_DATA, &gen, &b);
    EXPECT_EQ(buf, Samples(882, 7));
    EXPECT_EQ(locked(gen, &Engine::mTotalSmp), 0u);
    // A callback with no tone: "Extra Cbk", an empty buffer, the state unchanged.
    for (uint16_t state : {Engine::TONE_INIT, Engine::TONE_IDLE, Engine::TONE_REINIT}) {
        gen.mState.store(state);
        test::clearLog();
        b.size = 1764;
        Engine::audioCallback(AudioTrack::EVENT_MORE_DATA, &gen, &b);
        EXPECT_EQ(b.size, 0u);
        EXPECT_EQ(toneMessages(), Lines{"Extra Cbk"});
        EXPECT_EQ(stateOf(gen), state);
    }
    gen.mState.store(Engine::TONE_INIT);
}

TEST_F(ToneCallbackTest, PrepareWaveAndNumWaves) {
    ScopedDescriptor desc(303, {Seg{30, {1000, 2000, 0, 0}, 0, 0}, Seg{30, {2000, 0, 0, 0}, 0, 0},
                                Seg{kInf, {500, 600, 700, 0}, 0, 0}});
    Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    underLock(gen, [&] {
        gen.mpNewToneDesc = nullptr;
        EXPECT_FALSE(gen.prepareWave());
        gen.mpNewToneDesc = &Engine::sToneDescriptors[303];
        gen.mDurationMs = 250;
        EXPECT_TRUE(gen.prepareWave());
        EXPECT_EQ(gen.mpToneDesc, &Engine::sToneDescriptors[303]);
        EXPECT_EQ((std::vector<unsigned>{gen.numWaves(0), gen.numWaves(1), gen.numWaves(2), gen.numWaves(3)}),
                  (std::vector<unsigned>{3, 2, 4, 0}));
        EXPECT_EQ(gen.mMaxSmp, 11025u);
        EXPECT_EQ(gen.mNextSegSmp, 1323u);  // 30 ms
        // One generator per frequency, with the gain of its first segment.
        EXPECT_EQ(gen.mWaveGens.size(), 5u);
        EXPECT_EQ(gen.mWaveGens.valueFor(1000)->mAmplitude_Q15, 10065);
        EXPECT_EQ(gen.mWaveGens.valueFor(2000)->mAmplitude_Q15, 10065);
        EXPECT_EQ(gen.mWaveGens.valueFor(500)->mAmplitude_Q15, Gen(44100, 500, 0.9f / 4).mAmplitude_Q15);
        // Durations past 0xFFFFFFFF / rate (97391 ms at 44100 Hz) count whole seconds.
        const std::pair<int, unsigned> limits[] = {
            {97391, 97391u * 44100u / 1000u}, {97392, 97u * 44100u}, {-1, kInf}};
        for (auto [ms, maxSmp] : limits) {
            gen.mDurationMs = ms;
            gen.prepareWave();
            EXPECT_EQ(gen.mMaxSmp, maxSmp) << ms;
        }
        // The table's own tones: one infinite segment.
        gen.mpNewToneDesc = &Engine::sToneDescriptors[1];
        gen.prepareWave();
        EXPECT_EQ(gen.mNextSegSmp, kInf);
        EXPECT_EQ(gen.mWaveGens.size(), 1u);
        EXPECT_EQ(gen.mWaveGens.keyAt(0), 3440);
        EXPECT_EQ(gen.numWaves(0), 2u);
        EXPECT_EQ(gen.numWaves(1), 0u);
        gen.clearWaveGens();
        EXPECT_EQ(gen.mWaveGens.size(), 0u);
    });
}

}  // namespace
