// The soundmeter command as a user meets it: usage, unusable routes, routes that fail
// while it runs, Ctrl-C, and its output modes.
#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <regex>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "support/HostProcess.h"
#include "support/LibraryTestSupport.h"

namespace {

using namespace korvo::testing;
const std::string kHost = KORVO_HOST_PATH;
constexpr int kRunMs = 60000;  // generous bounds: the machine may be busy with other tests

ProcessResult run(const std::vector<std::string>& args, const EnvList& env = {}) { return runHost(kHost, args, kRunMs, env); }

// One line on stderr, "soundmeter: " in front, containing `part`.
::testing::AssertionResult oneLine(const ProcessResult& r, const std::string& part) {
    if (r.err.rfind("soundmeter: ", 0) == 0 && r.err.find('\n') == r.err.size() - 1 && r.err.find(part) != std::string::npos)
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "stderr: " << r.err;
}

TEST(HostCli, HelpVersionAndBadUsage) {
    for (const char* sub : {"demo", "listen", "say", "sweep", "handshake", "monitor", "devices", "scan", "calibrate"}) {
        const ProcessResult r = run({sub, "--help"});
        EXPECT_EQ(r.status, 0) << sub;
        EXPECT_NE(r.out.find("Codes 23..39 (22360 Hz and up) lie above half the capture rate"), std::string::npos) << sub;
    }
    EXPECT_TRUE(std::regex_match(run({"--version"}).out, std::regex("soundmeter [0-9]+\\.[0-9]+\\.[0-9]+\n")));
    const std::pair<std::vector<std::string>, std::string> cases[] = {
        {{"frobnicate"}, "unknown command 'frobnicate'"},
        {{"listen", "--mic", "bogus"}, "--mic: unknown audio route 'bogus'"},
        {{"handshake", "--role", "speaker", "--first-code", "17"}, "--first-code"},  // its answer 18 is masked
        {{"handshake", "--role", "speaker", "--codes", "3..4"}, "--codes: '3..4' is not at least three codes within 0..17"},
        {{"demo", "--codes", "2-9"}, "--codes: '2-9' is not a range of codes LO..HI"},
        {{"handshake", "--role", "speaker", "--codes", "4..9", "--first-code", "2"}, "--first-code: must be 4..8"},
        {{"demo", "--pairs", "6", "--devices", "cheap-speaker"}, "--pairs 6: 11 codes are too few for 6 pairs of at least three"},
        {{"listen", "--seconds", "nan"}, "--seconds: 'nan' is not a number"},
        {{"listen", "--seconds", "inf"}, "--seconds: 'inf' is not a number"},
        {{"sweep", "--seconds", "-nan"}, "--seconds"},
        {{"demo", "--snr", "nan"}, "--snr: 'nan' is not a number"},
        {{"listen", "--level", "201"}, "--level"},
        {{"handshake", "--role", "listener", "--level", "-101"}, "--level"},
        {{"-q", "--json", "listen"}, "cannot be used together"},
        // Options that do not apply are refused with the reason, not ignored.
        {{"listen", "--level", "30"}, "listen: --level does not apply to the host decoder"},
        {{"scan", "x.wav", "--plugin", "p.so"}, "scan: --plugin does not apply: a recording is heard without the plug-in"},
        {{"scan", "x.wav", "--decoder", "builtin"}, "scan: the builtin decoder hears only live"},
    };
    for (const auto& [args, says] : cases) {
        const ProcessResult r = run(args);
        EXPECT_EQ(r.status, 2) << says;
        EXPECT_TRUE(oneLine(r, says));
        EXPECT_EQ(r.out, "");
    }
    const ProcessResult env = run({"listen"}, {{"KORVO_MIC", "nowhere"}});
    EXPECT_EQ(env.status, 2);
    EXPECT_TRUE(oneLine(env, "KORVO_MIC: unknown audio route 'nowhere'"));
    const ProcessResult plugin = run({"listen", "--plugin=/nonexistent/lib.so"});
    EXPECT_EQ(plugin.status, 2);  // a setting that cannot be used
    EXPECT_TRUE(oneLine(plugin, "cannot load the plug-in /nonexistent/lib.so"));
}

TEST(HostCli, UnusableRoutesAreRefusedBeforeAnything) {
    // Each command checks the routes it uses (the causes themselves: the recordings test).
    const std::pair<std::vector<std::string>, std::string> cases[] = {
        {{"say", "5", "--speaker", "wav:/proc/x.wav"}, "speaker wav:/proc/x.wav: cannot write"},
        {{"sweep", "--speaker", "wav:/dev/full"}, "speaker wav:/dev/full: cannot write"},
        {{"say", "5", "--speaker", "card:nosuch"}, "speaker card:nosuch: "},
        {{"handshake", "--role", "speaker", "--no-ack", "--speaker", "wav:/proc/x.wav"}, "speaker wav:/proc/x.wav"},
        {{"listen", "--mic", "wav:/nonexistent.wav", "--seconds", "3"}, "microphone wav:/nonexistent.wav: cannot"},
        {{"monitor", "--mic", "wav:/proc"}, "microphone wav:/proc: "},
        {{"listen", "--code", "5", "--mic", "card:nosuch"}, "microphone card:nosuch: "},
        {{"demo", "--speaker", "wav:/proc/x.wav"}, "speaker wav:/proc/x.wav"},
    };
    for (const auto& [args, says] : cases) {
        const auto t0 = std::chrono::steady_clock::now();
        const ProcessResult r = run(args);
        EXPECT_EQ(r.status, 2) << says;
        EXPECT_TRUE(oneLine(r, says));
        EXPECT_LT(std::chrono::steady_clock::now() - t0, std::chrono::seconds(5)) << says;  // nothing waited out
        EXPECT_EQ(r.out, "");
    }
    const ProcessResult noise = run({"listen", "--mic", "sim:x"}, {{"KORVO_SIM_NOISE", "loud"}});
    EXPECT_EQ(noise.status, 2);
    EXPECT_TRUE(oneLine(noise, "microphone sim:x: KORVO_SIM_NOISE='loud' is not"));
}

TEST(HostCli, ARouteThatFailsWhileRunningEndsTheCommand) {
    // The room is removed under a listening and a saying device: each ends within a second.
    for (const std::vector<std::string>& args : {std::vector<std::string>{"listen", "--seconds", "30"},
                                                std::vector<std::string>{"say", "3", "--ms", "30000"}}) {
        const std::string room = uniqueRoom("gone");
        HostProcess p(kHost);
        std::vector<std::string> full = args;
        full.insert(full.end(), {"--mic", "sim:" + room, "--speaker", "sim:" + room});
        ASSERT_TRUE(p.start(full));
        ASSERT_TRUE(p.waitForOutput("ing", 20000));
        ASSERT_TRUE(waitFor([&] { return roomExists(room); }));
        const auto removed = std::chrono::steady_clock::now();
        unlink(("/dev/shm/korvo-" + std::to_string(geteuid()) + "/" + room).c_str());
        const ProcessResult r = p.finish(kRunMs);
        EXPECT_LT(std::chrono::steady_clock::now() - removed, std::chrono::milliseconds(1500)) << args[0];
        EXPECT_EQ(r.status, 1) << args[0];
        EXPECT_TRUE(oneLine(r, (args[0] == "say" ? "speaker sim:" : "microphone sim:") + room + ": the room was removed"));
    }
}

TEST(HostCli, CtrlCEndsEveryCommandWithOneLineAnd130) {
    for (const std::vector<std::string>& args :
         {std::vector<std::string>{"listen", "--seconds", "30"}, {"say", "3", "--ms", "20000"},
          {"sweep", "--seconds", "30"}, {"monitor"}, {"handshake", "--role", "listener"}, {"demo", "--rounds", "100"}}) {
        const std::string room = uniqueRoom("int");
        std::vector<std::string> full = args;
        if (args[0] != "demo") full.insert(full.end(), {"--mic", "sim:" + room, "--speaker", "sim:" + room});
        HostProcess p(kHost);
        ASSERT_TRUE(p.start(full));
        const std::string sign = args[0] == "monitor" ? "heard:" : args[0] == "demo" ? "says" : args[0] == "handshake" ? "ready" : "ing";
        ASSERT_TRUE(p.waitForOutput(sign, 20000)) << args[0];
        p.sendSignal(SIGINT);
        const ProcessResult r = p.finish(kRunMs);
        EXPECT_EQ(r.status, 130) << args[0];
        EXPECT_EQ(r.err, "soundmeter: interrupted\n") << args[0];
        EXPECT_FALSE(roomExists(room));
    }
}

TEST(HostCli, QuietAndJsonOutput) {
    const std::string room = uniqueRoom("out");
    const std::vector<std::string> routes = {"--mic", "sim:" + room, "--speaker", "sim:" + room};
    HostProcess listener(kHost);
    std::vector<std::string> args = {"--json", "listen", "--seconds", "30"};
    args.insert(args.end(), routes.begin(), routes.end());
    ASSERT_TRUE(listener.start(args));
    ASSERT_TRUE(waitFor([&] { return roomExists(room); }, 20000));
    std::vector<std::string> say = {"-q", "say", "4", "--ms", "600"};
    say.insert(say.end(), routes.begin(), routes.end());
    const ProcessResult said = run(say);
    EXPECT_EQ(said.status, 0);
    EXPECT_EQ(said.out, "said code 4 (6020 Hz)\n");  // -q: the result only
    ASSERT_TRUE(listener.waitForOutput("\"heard\"", 20000));
    listener.sendSignal(SIGINT);
    const ProcessResult heard = listener.finish(kRunMs);
    const nlohmann::json event = nlohmann::json::parse(linesOf(heard.out).at(0));
    EXPECT_EQ(event["event"], "heard");
    EXPECT_EQ(event["code"], 4);
    // Plurals agree, and a null speaker says once that nothing is audible.
    const ProcessResult one = run({"say", "1", "--ms", "50"});
    EXPECT_EQ(one.status, 0);
    EXPECT_TRUE(oneLine(one, "note: the speaker route is null, so nothing is audible; add --speaker card"));
    EXPECT_NE(run({"listen", "--seconds", "0.3"}).out.find(": 0 codes\n"), std::string::npos);
}

}  // namespace
