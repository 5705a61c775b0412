// The handshake state machine, row by row, with a scripted microphone and the
// analysis thread running.
#include <chrono>
#include <cstdio>
#include <regex>
#include <string>
#include <thread>
#include <vector>

#include <log/log.h>
#include <utils/Timers.h>

#include "analysis/WaveformCanvas.h"
#include "meter/Handshake.h"
#include "meter/SoundMeter.h"
#include "support/MeterTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace test = korvo::platform::test;
using android::MiniToneGenerator;
using korvo::testing::logOf;
using korvo::testing::PlatformTest;

namespace {

double codeHz(int code) { return 86.0 * (30 + 10 * code); }

bool logMatches(const std::string& pattern) {
    const std::regex re(pattern);
    for (const auto& line : logOf("TQX")) {
        if (std::regex_match(line, re)) return true;
    }
    return false;
}

}  // namespace

class HandshakeTest : public PlatformTest {
protected:
    void SetUp() override {
        PlatformTest::SetUp();
        test::scriptMic(true);
        play_sound = 0;
        last_play_time = 0;
        meter = new SoundMeter();
        meter->makeToneGenerator(AUDIO_STREAM_MUSIC);
        meter->start_wf_thread();
        meter->startRecord();
    }
    void TearDown() override {
        meter->stopRecord();
        meter->end_wf_thread();
        meter->releaseToneGenerator();
        delete meter;
        PlatformTest::TearDown();
    }

    // Plays a sine into the microphone and polls HearFreqIdx(expect) for up to three seconds.
    int hear(double hz, int expect) {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(3);
        while (std::chrono::steady_clock::now() < deadline) {
            korvo::testing::pushSineFrames(hz, 0.5, 1);
            const int got = meter->HearFreqIdx(expect);
            if (got != -1) return got;
            std::this_thread::sleep_for(std::chrono::milliseconds(2));  // lets the analysis thread take a turn
        }
        return -1;
    }
    int hearCode(int code) { return hear(codeHz(code), code); }

    // Whether the engine was last asked for tone `code`.
    bool lastToneWas(int code) {
        return meter->toneGenerator->mpNewToneDesc == &MiniToneGenerator::sToneDescriptors[code];
    }

    SoundMeter* meter = nullptr;
};

TEST_F(HandshakeTest, ListenerWithAcknowledgementHearsThenAnswersThroughTheSweep) {
    meter->setRole(1);
    meter->setNeedAck(true);
    ASSERT_EQ(hearCode(7), 7);
    EXPECT_EQ(meter->listener_state, 1);
    EXPECT_EQ(meter->last_heard, 7);
    EXPECT_TRUE(logMatches(R"(D/\[SoundMeter:530\] TIME \[\d+\] Listener Transit To 1)"));

    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(20);
    const std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_TRUE(lastToneWas(8));
    EXPECT_EQ(meter->listener_state, 10);
    EXPECT_EQ(play_sound, 9);
    EXPECT_EQ(meter->last_said, 8);
    EXPECT_TRUE(std::regex_search(out, std::regex(R"(\[SoundMeter:911\] TIME \[\d+\] Listener Transit To 1\. last_heard\[7\] play_sound\[8\]\n)")));
    EXPECT_TRUE(std::regex_search(out, std::regex(R"(\[SoundMeter\] CNT TIME TONE PLAYING\[8:30000\]------------\[\d+\] From Prev Play \[\d+\]\n)")));
    EXPECT_TRUE(std::regex_search(out, std::regex(R"(\[SoundMeter:922\] TIME \[\d+\] Listener Transit To 10\n)")));

    // A listener alone stays at 10: it still hears, but nothing moves it back to 0.
    ASSERT_EQ(hearCode(3), 3);
    EXPECT_EQ(meter->listener_state, 10);
}

TEST_F(HandshakeTest, ListenerWithoutAcknowledgementEndsAtTen) {
    meter->setRole(1);
    ASSERT_EQ(hearCode(2), 2);
    EXPECT_EQ(meter->listener_state, 10);
    EXPECT_EQ(meter->last_heard, -1);
    EXPECT_TRUE(logMatches(R"(D/\[SoundMeter:530\] TIME \[\d+\] Listener Transit To 10)"));
}

TEST_F(HandshakeTest, ListenerAnswersWithSayFreqIdx) {
    meter->setRole(1);
    meter->setNeedAck(true);
    meter->listener_state = 1;
    meter->SayFreqIdx(5, 20);
    EXPECT_TRUE(lastToneWas(5));
    EXPECT_EQ(meter->listener_state, 10);
    EXPECT_EQ(meter->last_said, -1);  // SayFreqIdx does not set it
}

TEST_F(HandshakeTest, BothAtTenReturnToZero) {
    meter->setRole(3);
    meter->listener_state = 10;
    meter->speaker_state = 10;
    ASSERT_EQ(hearCode(4), 4);
    EXPECT_EQ(meter->listener_state, 0);
    EXPECT_EQ(meter->speaker_state, 0);
    EXPECT_TRUE(logMatches(R"(D/\[SoundMeter:548\] TIME \[\d+\] Listener/Speaker Transit To 0/0)"));

    // The same through saying: a speaker without acknowledgement reaches 10 beside a listener at 10.
    meter->listener_state = 10;
    meter->speaker_state = 0;
    meter->SayFreqIdx(1, 20);
    EXPECT_EQ(meter->listener_state, 0);
    EXPECT_EQ(meter->speaker_state, 0);
}

TEST_F(HandshakeTest, SpeakerSaysAndWaitsForTheAcknowledgement) {
    meter->setRole(2);
    meter->setNeedAck(true);
    test::clearLog();
    meter->SayFreqIdx(4, 20);
    EXPECT_TRUE(lastToneWas(4));
    EXPECT_EQ(meter->speaker_state, 1);
    EXPECT_EQ(logOf("TQX"),
              (std::vector<std::string>{
                  "D/[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)][START] speaker_state:0 listener_state:0",
                  "D/[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)][END] speaker_state = 1, listener_state = 0"}));
    // Waiting for the acknowledgement closes the saying gate.
    test::clearLog();
    meter->SayFreqIdx(9, 20);
    EXPECT_TRUE(lastToneWas(4));
    EXPECT_EQ(logOf("TQX")[1], "D/[SoundMeter] state ERROR!");
}

TEST_F(HandshakeTest, SpeakerWithoutAcknowledgementGoesToTen) {
    meter->setRole(2);
    meter->SayFreqIdx(4, 20);
    EXPECT_EQ(meter->speaker_state, 10);
    meter->speaker_state = 0;
    meter->listener_state = 10;
    meter->SayFreqIdx(4, 20);
    EXPECT_EQ(meter->speaker_state, 0);
    EXPECT_EQ(meter->listener_state, 0);
}

TEST_F(HandshakeTest, SweepSaysTheNextToneAndMovesTheSpeaker) {
    meter->setRole(2);
    meter->setNeedAck(true);
    play_sound = 5;
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(20);
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_TRUE(lastToneWas(5));
    EXPECT_EQ(meter->last_said, 5);
    EXPECT_EQ(meter->speaker_state, 1);
    EXPECT_EQ(play_sound, 6);
    EXPECT_TRUE(std::regex_search(out, std::regex(R"(\[SoundMeter:937\] TIME \[\d+\] Speaker Transit To 1\n)")));
    // While waiting for the acknowledgement further sweep calls return at once.
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(20);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");

    // The acknowledgement is the next tone; another tone is heard but leaves the state.
    ASSERT_EQ(hearCode(8), 8);
    EXPECT_EQ(meter->speaker_state, 1);
    EXPECT_TRUE(logMatches(R"(D/\[SoundMeter:538\] TIME \[\d+\] Speaker Transit To 1\.Heard \[8\] last_said\[5\])"));
    ASSERT_EQ(hearCode(6), 6);
    EXPECT_EQ(meter->speaker_state, 10);
    EXPECT_TRUE(logMatches(R"(D/\[SoundMeter:538\] TIME \[\d+\] Speaker Transit To 10\.Heard \[6\] last_said\[5\])"));

    meter->setNeedAck(false);
    meter->speaker_state = 0;
    meter->SayAllFreqIndex(20);
    // A speaker-only device steps once more on the pause reset before it says the next tone.
    EXPECT_TRUE(lastToneWas(7));
    EXPECT_EQ(meter->speaker_state, 10);
    EXPECT_EQ(play_sound, 8);
}

TEST_F(HandshakeTest, SpeakerOnlySweepPausesThenSaysEveryOtherTone) {
    meter->setRole(2);
    meter->SayAllFreqIndex(200);  // says 0
    EXPECT_TRUE(lastToneWas(0));
    EXPECT_EQ(meter->speaker_state, 10);
    EXPECT_EQ(play_sound, 1);

    // Within duration + 350 ms: the pause line, nothing said.
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(200);
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_TRUE(std::regex_match(out, std::regex(R"(\[SoundMeter\] SoundMeter Works as Speaker Only, then it'll not say before sleeping saytime\+50msec\.\[\d+\]\n)")));
    EXPECT_TRUE(lastToneWas(0));
    EXPECT_EQ(play_sound, 1);

    // Once the pause is over: back to 0, one step on, and the same call says tone 2.
    last_play_time = systemTime(SYSTEM_TIME_MONOTONIC) - 600LL * 1000000;
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(200);
    out = ::testing::internal::GetCapturedStdout();
    EXPECT_TRUE(std::regex_search(out, std::regex(R"(\[SoundMeter:884\] TIME \[\d+\] Speaker Transit To 0\n)")));
    EXPECT_TRUE(lastToneWas(2));
    EXPECT_EQ(meter->speaker_state, 10);
    EXPECT_EQ(play_sound, 3);
}

TEST_F(HandshakeTest, SweepWrapsAtTheEndRecordAndNeverPassesTheTable) {
    meter->setRole(2);
    play_sound = 40;  // the end record
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(20);
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_TRUE(lastToneWas(0));
    EXPECT_NE(out.find("CNT TIME TONE PLAYING[0:30000]"), std::string::npos);

    meter->speaker_state = 0;
    play_sound = 512;  // past the table: starts again at 0
    meter->SayAllFreqIndex(20);
    EXPECT_TRUE(lastToneWas(0));
    EXPECT_EQ(play_sound, 1);
}

TEST_F(HandshakeTest, SetSpeakerStateAndTheClosedGates) {
    test::clearLog();
    meter->setSpeakerState(5);
    EXPECT_EQ(meter->speaker_state, 5);
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] set speaker state: 5"});

    meter->setRole(0);
    meter->speaker_state = 0;
    test::clearLog();
    korvo::testing::pushSilenceFrames(1);
    EXPECT_EQ(meter->HearFreqIdx(3), -1);
    EXPECT_EQ(meter->getCount(), 1);
    meter->SayFreqIdx(3, 20);
    EXPECT_EQ(logOf("TQX"),
              (std::vector<std::string>{
                  "D/[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)][START] speaker_state:0 listener_state:0",
                  "D/[SoundMeter] state ERROR!",
                  "D/[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)][END] speaker_state = 0, listener_state = 0"}));
    ::testing::internal::CaptureStdout();
    meter->SayAllFreqIndex(20);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");
    EXPECT_EQ(play_sound, 0);

    korvo::testing::pushSilenceFrames(1);
    EXPECT_EQ(meter->HearAndResponse(), -1);
    EXPECT_EQ(meter->getCount(), 2);
}

TEST_F(HandshakeTest, BothRolesHeardToneMovesTheListenerFirst) {
    meter->setRole(3);
    meter->setNeedAck(true);
    meter->speaker_state = 1;
    meter->last_said = 3;
    ASSERT_EQ(hearCode(4), 4);  // the speaker's acknowledgement, yet the listener side moves
    EXPECT_EQ(meter->listener_state, 1);
    EXPECT_EQ(meter->speaker_state, 1);
}

TEST_F(HandshakeTest, AnyPeakOffThePlanIsHeardAsTheEndCode) {
    meter->setRole(1);
    // 55 × 86.13 Hz lands on output index 56 (k mod 10 = 6), which is no code of the plan.
    EXPECT_EQ(hear(55 * 44100.0 / 512.0, 999), 999);
}

class HandshakeWithoutAnalysisTest : public PlatformTest {};

TEST_F(HandshakeWithoutAnalysisTest, SpectrumNotPreparedIsReported) {
    test::scriptMic(true);
    SoundMeter meter;
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    meter.setRole(1);
    meter.startRecord();
    korvo::testing::pushSilenceFrames(2);
    test::clearLog();
    EXPECT_EQ(meter.HearFreqIdx(1), -1);
    EXPECT_EQ(logOf("TQX").back(), "D/[SoundMeter] PCM Analysis not prepared");
    test::clearLog();
    EXPECT_EQ(meter.HearAndResponse(), -1);
    EXPECT_EQ(logOf("TQX").back(), "D/[SoundMeter] PCM Analysis not prepared");
    meter.stopRecord();
    meter.releaseToneGenerator();
}

TEST(HandshakeRules, AcknowledgementWrapsWithTheSignedRemainder) {
    EXPECT_EQ(korvo::acknowledgementOf(7, 512), 8);
    EXPECT_EQ(korvo::acknowledgementOf(511, 512), 0);
    EXPECT_EQ(korvo::acknowledgementOf(-1, 512), 0);
    EXPECT_EQ(korvo::acknowledgementOf(-3, 512), -2);
}
