// The soundmeter program's command line, run as a user would run it.
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "support/HostProcess.h"

namespace {

using korvo::testing::EnvList;
using korvo::testing::linesOf;
using korvo::testing::ProcessResult;
using korvo::testing::runHost;

const std::string kHost = KORVO_HOST_PATH;
constexpr int kQuickMs = 30000;  // generous: the machine may be busy with other tests

ProcessResult run(const std::vector<std::string>& args, const EnvList& env = {}) {
    return runHost(kHost, args, kQuickMs, env);
}

size_t countLines(const std::string& text) {
    size_t n = 0;
    for (char c : text) n += c == '\n';
    return n;
}

TEST(HostCli, HelpOfEveryCommandExitsZeroAndTellsThePlansReach) {
    const std::vector<std::vector<std::string>> helps = {
        {"--help"},          {"demo", "--help"},  {"listen", "--help"},  {"say", "--help"},
        {"sweep", "--help"}, {"handshake", "-h"}, {"monitor", "--help"},
    };
    for (const auto& args : helps) {
        ProcessResult r = run(args);
        SCOPED_TRACE(args.front());
        EXPECT_EQ(r.status, 0);
        EXPECT_EQ(r.err, "");
        EXPECT_NE(r.out.find("Usage: soundmeter"), std::string::npos) << r.out;
        // Honest about what can be heard: 0..17 in reach, 18..22 masked, 23..39 beyond the bins.
        EXPECT_NE(r.out.find("Only codes 0..17 (2580..17200 Hz)"), std::string::npos);
        EXPECT_NE(r.out.find("codes 18..22 (18060..21500 Hz)"), std::string::npos);
        EXPECT_NE(r.out.find("codes 23..39 (22360 Hz and up)"), std::string::npos);
    }
    // The device commands take the routes; the demo makes its own room.
    for (const char* sub : {"listen", "say", "sweep", "handshake", "monitor"}) {
        ProcessResult r = run({sub, "--help"});
        EXPECT_NE(r.out.find("--mic"), std::string::npos) << sub;
        EXPECT_NE(r.out.find("--speaker"), std::string::npos) << sub;
    }
}

TEST(HostCli, VersionIsOneLine) {
    ProcessResult r = run({"--version"});
    EXPECT_EQ(r.status, 0);
    EXPECT_TRUE(std::regex_match(r.out, std::regex("soundmeter [0-9]+\\.[0-9]+\\.[0-9]+\n"))) << r.out;
    EXPECT_EQ(r.err, "");
}

TEST(HostCli, BadUsageExitsTwoWithOneLineOnStderr) {
    struct Case {
        std::vector<std::string> args;
        EnvList env;
        std::string says;  // a part of the one line
    };
    const std::vector<Case> cases = {
        {{}, {}, "subcommand is required"},
        {{"frobnicate"}, {}, "unknown command 'frobnicate'"},
        {{"--frobnicate"}, {}, "unknown option '--frobnicate'"},
        {{"say"}, {}, "CODE is required"},
        {{"say", "40"}, {}, "CODE"},
        {{"say", "3", "4"}, {}, "not expected: 4"},
        {{"listen", "--mic", "bogus"}, {}, "--mic: unknown audio route 'bogus'"},
        {{"say", "1", "--speaker", "wav:"}, {}, "--speaker"},
        {{"listen", "--seconds", "1"}, {{"KORVO_MIC", "nowhere"}}, "KORVO_MIC: unknown audio route 'nowhere'"},
        {{"demo", "--rounds", "-1"}, {}, "--rounds"},
        {{"demo", "--rounds", "0"}, {}, "--rounds"},
        {{"handshake", "--rounds", "2"}, {}, "--role is required"},
        {{"handshake", "--role", "both"}, {}, "--role"},
        {{"handshake", "--role", "speaker", "--rounds", "-3"}, {}, "--rounds"},
        // With acknowledgement the answer to 17 would be 18, which cannot be heard.
        {{"handshake", "--role", "speaker", "--first-code", "17"}, {}, "--first-code"},
        {{"listen", "--code", "x"}, {}, "--code"},
        {{"monitor", "--seconds", "-1"}, {}, "--seconds"},
    };
    for (const Case& c : cases) {
        std::string shown;
        for (const auto& a : c.args) shown += a + " ";
        SCOPED_TRACE(shown);
        ProcessResult r = run(c.args, c.env);
        EXPECT_EQ(r.status, 2);
        EXPECT_EQ(countLines(r.err), 1u) << r.err;
        EXPECT_EQ(r.err.rfind("soundmeter: ", 0), 0u) << r.err;
        EXPECT_NE(r.err.find(c.says), std::string::npos) << r.err;
        EXPECT_EQ(r.out, "");
    }
}

TEST(HostCli, MissingPlugInFailsWithOneLine) {
    for (const EnvList& env : {EnvList{}, EnvList{{"KORVO_PLUGIN", "/nonexistent/libkorvo_soundmeter.so"}}}) {
        std::vector<std::string> args = {"listen", "--seconds", "0.2"};
        if (env.empty()) args.push_back("--plugin=/nonexistent/libkorvo_soundmeter.so");
        ProcessResult r = run(args, env);
        EXPECT_EQ(r.status, 1);
        EXPECT_EQ(countLines(r.err), 1u) << r.err;
        EXPECT_NE(r.err.find("cannot load the plug-in /nonexistent/libkorvo_soundmeter.so"), std::string::npos);
    }
    // The demo's device fails the same way; the demo says so and fails too.
    ProcessResult demo = run({"demo", "--plugin=/nonexistent/libkorvo_soundmeter.so"});
    EXPECT_EQ(demo.status, 1);
    EXPECT_NE(demo.err.find("soundmeter: cannot load the plug-in /nonexistent/libkorvo_soundmeter.so"),
              std::string::npos);
    EXPECT_NE(demo.err.find("soundmeter: a device failed (listener exit 1)\n"), std::string::npos) << demo.err;
    EXPECT_NE(demo.out.find("0 of 3 exchanges completed\n"), std::string::npos) << demo.out;
}

TEST(HostCli, PlatformLogAndPlugInOutputOnlyWithVerbose) {
    // Quiet: neither the platform log nor the plug-in's own "Created"/"deleted" reach the user.
    ProcessResult quiet = run({"listen", "--seconds", "0.3"}, {{"KORVO_LOG", ""}, {"KORVO_LOG_LEVEL", "D"}});
    EXPECT_EQ(quiet.status, 0);
    EXPECT_EQ(quiet.err, "");
    EXPECT_TRUE(std::regex_match(quiet.out, std::regex("listening for every code\nlistened 0\\.[3-9] s: 0 codes\n")))
        << quiet.out;

    ProcessResult v = run({"-v", "listen", "--seconds", "0.3"});
    EXPECT_EQ(v.status, 0);
    EXPECT_NE(v.err.find("D/TQX: [SoundMeter] SoundMeter start!\n"), std::string::npos);
    EXPECT_EQ(v.err.find("V/"), std::string::npos);  // -v stops at debug
    EXPECT_NE(v.err.find("plug-in stdout: Created\n"), std::string::npos);
    EXPECT_NE(v.err.find("plug-in stdout: deleted\n"), std::string::npos);
    EXPECT_EQ(v.out.find("Created"), std::string::npos);

    // The device comes up and goes down in the interface's order.
    std::vector<std::string> order = {"[SoundMeter] makeToneGenerator", "[SoundMeter] start_wf_thread",
                                      "[SoundMeter] end_wf_thread", "[SoundMeter] releaseToneGenerator"};
    size_t at = 0;
    for (const std::string& step : order) {
        size_t found = v.err.find(step, at);
        EXPECT_NE(found, std::string::npos) << step;
        if (found != std::string::npos) at = found;
    }
    // -v after the subcommand works too.
    ProcessResult v2 = run({"listen", "--seconds", "0.2", "-v"});
    EXPECT_NE(v2.err.find("D/TQX: "), std::string::npos);
}

}  // namespace
