// The soundmeter program end to end: devices in simulated rooms, each a process.
#include <dirent.h>
#include <signal.h>

#include <fstream>
#include <map>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "support/HostProcess.h"

namespace {

using korvo::testing::HostProcess;
using korvo::testing::linesOf;
using korvo::testing::ProcessResult;
using korvo::testing::roomExists;
using korvo::testing::runHost;
using korvo::testing::uniqueRoom;

const std::string kHost = KORVO_HOST_PATH;
// Bounds only: a loaded machine may be slow, a healthy run takes a few seconds.
constexpr int kRunMs = 90000;
constexpr int kReadyMs = 30000;

std::vector<std::string> routes(const std::string& room) {
    return {"--mic", "sim:" + room, "--speaker", "sim:" + room};
}

std::vector<std::string> with(std::vector<std::string> args, const std::vector<std::string>& more) {
    args.insert(args.end(), more.begin(), more.end());
    return args;
}

// One step the demo shows: "   0.474 s  listener  hears code  0 ( 2580 Hz)  latency 62 ms".
struct Step {
    double seconds;
    std::string device;
    std::string verb;  // "says" or "hears"
    int code;
    int hz;
    int latency;  // -1 for "says"
};

std::vector<Step> stepsOf(const std::string& out) {
    static const std::regex kStep(
        R"(^ *([0-9]+\.[0-9]{3}) s  (listener|speaker) +(says|hears) +code +([0-9]+) \( *([0-9]+) Hz\)(  latency (-?[0-9]+) ms)?$)");
    std::vector<Step> steps;
    for (const std::string& line : linesOf(out)) {
        std::smatch m;
        if (!std::regex_match(line, m, kStep)) continue;
        steps.push_back({std::stod(m[1]), m[2], m[3], std::stoi(m[4]), std::stoi(m[5]),
                         m[7].matched ? std::stoi(m[7]) : -1});
    }
    return steps;
}

const Step* findStep(const std::vector<Step>& steps, const std::string& device, const std::string& verb, int code) {
    for (const Step& s : steps) {
        if (s.device == device && s.verb == verb && s.code == code) return &s;
    }
    return nullptr;
}

std::string roomOf(const std::string& out) {
    std::smatch m;
    std::regex_search(out, m, std::regex("demo in room ([A-Za-z0-9._-]+):"));
    return m[1];
}

// Whether a process still runs with the room on its command line.
bool deviceRunsIn(const std::string& room) {
    DIR* proc = opendir("/proc");
    if (proc == nullptr) return false;
    bool found = false;
    while (dirent* e = readdir(proc)) {
        if (e->d_name[0] < '0' || e->d_name[0] > '9') continue;
        std::ifstream in(std::string("/proc/") + e->d_name + "/cmdline");
        std::string cmdline((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        if (cmdline.find("sim:" + room) != std::string::npos) found = true;
    }
    closedir(proc);
    return found;
}

void expectCleanedUp(const std::string& out) {
    std::string room = roomOf(out);
    ASSERT_FALSE(room.empty()) << out;
    EXPECT_NE(out.find("room " + room + " removed\n"), std::string::npos);
    EXPECT_FALSE(roomExists(room));
    EXPECT_FALSE(deviceRunsIn(room));
}

TEST(HostDemo, ExchangesWithAcknowledgementThroughARoom) {
    ProcessResult r = runHost(kHost, {"demo"}, kRunMs);  // the defaults: 3 rounds, tones of 300 ms
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_EQ(r.err, "");
    EXPECT_NE(r.out.find("3 of 3 exchanges completed, latency median "), std::string::npos) << r.out;
    std::vector<Step> steps = stepsOf(r.out);
    EXPECT_EQ(steps.size(), 12u) << r.out;
    // Round r: the speaker says 2r, the listener hears it and answers 2r + 1, the speaker hears that.
    for (int k = 0; k <= 4; k += 2) {
        SCOPED_TRACE(k);
        const Step* said = findStep(steps, "speaker", "says", k);
        const Step* heard = findStep(steps, "listener", "hears", k);
        const Step* answer = findStep(steps, "listener", "says", k + 1);
        const Step* back = findStep(steps, "speaker", "hears", k + 1);
        ASSERT_TRUE(said && heard && answer && back) << r.out;
        EXPECT_EQ(said->hz, 86 * (30 + 10 * k));
        EXPECT_EQ(back->hz, 86 * (30 + 10 * (k + 1)));
        EXPECT_LE(said->seconds, heard->seconds);
        EXPECT_LE(heard->seconds, answer->seconds);
        EXPECT_LE(answer->seconds, back->seconds);
        EXPECT_GE(heard->latency, 0);
        EXPECT_GE(back->latency, 0);
    }
    EXPECT_NE(r.out.find("listener  finished, 3 of 3 rounds"), std::string::npos);
    EXPECT_NE(r.out.find("speaker   finished, 3 of 3 rounds"), std::string::npos);
    expectCleanedUp(r.out);
}

TEST(HostDemo, ExchangesWithoutAcknowledgement) {
    ProcessResult r = runHost(kHost, {"demo", "--no-ack", "--rounds", "4", "--tone-ms", "200"}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("4 of 4 exchanges completed"), std::string::npos) << r.out;
    std::vector<Step> steps = stepsOf(r.out);
    for (int k = 0; k < 4; ++k) {
        const Step* said = findStep(steps, "speaker", "says", k);
        const Step* heard = findStep(steps, "listener", "hears", k);
        ASSERT_TRUE(said && heard) << r.out;
        EXPECT_LE(said->seconds, heard->seconds);
    }
    // Nothing comes back without acknowledgement.
    for (const Step& s : steps) EXPECT_FALSE(s.device == "listener" && s.verb == "says");
    for (const Step& s : steps) EXPECT_FALSE(s.device == "speaker" && s.verb == "hears");
    expectCleanedUp(r.out);
}

TEST(HostDemo, RunsOnTheRoutesItIsGivenAndLeavesThatRoomAlone) {
    const std::string room = uniqueRoom("demo-routes");
    ProcessResult r = runHost(kHost, with({"demo", "--rounds", "1"}, routes(room)), kRunMs);
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("demo on mic sim:" + room + ", speaker sim:" + room), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("1 of 1 exchanges completed"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("removed"), std::string::npos) << r.out;
    EXPECT_FALSE(roomExists(room));  // its last member left
}

TEST(HostDemo, ExchangesInNoiseAndFailsWhenNoiseDrownsTheCodes) {
    // 25 dB below the tone: the detection level rises above the noise, the tones stay above it.
    ProcessResult r = runHost(kHost, {"demo", "--snr", "25", "--rounds", "5"}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("SNR 25.0 dB"), std::string::npos);
    EXPECT_NE(r.out.find("5 of 5 exchanges completed"), std::string::npos) << r.out;
    expectCleanedUp(r.out);

    // Noise above the tone: nothing is heard, the devices give up, the demo reports it.
    ProcessResult bad = runHost(kHost, {"demo", "--snr", "-10", "--rounds", "2", "--timeout-ms", "1000"}, kRunMs);
    EXPECT_EQ(bad.status, 1) << bad.out << bad.err;
    EXPECT_NE(bad.out.find("0 of 2 exchanges completed"), std::string::npos) << bad.out;
    EXPECT_NE(bad.out.find("listener  did not hear code 0 (2580 Hz) within"), std::string::npos) << bad.out;
    EXPECT_EQ(bad.err, "soundmeter: a device failed (listener exit 1, speaker exit 1)\n");
    expectCleanedUp(bad.out);
}

TEST(HostDemo, InterruptedDemoStopsItsDevicesAndRemovesTheRoom) {
    HostProcess demo(kHost);
    ASSERT_TRUE(demo.start({"demo", "--rounds", "200"}));
    ASSERT_TRUE(demo.waitForOutput("hears code", kReadyMs));
    demo.sendSignal(SIGINT);
    ProcessResult r = demo.finish(kRunMs);
    EXPECT_FALSE(r.timedOut);
    EXPECT_EQ(r.status, 1) << r.out << r.err;
    EXPECT_EQ(r.out.find("200 of 200"), std::string::npos);
    expectCleanedUp(r.out);
}

TEST(HostListen, SilentAndNoisyRoomsReportNoCode) {
    std::string room = uniqueRoom("silent");
    ProcessResult r = runHost(kHost, with({"listen", "--seconds", "2"}, routes(room)), kRunMs);
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out.find("heard code"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find(": 0 codes\n"), std::string::npos) << r.out;

    // Noise alone peaks on a code's index now and then, but never for long: not a code.
    std::string noisy = uniqueRoom("noisy");
    ProcessResult n = runHost(kHost, with({"listen", "--seconds", "2"}, routes(noisy)), kRunMs,
                              {{"KORVO_SIM_NOISE", "-30"}, {"KORVO_SIM_SEED", "7"}});
    EXPECT_EQ(n.status, 0) << n.err;
    EXPECT_EQ(n.out.find("heard code"), std::string::npos) << n.out;
    EXPECT_FALSE(roomExists(room));
    EXPECT_FALSE(roomExists(noisy));
}

TEST(HostListen, HearsACodeSaidByAnotherProcess) {
    std::string room = uniqueRoom("say");
    HostProcess listener(kHost);
    ASSERT_TRUE(listener.start(with({"listen", "--code", "7", "--seconds", "60"}, routes(room))));
    ASSERT_TRUE(listener.waitForOutput("listening for code 7 (8600 Hz)\n", kReadyMs));
    ProcessResult said = runHost(kHost, with({"say", "7", "--ms", "300"}, routes(room)), kRunMs);
    EXPECT_EQ(said.status, 0) << said.err;
    EXPECT_NE(said.out.find("said code 7 (8600 Hz)\n"), std::string::npos) << said.out;
    ProcessResult heard = listener.finish(kRunMs);
    EXPECT_EQ(heard.status, 0) << heard.out << heard.err;
    EXPECT_NE(heard.out.find("heard code 7 (8600 Hz) after "), std::string::npos) << heard.out;

    // Time up without the code: status 1 and one line on stderr.
    ProcessResult missed =
        runHost(kHost, with({"listen", "--code", "3", "--seconds", "0.5"}, routes(uniqueRoom("miss"))), kRunMs);
    EXPECT_EQ(missed.status, 1);
    EXPECT_EQ(missed.err, "soundmeter: code 3 (5160 Hz) not heard within 0.5 s\n");
}

TEST(HostListen, ReportsASoundingCodeOnceAndStopsOnCtrlC) {
    std::string room = uniqueRoom("report");
    HostProcess listener(kHost);
    ASSERT_TRUE(listener.start(with({"listen", "--seconds", "0"}, routes(room))));
    ASSERT_TRUE(listener.waitForOutput("listening for every code\n", kReadyMs));
    ProcessResult said = runHost(kHost, with({"say", "4", "--ms", "700"}, routes(room)), kRunMs);
    EXPECT_EQ(said.status, 0) << said.err;
    ASSERT_TRUE(listener.waitForOutput("heard code", kReadyMs));
    listener.sendSignal(SIGINT);
    ProcessResult r = listener.finish(kRunMs);
    EXPECT_EQ(r.status, 0) << r.err;
    size_t reports = 0;
    for (const std::string& line : linesOf(r.out)) {
        if (line.find("heard code") == std::string::npos) continue;
        ++reports;
        EXPECT_NE(line.find("heard code 4 (6020 Hz)"), std::string::npos) << line;
    }
    EXPECT_EQ(reports, 1u) << r.out;
    EXPECT_NE(r.out.find(": 1 code\n"), std::string::npos) << r.out;
}

TEST(HostHandshake, TwoDevicesFromAChosenCodeAndALoneListenerTimesOut) {
    std::string room = uniqueRoom("hs");
    std::vector<std::string> common = {"handshake", "--rounds", "2", "--first-code", "5", "--timeout-ms", "20000"};
    HostProcess listener(kHost);
    ASSERT_TRUE(listener.start(with(with(common, {"--role", "listener"}), routes(room))));
    ASSERT_TRUE(listener.waitForOutput("ready role=listener ack=1 rounds=2 t=", kReadyMs));
    ProcessResult speaker = runHost(kHost, with(with(common, {"--role", "speaker"}), routes(room)), kRunMs);
    ProcessResult heard = listener.finish(kRunMs);
    ASSERT_EQ(speaker.status, 0) << speaker.out << speaker.err;
    ASSERT_EQ(heard.status, 0) << heard.out << heard.err;
    // The speaker says 5 and 7 and hears the answers 6 and 8.
    std::regex said1("said round=1 code=5 hz=6880 t=[0-9]+\n");
    std::regex back1("heard round=1 code=6 hz=7740 t=[0-9]+ waited=[0-9]+\n");
    std::regex said2("said round=2 code=7 hz=8600 t=[0-9]+\n");
    std::regex back2("heard round=2 code=8 hz=9460 t=[0-9]+ waited=[0-9]+\n");
    for (const std::regex& re : {said1, back1, said2, back2}) EXPECT_TRUE(std::regex_search(speaker.out, re));
    EXPECT_TRUE(std::regex_search(speaker.out, std::regex("done completed=2 rounds=2 t=[0-9]+\n$")));
    EXPECT_TRUE(std::regex_search(heard.out, std::regex("heard round=1 code=5 hz=6880 ")));
    EXPECT_TRUE(std::regex_search(heard.out, std::regex("said round=2 code=8 hz=9460 ")));

    ProcessResult lone = runHost(
        kHost,
        with({"handshake", "--role", "listener", "--rounds", "1", "--timeout-ms", "800"}, routes(uniqueRoom("lone"))),
        kRunMs);
    EXPECT_EQ(lone.status, 1);
    std::vector<std::string> lines = linesOf(lone.out);
    ASSERT_EQ(lines.size(), 3u) << lone.out;
    EXPECT_TRUE(std::regex_match(lines[0], std::regex("ready role=listener ack=1 rounds=1 t=[0-9]+")));
    EXPECT_TRUE(std::regex_match(lines[1], std::regex("timeout round=1 code=0 hz=2580 t=[0-9]+ waited=[0-9]+")));
    EXPECT_TRUE(std::regex_match(lines[2], std::regex("done completed=0 rounds=1 t=[0-9]+")));
}

std::vector<int> saidCodes(const std::string& out) {
    std::vector<int> codes;
    std::regex said(R"(s  said code ([0-9]+) \()");
    for (const std::string& line : linesOf(out)) {
        std::smatch m;
        if (std::regex_search(line, m, said)) codes.push_back(std::stoi(m[1]));
    }
    return codes;
}

TEST(HostSweep, SaysEveryOtherCodeAndMovesOnWithoutAnAnswer) {
    // Speaker alone without acknowledgement: one step on saying, one on the pause, so 0, 2, 4, ...
    ProcessResult r = runHost(
        kHost, with({"sweep", "--no-ack", "--ms", "100", "--seconds", "1.7"}, routes(uniqueRoom("sweep"))), kRunMs);
    EXPECT_EQ(r.status, 0) << r.err;
    std::vector<int> codes = saidCodes(r.out);
    ASSERT_GE(codes.size(), 3u) << r.out;
    for (size_t i = 0; i < codes.size(); ++i) EXPECT_EQ(codes[i], int(2 * i)) << r.out;

    // With acknowledgement and nobody to answer, it gives up on 1 and goes on with 2.
    ProcessResult a =
        runHost(kHost, with({"sweep", "--ms", "100", "--seconds", "2.3"}, routes(uniqueRoom("sweepack"))), kRunMs);
    EXPECT_EQ(a.status, 0) << a.err;
    EXPECT_NE(a.out.find("no answer code 1\n"), std::string::npos) << a.out;
    codes = saidCodes(a.out);
    ASSERT_GE(codes.size(), 2u) << a.out;
    EXPECT_EQ(codes[0], 0);
    EXPECT_EQ(codes[1], 2);
}

TEST(HostMonitor, ShowsTheBandsAndTheCodeHeard) {
    std::string room = uniqueRoom("monitor");
    HostProcess monitor(kHost);
    ASSERT_TRUE(monitor.start(with({"monitor", "--seconds", "60", "--level", "40"}, routes(room))));
    ASSERT_TRUE(monitor.waitForOutput("heard: -\n", kReadyMs));
    ProcessResult said = runHost(kHost, with({"say", "9", "--ms", "800"}, routes(room)), kRunMs);
    EXPECT_EQ(said.status, 0);
    bool shown = monitor.waitForOutput("heard: code 9 (10320 Hz)\n", kReadyMs);
    monitor.sendSignal(SIGINT);
    ProcessResult r = monitor.finish(kRunMs);
    EXPECT_TRUE(shown) << r.out;
    EXPECT_EQ(r.status, 0);
    EXPECT_NE(r.out.find("detection level 40"), std::string::npos);
    EXPECT_NE(r.out.find("code  0  2580 Hz "), std::string::npos);
    EXPECT_NE(r.out.find("code 17 17200 Hz "), std::string::npos);
    EXPECT_EQ(r.out.find("\x1b["), std::string::npos);  // not a terminal: no redraw codes
}

}  // namespace
