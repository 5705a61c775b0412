// The soundmeter command end to end: devices in simulated rooms, each a process.
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <regex>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "support/HostProcess.h"

namespace {

using namespace korvo::testing;
const std::string kHost = KORVO_HOST_PATH;
constexpr int kRunMs = 90000;   // bounds only: a loaded machine may be slow
constexpr int kReadyMs = 30000;

std::vector<std::string> in(const std::string& room, std::vector<std::string> args) {
    args.insert(args.end(), {"--mic", "sim:" + room, "--speaker", "sim:" + room});
    return args;
}

// A device is the demo's child with its role on the command line.
pid_t deviceOf(const HostProcess& demo, const std::string& role) {
    const ProcessResult ps = runHost("/usr/bin/pgrep", {"-P", std::to_string(demo.pid()), "-f", "role " + role}, 5000);
    return ps.status == 0 ? std::stoi(ps.out) : -1;
}

TEST(HostDemo, ExchangesWithAcknowledgementAsJsonEvents) {
    const std::string room = uniqueRoom("json");
    const ProcessResult r = runHost(kHost, in(room, {"--json", "demo"}), kRunMs);  // 3 rounds, tones of 300 ms
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    std::vector<nlohmann::json> events;
    for (const std::string& line : linesOf(r.out)) events.push_back(nlohmann::json::parse(line));
    ASSERT_EQ(events.size(), 3u * 5u + 1u) << r.out;  // per round: said, heard, said, heard, exchange
    for (int round = 1; round <= 3; ++round) {
        const auto* e = &events[size_t(round - 1) * 5];
        const int k = 2 * (round - 1);  // the speaker says 0, 2, 4; the listener answers k + 1
        EXPECT_EQ(e[0], (nlohmann::json{{"event", "said"}, {"device", "speaker"}, {"round", round}, {"code", k}, {"attempt", 1}}));
        EXPECT_TRUE(e[1]["device"] == "listener") << e[1];
        EXPECT_TRUE(e[1]["code"] == k) << e[1];
        EXPECT_TRUE(e[1]["one_way_ms"] >= 0) << e[1];
        EXPECT_TRUE(e[2]["device"] == "listener") << e[2];
        EXPECT_TRUE(e[2]["code"] == k + 1) << e[2];
        EXPECT_TRUE(e[3]["device"] == "speaker") << e[3];
        EXPECT_TRUE(e[3]["code"] == k + 1) << e[3];
        EXPECT_TRUE(e[3]["one_way_ms"] >= 0) << e[3];
        EXPECT_TRUE(e[4]["event"] == "exchange") << e[4];
        EXPECT_TRUE(e[4]["answer"] == k + 1) << e[4];
        EXPECT_TRUE(e[4]["round_trip_ms"] >= e[1]["one_way_ms"].get<int>() + e[3]["one_way_ms"].get<int>()) << e[4];
    }
    EXPECT_TRUE(events.back()["event"] == "summary") << events.back();
    EXPECT_TRUE(events.back()["completed"] == 3) << events.back();
    EXPECT_FALSE(roomExists(room));  // its last member left
}

TEST(HostDemo, InNoiseWithAndWithoutAcknowledgementAndDrownedByIt) {
    ProcessResult r = runHost(kHost, {"demo", "--no-ack", "--rounds", "4", "--tone-ms", "200", "--snr", "5"}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("SNR 5.0 dB"), std::string::npos);
    EXPECT_NE(r.out.find("4 of 4 exchanges completed, one way median"), std::string::npos) << r.out;
    r = runHost(kHost, {"demo", "--rounds", "3", "--snr", "5"}, kRunMs);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("3 of 3 exchanges completed, round trip median"), std::string::npos) << r.out;
    // The plug-in's own one-frame decision, which the host's decoder outhears.
    r = runHost(kHost, {"demo", "--decoder", "builtin", "--snr", "-9", "--rounds", "2", "--timeout-ms", "1000"}, kRunMs);
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.out.find("0 of 2 exchanges completed"), std::string::npos) << r.out;
    EXPECT_NE(r.err.find("soundmeter: the listener ended with status 1, the speaker ended with status 1\n"),
              std::string::npos) << r.err;
}

TEST(HostDemo, InAnOfficeAndAKitchenWithTheCodesTheLoudspeakersCarry) {
    ProcessResult r = runHost(kHost, {"demo", "--room", "office", "--devices", "phone", "--rounds", "4"}, kRunMs);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find(", room office, devices phone\n"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("4 of 4 exchanges completed"), std::string::npos) << r.out;
    // A loudspeaker that plays nothing above 12 kHz keeps the exchange to codes 0..10.
    r = runHost(kHost, {"demo", "--room", "kitchen", "--devices", "cheap-speaker", "--rounds", "12", "--no-ack"}, kRunMs);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("codes 0..10 (the cheap-speaker's loudspeaker carries none above 12000 Hz)"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("says  code  0 ( 2580 Hz)"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("says  code 11"), std::string::npos) << r.out;
    // Presets are the simulated room's: a demo on another route is refused.
    r = runHost(kHost, {"demo", "--room", "hall", "--mic", "null"}, kRunMs);
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err, "soundmeter: --room applies to simulated rooms only, not to null\n");
}

TEST(HostDemo, TwoPairsInOneRoomEachOnItsShareOfTheCodes) {
    const ProcessResult r = runHost(kHost, {"demo", "--pairs", "2", "--rounds", "4"}, kRunMs);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find(": codes 0..8, 9..17\n"), std::string::npos) << r.out;
    for (const char* pair : {"pair 1  4 of 4 exchanges completed", "pair 2  4 of 4 exchanges completed"}) {
        EXPECT_NE(r.out.find(pair), std::string::npos) << r.out;
    }
    // Every code said is in its pair's share.
    int said = 0;
    const std::regex saying(R"(pair ([12]) .* says  code +(\d+) )");
    for (const std::string& line : linesOf(r.out)) {
        std::smatch m;
        if (!std::regex_search(line, m, saying)) continue;
        ++said;
        EXPECT_EQ(std::stoi(m[2]) <= 8, m[1] == "1") << line;
    }
    EXPECT_GE(said, 16);
    const std::string last = "2 pairs: 2 completed every exchange; devices heard 0 codes before their own peer said them\n";
    EXPECT_EQ(r.out.substr(r.out.size() - std::min(r.out.size(), last.size())), last) << r.out;
}

TEST(HostDemo, ADeviceThatStopsRespondingEndsTheDemo) {
    HostProcess demo(kHost);
    ASSERT_TRUE(demo.start({"demo", "--rounds", "20", "--timeout-ms", "1000", "--tone-ms", "300"}));
    ASSERT_TRUE(demo.waitForOutput("listener  hears", kReadyMs));
    const pid_t listener = deviceOf(demo, "listener");
    ASSERT_EQ(kill(listener, SIGSTOP), 0);
    const auto stopped = std::chrono::steady_clock::now();
    const ProcessResult r = demo.finish(kRunMs);
    // Within the tone time plus twice the hearing timeout, and a little for the teardown.
    EXPECT_LT(std::chrono::steady_clock::now() - stopped, std::chrono::milliseconds(300 + 2 * 1000 + 1500));
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("soundmeter: the listener stopped responding"), std::string::npos) << r.err;
    EXPECT_NE(kill(listener, 0), 0);  // killed and gone
    std::smatch m;
    ASSERT_TRUE(std::regex_search(r.out, m, std::regex("demo in room ([a-z0-9-]+):")));
    EXPECT_FALSE(roomExists(m[1]));  // the demo removed what its killed device left
}

TEST(HostDemo, ASecondDemoInItsRoomIsRefusedAndAKilledDeviceEndsItAtOnce) {
    const std::string room = uniqueRoom("shared");
    HostProcess demo(kHost);
    ASSERT_TRUE(demo.start(in(room, {"demo", "--rounds", "100"})));
    ASSERT_TRUE(demo.waitForOutput("listener  hears", kReadyMs));
    ProcessResult r = runHost(kHost, in(room, {"demo", "--no-ack"}), kRunMs);
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.out, "");
    EXPECT_EQ(r.err, "soundmeter: speaker sim:" + room +
                         ": the room is in use (2 speakers already in it would mix their codes with this demo's)\n");
    // Its exit is known at once: far sooner than its peer's round timeout (8 s).
    const pid_t listener = deviceOf(demo, "listener");
    ASSERT_EQ(kill(listener, SIGKILL), 0);
    r = demo.finish(4000);
    EXPECT_FALSE(r.timedOut);
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.err, "soundmeter: the listener was killed by signal 9\n");
    EXPECT_FALSE(roomExists(room));  // the demo left for the speaker it stopped
}

TEST(HostDemo, ARoomFolderHeldByAnotherUserIsAnUnusableRoute) {
    if (geteuid() != 0) GTEST_SKIP() << "needs root to act as a second user (nobody, 65534)";
    // Another user (here root) made nobody's room folder first.
    const std::string folder = "/dev/shm/korvo-65534";
    ASSERT_EQ(mkdir(folder.c_str(), 0700), 0) << folder << " exists already";
    const ProcessResult r = runHost(kHost, {"listen", "--mic", "sim:lab", "--seconds", "5"}, kRunMs, {}, "", 65534);
    rmdir(folder.c_str());
    EXPECT_EQ(r.status, 2) << r.err;
    EXPECT_EQ(r.err, "soundmeter: microphone sim:lab: the room folder " + folder + " belongs to another user\n");
}

TEST(HostDevices, ListenHandshakeSweepAndMonitorInARoom) {
    // A code said by another process is heard; time up without it is status 1 and one line.
    const std::string room = uniqueRoom("say");
    HostProcess listener(kHost);
    ASSERT_TRUE(listener.start(in(room, {"listen", "--code", "7", "--seconds", "60"})));
    ASSERT_TRUE(listener.waitForOutput("listening for code 7 (8600 Hz)\n", kReadyMs));
    EXPECT_EQ(runHost(kHost, in(room, {"say", "7", "--ms", "300"}), kRunMs).out, "saying code 7 (8600 Hz) for 300 ms\nsaid code 7 (8600 Hz)\n");
    ProcessResult r = listener.finish(kRunMs);
    EXPECT_EQ(r.status, 0);
    EXPECT_TRUE(std::regex_match(r.out, std::regex("listening for code 7 \\(8600 Hz\\)\nheard code 7 \\(8600 Hz\\) at [0-9.]+ s, after [0-9]+ ms of listening\n")));
    r = runHost(kHost, in(uniqueRoom("miss"), {"listen", "--code", "3", "--seconds", "0.5"}), kRunMs);
    EXPECT_TRUE(r.status == 1) << r.err;
    EXPECT_TRUE(r.err == "soundmeter: code 3 (5160 Hz) not heard within 0.5 s\n") << r.err;

    // A lone handshake listener from a chosen code gives up after its timeout (two devices: the demo).
    r = runHost(kHost, in(uniqueRoom("hs"), {"handshake", "--role", "listener", "--first-code", "5", "--timeout-ms", "500"}), kRunMs);
    EXPECT_TRUE(r.status == 1) << r.out;
    EXPECT_TRUE(std::regex_search(r.out, std::regex("\ntimeout round=1 code=5 hz=6880 t=[0-9]+ waited=[0-9]+\n"))) << r.out;

    // A sweep alone walks the codes every listener reports: 0, 1, 2, ...; over the whole
    // plan, the plug-in's own walk steps one on saying and one on its pause: 0, 2, 4, ...
    for (const bool all : {false, true}) {
        std::vector<std::string> args = {"sweep", "--no-ack", "--ms", "100", "--seconds", "1.7"};
        if (all) args.push_back("--all-codes");
        r = runHost(kHost, in(uniqueRoom("sweep"), args), kRunMs);
        std::vector<int> codes;
        for (const std::string& line : linesOf(r.out)) {
            std::smatch m;
            if (std::regex_search(line, m, std::regex("s  said code ([0-9]+) \\("))) codes.push_back(std::stoi(m[1]));
        }
        ASSERT_GE(codes.size(), 3u) << r.out;
        for (size_t i = 0; i < codes.size(); ++i) EXPECT_EQ(codes[i], int((all ? 2 : 1) * i));
        EXPECT_NE(r.out.find("said " + std::to_string(codes.size()) + " codes\n"), std::string::npos);
    }

    // The monitor shows the bands and the code heard, without redraw codes off a terminal.
    const std::string mon = uniqueRoom("monitor");
    HostProcess monitor(kHost);
    ASSERT_TRUE(monitor.start(in(mon, {"monitor", "--seconds", "60"})));
    ASSERT_TRUE(monitor.waitForOutput("heard: -\n", kReadyMs));
    EXPECT_EQ(runHost(kHost, in(mon, {"say", "9", "--ms", "800"}), kRunMs).status, 0);
    const bool shown = monitor.waitForOutput("heard: code 9 (10320 Hz) ", kReadyMs);
    monitor.sendSignal(SIGINT);
    r = monitor.finish(kRunMs);
    EXPECT_TRUE(shown) << r.out;
    EXPECT_NE(r.out.find("no detection level"), std::string::npos);
    EXPECT_EQ(r.out.find("\x1b["), std::string::npos);
    EXPECT_FALSE(roomExists(mon));
}

}  // namespace
