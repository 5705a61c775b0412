// The handshake state machine, row by row. Hearing is made exact: the analysis
// thread's object exists but does not run, and the test writes its spectrum.
#include <regex>

#include <utils/Timers.h>

#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "meter/SoundMeter.h"
#include "support/LibraryTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace {

using namespace korvo::testing;
using Gen = android::MiniToneGenerator;

class Handshake : public LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        play_sound = 0;
        last_play_time = 0;
        meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
        WF_Thread = new android::WaveformCanvas();  // not started: the test sets its spectrum
    }
    void TearDown() override {
        WF_Thread.clear();
        meter.releaseToneGenerator();
        LoggedTest::TearDown();
    }
    // The spectrum holds exactly the tone of `code` (-1: nothing at all; 55: an entry of no code).
    void sound(int code) {
        std::fill(WF_Thread->spectrum->data, WF_Thread->spectrum->data + 256, 0.0);
        if (code >= 0) WF_Thread->spectrum->data[code == 55 ? 55 : korvo::codeIndex(code) - 1] = 1.0;
    }
    int hear(int code) { return sound(code), meter.HearFreqIdx(code); }
    int toneAsked() const {
        const auto* d = meter.toneGenerator->mpNewToneDesc;
        return d ? static_cast<int>(d - Gen::sToneDescriptors) : -1;
    }
    void set(int role, int ack, int listener, int speaker) {
        meter.setRole(role), meter.setNeedAck(ack), meter.listener_state = listener, meter.speaker_state = speaker;
    }
    SoundMeter meter;
};

TEST_F(Handshake, HearingRows) {
    const struct {
        int role, ack, listener, speaker, lastSaid, code;
        int result, wantListener, wantSpeaker, lastHeard;
        const char* line;  // the transition's log line after the time, or nullptr
    } rows[] = {
        {1, 1, 0, 0, -1, 7, 7, 1, 0, 7, "530\\] TIME \\[\\d+\\] Listener Transit To 1"},
        {1, 0, 0, 0, -1, 2, 2, 10, 0, -1, "530\\] TIME \\[\\d+\\] Listener Transit To 10"},
        {1, 1, 10, 0, -1, 3, 3, 10, 0, -1, nullptr},  // a listener alone stays at 10
        {2, 1, 0, 1, 5, 6, 6, 0, 10, -1, "538\\] TIME \\[\\d+\\] Speaker Transit To 10\\.Heard \\[6\\] last_said\\[5\\]"},
        {2, 1, 0, 1, 5, 8, 8, 0, 1, -1, "538\\] TIME \\[\\d+\\] Speaker Transit To 1\\.Heard \\[8\\] last_said\\[5\\]"},
        {2, 1, 0, 1, 511, 0, 0, 0, 10, -1, "538.*Speaker Transit To 10.*"},  // 511 + 1 wraps to 0
        {3, 1, 0, 1, 3, 4, 4, 1, 1, 4, "530.*"},  // both roles: the listener side moves first
        {3, 0, 10, 10, -1, 4, 4, 0, 0, -1, "548\\] TIME \\[\\d+\\] Listener/Speaker Transit To 0/0"},
        {2, 1, 0, 0, -1, 4, -1, 0, 0, -1, nullptr},   // hearing gate closed
        {1, 1, 1, 0, -1, 4, -1, 1, 0, -1, nullptr},   // owes its acknowledgement: closed
        {1, 0, 0, 0, -1, 55, -1, 0, 0, -1, nullptr},  // a peak of no code is not code 55...
    };
    int n = 0;
    for (const auto& r : rows) {
        SCOPED_TRACE("row " + std::to_string(n++));
        set(r.role, r.ack, r.listener, r.speaker);
        meter.last_said = r.lastSaid, meter.last_heard = -1;
        test::clearLog();
        EXPECT_EQ(hear(r.code), r.result);
        EXPECT_EQ(meter.listener_state, r.wantListener);
        EXPECT_EQ(meter.speaker_state, r.wantSpeaker);
        EXPECT_EQ(meter.last_heard, r.lastHeard);
        const Strings log = logOf("TQX", "Transit");
        ASSERT_EQ(log.size(), r.line ? 1u : 0u);
        if (r.line) {
            EXPECT_TRUE(std::regex_match(log[0], std::regex(std::string("D/\\[SoundMeter:") + r.line))) << log[0];
        }
    }
    // ... but it is heard as the end code 999 that no tone of the plan has.
    set(1, 0, 0, 0);
    sound(55);
    EXPECT_EQ(meter.HearFreqIdx(999), 999);
    EXPECT_EQ(meter.getCount(), n + 1);  // every call counts, heard or not
    // The gate open without a spectrum: "not prepared", from both hearing operations.
    set(1, 0, 0, 0);
    sound(-1);
    test::clearLog();
    EXPECT_EQ(meter.HearFreqIdx(1), -1);
    EXPECT_EQ(meter.HearAndResponse(), -1);
    EXPECT_EQ(logOf("TQX"), (Strings{"D/[SoundMeter] PCM Analysis not prepared", "D/[SoundMeter] PCM Analysis not prepared"}));
}

TEST_F(Handshake, SayingRows) {
    const std::string say = "D/[SoundMeter][virtual void SoundMeter::SayFreqIdx(int, int)]";
    const struct { int role, ack, listener, speaker, tone, wantListener, wantSpeaker; bool said; } rows[] = {
        {2, 1, 0, 0, 4, 0, 1, true},     {2, 0, 0, 0, 4, 0, 10, true}, {2, 0, 10, 0, 4, 0, 0, true},
        {1, 1, 1, 0, 5, 10, 0, true},    {3, 1, 1, 10, 5, 0, 0, true}, {2, 1, 0, 1, 9, 0, 1, false},
        {0, 1, 0, 0, 3, 0, 0, false},    {1, 0, 1, 0, 3, 1, 0, false}, {2, 0, 0, 5, 3, 0, 5, false},
    };
    for (const auto& r : rows) {
        SCOPED_TRACE("role " + std::to_string(r.role) + " states " + std::to_string(r.listener) + "/" + std::to_string(r.speaker));
        set(r.role, r.ack, r.listener, r.speaker);
        meter.toneGenerator->mpNewToneDesc = nullptr;
        test::clearLog();
        meter.SayFreqIdx(r.tone, 20);
        EXPECT_EQ(toneAsked(), r.said ? r.tone : -1);
        EXPECT_EQ(meter.listener_state, r.wantListener);
        EXPECT_EQ(meter.speaker_state, r.wantSpeaker);
        Strings want = {say + "[START] speaker_state:" + std::to_string(r.speaker) + " listener_state:" + std::to_string(r.listener)};
        if (!r.said) want.push_back("D/[SoundMeter] state ERROR!");
        want.push_back(say + "[END] speaker_state = " + std::to_string(r.wantSpeaker) + ", listener_state = " +
                       std::to_string(r.wantListener));
        EXPECT_EQ(logOf("TQX", "[SoundMeter]"), want);
        meter.stopFreqTone();
    }
    EXPECT_EQ(meter.last_said, -1);  // SayFreqIdx does not set it
}

TEST_F(Handshake, Sweep) {
    auto sweep = [&](int ms) { return stdoutOf([&] { meter.SayAllFreqIndex(ms); }); };
    auto has = [](const std::string& out, const std::string& re) { return std::regex_search(out, std::regex(re)); };
    // A listener owing its acknowledgement answers the next tone.
    set(1, 1, 1, 0);
    meter.last_heard = 7;
    std::string out = sweep(20);
    EXPECT_EQ(toneAsked(), 8);
    EXPECT_TRUE(meter.listener_state == 10);
    EXPECT_TRUE(play_sound == 9);
    EXPECT_TRUE(meter.last_said == 8);
    EXPECT_TRUE(has(out, R"(\[SoundMeter:911\] TIME \[\d+\] Listener Transit To 1\. last_heard\[7\] play_sound\[8\]\n)"));
    EXPECT_TRUE(has(out, R"(\[SoundMeter\] CNT TIME TONE PLAYING\[8:30000\]------------\[\d+\] From Prev Play \[\d+\]\n)"));
    EXPECT_TRUE(has(out, R"(\[SoundMeter:922\] TIME \[\d+\] Listener Transit To 10\n)"));

    // A speaker with acknowledgement says play_sound and waits: further calls return at once.
    set(2, 1, 0, 0);
    play_sound = 5, last_play_time = 0;
    out = sweep(20);
    EXPECT_TRUE(toneAsked() == 5);
    EXPECT_TRUE(meter.last_said == 5);
    EXPECT_TRUE(meter.speaker_state == 1);
    EXPECT_TRUE(play_sound == 6);
    EXPECT_TRUE(has(out, R"(\[SoundMeter:937\] TIME \[\d+\] Speaker Transit To 1\n)"));
    EXPECT_EQ(sweep(20), "");

    // Speaker only without acknowledgement: says, then pauses duration + 350 ms, then skips one.
    set(2, 0, 0, 0);
    play_sound = 0, last_play_time = 0;
    sweep(200);
    EXPECT_TRUE(toneAsked() == 0);
    EXPECT_TRUE(meter.speaker_state == 10);
    EXPECT_TRUE(play_sound == 1);
    last_play_time = systemTime(SYSTEM_TIME_MONOTONIC) - 450LL * 1000000;
    out = sweep(200);
    EXPECT_TRUE(std::regex_match(out, std::regex(R"(\[SoundMeter\] SoundMeter Works as Speaker Only, then it'll not say before sleeping saytime\+50msec\.\[4\d\d\]\n)")))
        << out;
    EXPECT_TRUE(toneAsked() == 0);
    EXPECT_TRUE(play_sound == 1);
    last_play_time = systemTime(SYSTEM_TIME_MONOTONIC) - 560LL * 1000000;
    out = sweep(200);
    EXPECT_TRUE(has(out, R"(\[SoundMeter:884\] TIME \[\d+\] Speaker Transit To 0\n)"));
    EXPECT_TRUE(toneAsked() == 2);
    EXPECT_TRUE(meter.speaker_state == 10);
    EXPECT_TRUE(play_sound == 3);

    // The end record and indices past the table start the sweep again at 0.
    for (int start : {40, 512, -3}) {
        set(2, 0, 0, 0);
        play_sound = start, last_play_time = 0;
        out = sweep(20);
        EXPECT_EQ(toneAsked(), 0) << start;
        EXPECT_NE(out.find("CNT TIME TONE PLAYING[0:30000]"), std::string::npos) << start;
        EXPECT_EQ(play_sound, 1);
    }
}

}  // namespace
