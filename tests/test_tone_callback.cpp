// Playback callback driven by hand: blocks, segments, loops, limits and fades, checked
// sample by sample against fresh generators fed with the expected commands.
#include <chrono>
#include <cstdint>
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
using android::AudioTrack;
using android::MiniToneGenerator;
using korvo::tonetest::countMessage;
using korvo::tonetest::inOrder;
using korvo::tonetest::RefWave;
using korvo::tonetest::ScopedDescriptor;
using korvo::tonetest::stateOf;
using korvo::tonetest::toneMessages;
using korvo::tonetest::underLock;
using korvo::tonetest::waitForToneMessage;
using Gen = MiniToneGenerator::WaveGenerator;
using Seg = MiniToneGenerator::ToneSegment;

constexpr unsigned START = Gen::WAVEGEN_START;
constexpr unsigned CONT = Gen::WAVEGEN_CONT;
constexpr unsigned STOP = Gen::WAVEGEN_STOP;
// A copy: the class constant has no out-of-line definition to bind references to.
constexpr unsigned kInf = MiniToneGenerator::TONEGEN_INF;

class ToneCallbackTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        test::captureLog(true);
        test::clearLog();
        test::manualTrackCallbacks(true);
    }
    void TearDown() override { test::resetAll(); }

    // startTone on another thread, the first buffer pumped once it waits for it.
    static bool startAndPump(MiniToneGenerator& gen, int code, int ms, test::PumpResult* first,
                             size_t samples = 0) {
        int waits = countMessage("MiniToneGenerator", "Wait for start callback");
        std::future<bool> started =
            std::async(std::launch::async, [&gen, code, ms] { return gen.startTone(code, ms); });
        if (!waitForToneMessage("Wait for start callback", waits + 1)) {
            ADD_FAILURE() << "startTone did not wait for the callback";
        }
        *first = test::pumpTrack(samples);
        if (started.wait_for(std::chrono::seconds(5)) != std::future_status::ready) {
            ADD_FAILURE() << "startTone did not return";
            return false;
        }
        return started.get();
    }

    // Pumps a limited tone to its end, so that destruction does not wait for it.
    static void drain(MiniToneGenerator& gen) {
        for (int i = 0; i < 20 && stateOf(gen) != MiniToneGenerator::TONE_INIT; ++i) test::pumpTrack();
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    }

    static uint32_t totalSmp(MiniToneGenerator& gen) {
        return underLock(gen, [&] { return gen.mTotalSmp; });
    }
};

std::vector<int16_t> zeros(size_t n) { return std::vector<int16_t>(n, 0); }

std::vector<std::string> pumpLog(test::PumpResult* result, size_t samples = 0) {
    test::clearLog();
    *result = test::pumpTrack(samples);
    return toneMessages();
}

TEST_F(ToneCallbackTest, LimitedToneBlockByBlock) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    ASSERT_EQ(gen.mProcessSize, 882u);
    RefWave ref(44100, 2580, 0.45f);

    // 100 ms = 4410 samples: blocks 1 to 5 play, block 6 (5292) fades out.
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 0, 100, &p));
    ASSERT_TRUE(p.called);
    EXPECT_EQ(p.sizeBytes, 1764u);
    EXPECT_EQ(p.samples, ref.block(882, START));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);
    EXPECT_EQ(underLock(gen, [&] { return gen.mMaxSmp; }), 4410u);
    EXPECT_EQ(underLock(gen, [&] { return gen.mNextSegSmp; }), kInf);
    EXPECT_TRUE(inOrder(toneMessages(),
                        {"startTone", "Clearing mWaveGens:",
                         "prepareWave, duration limited to 100 ms",
                         "Immediate start, time *", "Wait for start callback", "Starting Cbk",
                         "Cbk starting track", "Tone started, time *"}));

    for (int block = 2; block <= 5; ++block) {
        std::vector<std::string> log = pumpLog(&p);
        EXPECT_EQ(p.samples, ref.block(882, CONT)) << "block " << block;
        EXPECT_EQ(p.sizeBytes, 1764u);
        EXPECT_TRUE(log.empty()) << "block " << block << ": " << log.front();
        EXPECT_EQ(totalSmp(gen), 882u * block);
        EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);
    }

    std::vector<std::string> log = pumpLog(&p);
    EXPECT_EQ(p.samples, ref.block(882, STOP));
    EXPECT_EQ(p.sizeBytes, 1764u);
    EXPECT_EQ(log, std::vector<std::string>{"Cbk Stopping"});
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    EXPECT_TRUE(test::trackPlaying());

    log = pumpLog(&p);
    EXPECT_TRUE(p.called);
    EXPECT_EQ(p.sizeBytes, 0u);
    EXPECT_EQ(p.samples, zeros(882));
    EXPECT_EQ(log, (std::vector<std::string>{"Stopped Cbk", "Cbk Stopped track"}));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_FALSE(test::trackPlaying());
    EXPECT_EQ(test::trackStops(), 1);

    // A stopped track makes no more callbacks; the generators stay until the next tone.
    EXPECT_FALSE(test::pumpTrack().called);
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 1u);
}

TEST_F(ToneCallbackTest, LimitOfZeroMs) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave ref(44100, 2580, 0.45f);
    test::PumpResult p;
    // The first block is already past the limit while the tone is still starting:
    // a fade from the generator's initial state, and the state only moves to playing.
    ASSERT_TRUE(startAndPump(gen, 0, 0, &p));
    EXPECT_EQ(countMessage("MiniToneGenerator", "prepareWave, duration limited to 0 ms"), 1);
    EXPECT_EQ(p.samples, ref.block(882, STOP));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);

    std::vector<std::string> log = pumpLog(&p);
    EXPECT_EQ(p.samples, ref.block(882, STOP));
    EXPECT_EQ(log, std::vector<std::string>{"Cbk Stopping"});
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);

    pumpLog(&p);
    EXPECT_EQ(p.sizeBytes, 0u);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_FALSE(test::trackPlaying());
}

TEST_F(ToneCallbackTest, EmptyDescriptorEndsWithinOneBuffer) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    ASSERT_EQ(MiniToneGenerator::sToneDescriptors[100].segments[0].duration, 0u);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 100, -1, &p));
    EXPECT_EQ(countMessage("MiniToneGenerator", "prepareWave, duration limited to -1 ms"), 0);
    EXPECT_EQ(p.samples, zeros(882));
    EXPECT_EQ(p.sizeBytes, 1764u);
    // Starting -> playing -> stopping -> stopped, without moving in the buffer.
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    EXPECT_EQ(totalSmp(gen), 1764u);
    EXPECT_TRUE(inOrder(toneMessages(), {"Starting Cbk", "Cbk starting track", "Cbk Stopping"}));
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 0u);

    pumpLog(&p);
    EXPECT_EQ(p.sizeBytes, 0u);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
    EXPECT_FALSE(test::trackPlaying());
}

TEST_F(ToneCallbackTest, OnOffSegments) {
    ScopedDescriptor desc(300, {Seg{100, {2580, 0, 0, 0}, 0, 0}, Seg{100, {0, 0, 0, 0}, 0, 0}});
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave ref(44100, 2580, 0.45f);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 300, -1, &p));
    EXPECT_EQ(p.samples, ref.block(882, START));
    EXPECT_EQ(underLock(gen, [&] { return gen.mNextSegSmp; }), 4410u);

    for (int block = 2; block <= 5; ++block) {
        std::vector<std::string> log = pumpLog(&p);
        EXPECT_EQ(p.samples, ref.block(882, CONT)) << "block " << block;
        EXPECT_TRUE(log.empty()) << "block " << block;
    }
    EXPECT_EQ(totalSmp(gen), 4410u);  // reached, not passed

    // Block 6 (5292): the fade-out of segment 0, into the silent segment 1.
    std::vector<std::string> log = pumpLog(&p);
    EXPECT_EQ(p.samples, ref.block(882, STOP));
    EXPECT_TRUE(inOrder(log, {"End Segment, time: *", "ON->OFF, lGenSmp: 882, lReqSmp: 882",
                              "Goto next seg loopCnt(0) loopctr(0), CurSeg(1)",
                              "New segment 1, Next Time: 100"}));
    EXPECT_EQ(underLock(gen, [&] { return gen.mNextSegSmp; }), 8820u);
    EXPECT_EQ(underLock(gen, [&] { return gen.mCurSegment; }), 1u);

    for (int block = 7; block <= 10; ++block) {
        log = pumpLog(&p);
        EXPECT_EQ(p.samples, zeros(882)) << "block " << block;
        EXPECT_TRUE(log.empty()) << "block " << block;
    }

    // Block 11 (9702): the change to the terminating segment.
    log = pumpLog(&p);
    EXPECT_EQ(p.samples, zeros(882));
    ASSERT_EQ(log.size(), 3u);
    EXPECT_TRUE(inOrder(log, {"End Segment, time: *", "Goto next seg loopCnt(0) loopctr(0), CurSeg(2)",
                              "Last Seg: 2"}));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);

    log = pumpLog(&p);
    EXPECT_EQ(log, std::vector<std::string>{"Cbk Stopping"});
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    pumpLog(&p);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
}

TEST_F(ToneCallbackTest, LoopSegments) {
    // 0: 20 ms of 2580 Hz; 1: 40 ms of silence, back to 0 twice; 2: 20 ms of 3440 Hz.
    ScopedDescriptor desc(301, {Seg{20, {2580, 0, 0, 0}, 0, 0}, Seg{40, {0, 0, 0, 0}, 2, 0},
                                Seg{20, {3440, 0, 0, 0}, 0, 0}});
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f);
    RefWave high(44100, 3440, 0.45f);

    struct Block {
        int lowCmd;   // -1: not played
        int highCmd;
        unsigned segmentAfter;
    };
    // One segment change per block boundary past each segment's end.
    const std::vector<Block> blocks = {
        {START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1}, {START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1},
        {START, -1, 0}, {STOP, -1, 1}, {-1, -1, 1}, {-1, START, 2}, {-1, STOP, 3}};

    std::vector<unsigned> segments;
    test::PumpResult p;
    for (size_t i = 0; i < blocks.size(); ++i) {
        if (i == 0) {
            ASSERT_TRUE(startAndPump(gen, 301, -1, &p));
            EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 2u);
        } else {
            p = test::pumpTrack();
        }
        std::vector<int16_t> want(882, 0);
        if (blocks[i].lowCmd >= 0) low.addInto(want, static_cast<unsigned>(blocks[i].lowCmd));
        if (blocks[i].highCmd >= 0) high.addInto(want, static_cast<unsigned>(blocks[i].highCmd));
        EXPECT_EQ(p.samples, want) << "block " << i + 1;
        unsigned seg = underLock(gen, [&] { return gen.mCurSegment; });
        EXPECT_EQ(seg, blocks[i].segmentAfter) << "block " << i + 1;
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
    EXPECT_EQ(countMessage("MiniToneGenerator", "End Segment, time: 0"), 0);

    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING);
    std::vector<std::string> log = pumpLog(&p);
    EXPECT_EQ(log, std::vector<std::string>{"Cbk Stopping"});
    pumpLog(&p);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
}

TEST_F(ToneCallbackTest, FrequencyWithoutGeneratorIsSkipped) {
    // Segment 0 loops once into segment 2, which lies past the terminating segment:
    // prepareWave made no generator for 3440 Hz, and the walk skips it.
    ScopedDescriptor desc(302, {Seg{20, {2580, 0, 0, 0}, 1, 2}, Seg{0, {0, 0, 0, 0}, 0, 0},
                                Seg{20, {3440, 0, 0, 0}, 0, 0}});
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    RefWave low(44100, 2580, 0.45f);
    test::PumpResult p;
    ASSERT_TRUE(startAndPump(gen, 302, -1, &p));
    EXPECT_EQ(p.samples, low.block(882, START));
    EXPECT_EQ(underLock(gen, [&] { return gen.mWaveGens.size(); }), 1u);

    std::vector<std::string> log = pumpLog(&p);
    EXPECT_EQ(p.samples, low.block(882, STOP));  // only the fade of 2580 Hz
    EXPECT_TRUE(inOrder(log, {"in if loop loopCnt(1) loopctr(0), CurSeg(0)",
                              "New segment 2, Next Time: 20", "OFF->ON, lGenSmp: 882, lReqSmp: 882"}));
    EXPECT_EQ(underLock(gen, [&] { return gen.mCurSegment; }), 2u);

    log = pumpLog(&p);
    EXPECT_EQ(p.samples, zeros(882));
    // The loop counter is only reset when a loop completes: still 1 here.
    EXPECT_TRUE(inOrder(log, {"ON->OFF, lGenSmp: 882, lReqSmp: 882",
                              "Goto next seg loopCnt(0) loopctr(1), CurSeg(3)", "Last Seg: 3"}));
    pumpLog(&p);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    pumpLog(&p);
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_INIT);
}

TEST_F(ToneCallbackTest, BlockSplitting) {
    // With a 20 ms limit (882 samples) the block layout shows in the fade: a block
    // past the limit while starting fades from the seed; after a full first block
    // the fade covers exactly the second block.
    struct Case {
        size_t buffer;
        std::vector<std::pair<unsigned, unsigned>> blocks;  // (length, command)
    };
    const std::vector<Case> cases = {
        {1000, {{1000, STOP}}},
        {1763, {{1763, STOP}}},
        {1764, {{882, START}, {882, STOP}}},
        {2000, {{882, START}, {1118, STOP}}},
    };
    for (const Case& c : cases) {
        test::resetAll();
        test::captureLog(true);
        test::manualTrackCallbacks(true);
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        RefWave ref(44100, 2580, 0.45f);
        test::PumpResult p;
        ASSERT_TRUE(startAndPump(gen, 0, 20, &p, c.buffer));
        std::vector<int16_t> want;
        for (const auto& b : c.blocks) {
            std::vector<int16_t> part = ref.block(b.first, b.second);
            want.insert(want.end(), part.begin(), part.end());
        }
        EXPECT_EQ(p.samples, want) << "buffer " << c.buffer;
        EXPECT_EQ(totalSmp(gen), c.buffer);
        if (c.blocks.size() == 2) {
            EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED) << "buffer " << c.buffer;
        } else {
            EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_PLAYING) << "buffer " << c.buffer;
        }
        drain(gen);
    }
}

TEST_F(ToneCallbackTest, OutputAt48000Hz) {
    test::setOutputSamplingRate(48000);
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    EXPECT_EQ(gen.mSamplingRate, 48000u);
    EXPECT_EQ(gen.mProcessSize, 960u);
    RefWave ref(48000, 2580, 0.45f);
    test::PumpResult p;
    // The track's own buffers are 20 ms at 48000 Hz too.
    ASSERT_TRUE(startAndPump(gen, 0, 20, &p));
    EXPECT_EQ(p.sizeBytes, 1920u);
    EXPECT_EQ(p.samples, ref.block(960, START));
    EXPECT_EQ(underLock(gen, [&] { return gen.mMaxSmp; }), 960u);
    pumpLog(&p);
    EXPECT_EQ(p.samples, ref.block(960, STOP));
    EXPECT_EQ(stateOf(gen), MiniToneGenerator::TONE_STOPPED);
    drain(gen);
}

TEST_F(ToneCallbackTest, IgnoredEventsAndExtraCallbacks) {
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    std::vector<int16_t> buf(882, 7);
    AudioTrack::Buffer b;
    b.frameCount = buf.size();
    b.size = buf.size() * 2;
    b.i16 = buf.data();

    // Other events and empty buffers change nothing.
    MiniToneGenerator::audioCallback(AudioTrack::EVENT_UNDERRUN, &gen, &b);
    EXPECT_EQ(buf, std::vector<int16_t>(882, 7));
    EXPECT_EQ(b.size, 1764u);
    b.size = 0;
    MiniToneGenerator::audioCallback(AudioTrack::EVENT_MORE_DATA, &gen, &b);
    EXPECT_EQ(buf, std::vector<int16_t>(882, 7));
    EXPECT_EQ(totalSmp(gen), 0u);

    // A callback with no tone: "Extra Cbk", an empty buffer, the state unchanged.
    for (uint16_t state : {MiniToneGenerator::TONE_INIT, MiniToneGenerator::TONE_IDLE,
                           MiniToneGenerator::TONE_REINIT}) {
        gen.mState.store(state);
        test::clearLog();
        b.size = 1764;
        MiniToneGenerator::audioCallback(AudioTrack::EVENT_MORE_DATA, &gen, &b);
        EXPECT_EQ(b.size, 0u);
        EXPECT_EQ(toneMessages(), std::vector<std::string>{"Extra Cbk"});
        EXPECT_EQ(stateOf(gen), state);
    }
    gen.mState.store(MiniToneGenerator::TONE_INIT);
}

TEST_F(ToneCallbackTest, PrepareWaveAndNumWaves) {
    ScopedDescriptor desc(303, {Seg{30, {1000, 2000, 0, 0}, 0, 0}, Seg{30, {2000, 0, 0, 0}, 0, 0},
                                Seg{kInf, {500, 600, 700, 0}, 0, 0}});
    MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 0.8f, false);
    underLock(gen, [&] {
        gen.mpNewToneDesc = nullptr;
        EXPECT_FALSE(gen.prepareWave());

        gen.mpNewToneDesc = &MiniToneGenerator::sToneDescriptors[303];
        gen.mDurationMs = 250;
        EXPECT_TRUE(gen.prepareWave());
        EXPECT_EQ(gen.mpToneDesc, &MiniToneGenerator::sToneDescriptors[303]);
        EXPECT_EQ(gen.numWaves(0), 3u);
        EXPECT_EQ(gen.numWaves(1), 2u);
        EXPECT_EQ(gen.numWaves(2), 4u);
        EXPECT_EQ(gen.numWaves(3), 0u);
        EXPECT_EQ(gen.mMaxSmp, 11025u);
        EXPECT_EQ(gen.mNextSegSmp, 1323u);  // 30 ms
        // One generator per frequency, with the gain of its first segment.
        EXPECT_EQ(gen.mWaveGens.size(), 5u);
        EXPECT_EQ(gen.mWaveGens.valueFor(1000)->mAmplitude_Q15, 10065);
        EXPECT_EQ(gen.mWaveGens.valueFor(2000)->mAmplitude_Q15, 10065);
        EXPECT_EQ(gen.mWaveGens.valueFor(500)->mAmplitude_Q15,
                  Gen(44100, 500, 0.9f / 4).mAmplitude_Q15);

        // Durations past 0xFFFFFFFF / rate (97391 ms at 44100 Hz) count whole seconds.
        gen.mDurationMs = 97391;
        gen.prepareWave();
        EXPECT_EQ(gen.mMaxSmp, 97391u * 44100u / 1000u);
        gen.mDurationMs = 97392;
        gen.prepareWave();
        EXPECT_EQ(gen.mMaxSmp, 97u * 44100u);
        gen.mDurationMs = -1;
        gen.prepareWave();
        EXPECT_EQ(gen.mMaxSmp, kInf);

        // The table's own tones: one infinite segment.
        gen.mpNewToneDesc = &MiniToneGenerator::sToneDescriptors[1];
        gen.prepareWave();
        EXPECT_EQ(gen.mNextSegSmp, kInf);
        EXPECT_EQ(gen.mWaveGens.size(), 1u);
        EXPECT_EQ(gen.mWaveGens.keyAt(0), 3440);
        EXPECT_EQ(gen.numWaves(0), 2u);
        EXPECT_EQ(gen.numWaves(1), 0u);
        gen.clearWaveGens();
        EXPECT_EQ(gen.mWaveGens.size(), 0u);
        return 0;
    });
}

}  // namespace
