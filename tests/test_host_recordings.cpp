// Recordings as people have them, made with sox: heard through the wav microphone, the
// loudspeaker's recording of a sweep, and files that cannot be used refused by the checks.
#include <sndfile.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <random>
#include <regex>

#include <gtest/gtest.h>
#include <korvo/platform/Routes.h>

#include "support/HostProcess.h"

namespace {

namespace fs = std::filesystem;
using korvo::testing::runHost;
using Args = std::vector<std::string>;

const std::string kHost = KORVO_HOST_PATH;
constexpr int kRunMs = 60000;  // generous: the machine may be busy with other tests

class Recordings : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_NE(mkdtemp(&mDir[0]), nullptr); }
    void TearDown() override { fs::remove_all(mDir); }
    std::string path(const std::string& name) const { return mDir + "/" + name; }

    // 1.5 s of code c's tone, 86 x (30 + 10c) Hz at amplitude 0.5, in the form sox's options say.
    std::string tone(const std::string& name, Args args, int code) {
        args.insert(args.begin(), "-n");
        args.insert(args.end(), {path(name), "synth", "1.5", "sine", std::to_string(86 * (30 + 10 * code)), "vol", "0.5"});
        auto r = runHost("/usr/bin/sox", args, kRunMs);
        EXPECT_EQ(r.status, 0) << r.err;
        return path(name);
    }
    void expectHeard(const std::string& mic, int code, const std::string& stdinFile = "") {
        auto r = runHost(kHost, {"listen", "--code", std::to_string(code), "--mic", mic, "--seconds", "6"}, kRunMs, {}, stdinFile);
        EXPECT_EQ(r.status, 0) << mic << ": " << r.out << r.err;
        EXPECT_NE(r.out.find("heard code " + std::to_string(code) + " "), std::string::npos) << mic << ": " << r.out;
    }

    std::string mDir = "/tmp/korvo-recordings-XXXXXX";
};

TEST_F(Recordings, EveryFormatIsHeardAsTheCodeItHolds) {
    // A different code on each row: a rate left unconverted moves the tone to another code.
    const std::vector<std::tuple<std::string, Args, int>> rows = {
        {"float32.wav", {"-r", "44100", "-e", "floating-point", "-b", "32"}, 0},
        {"float64.wav", {"-r", "44100", "-e", "floating-point", "-b", "64"}, 1},
        {"int24.wav", {"-r", "44100", "-b", "24"}, 2},
        {"stereo48k.wav", {"-r", "48000", "-c", "2", "-b", "16"}, 4},
        {"96k.wav", {"-r", "96000", "-b", "32"}, 17},
        {"22k.wav", {"-r", "22050", "-b", "16"}, 9},  // 10320 Hz, below the file's 11025
        {"tone.flac", {"-r", "48000", "-c", "2"}, 12},
        {"tone.ogg", {"-r", "44100", "-c", "2"}, 14},
        {"tone.aiff", {"-r", "32000", "-b", "16"}, 6},
    };
    for (const auto& [name, format, code] : rows) expectHeard("wav:" + tone(name, format, code), code);
    // Standard input, here a FLAC file: the route reads it whole.
    expectHeard("wav:-", 15, tone("stdin.flac", {"-r", "48000"}, 15));
}

TEST_F(Recordings, TheSpeakersFileHoldsItsTonesWhereTheyWerePlayed) {
    auto sweep = runHost(kHost, {"sweep", "--no-ack", "--seconds", "3", "--ms", "240", "--speaker", "wav:" + path("out.wav")}, kRunMs);
    ASSERT_EQ(sweep.status, 0) << sweep.err;
    std::vector<std::pair<double, std::string>> said;  // seconds after the sweep started, code
    const std::regex line("([0-9.]+) s  said code ([0-9]+)");
    for (std::sregex_iterator m(sweep.out.begin(), sweep.out.end(), line), end; m != end; ++m)
        said.push_back({std::stod((*m)[1]), (*m)[2]});
    ASSERT_GE(said.size(), 3u) << sweep.out;

    SF_INFO info{};
    SNDFILE* file = sf_open(path("out.wav").c_str(), SFM_READ, &info);
    ASSERT_TRUE(file);
    ASSERT_TRUE(info.samplerate == 44100);
    std::vector<short> samples(static_cast<size_t>(info.frames));
    samples.resize(static_cast<size_t>(sf_readf_short(file, samples.data(), info.frames)));
    sf_close(file);
    // The sweep's 3 s, the device's start before it and the last tone's end after it.
    EXPECT_TRUE(samples.size() > 3.0 * 44100) << samples.size();
    EXPECT_TRUE(samples.size() < 5.0 * 44100) << samples.size();
    std::vector<double> onsets;  // where sound follows silence, in steps of 10 ms
    for (size_t at = 0, loud = 0; at + 441 <= samples.size(); at += 441) {
        const bool now = std::any_of(&samples[at], &samples[at] + 441, [](short s) { return std::abs(s) > 1000; });
        if (now && !loud) onsets.push_back(at / 44100.0);
        loud = now;
    }
    ASSERT_EQ(onsets.size(), said.size()) << sweep.out;
    EXPECT_LT(onsets[0], 1.0);  // the first tone near the start, then the pauses kept
    for (size_t i = 1; i < said.size(); ++i) EXPECT_NEAR(onsets[i] - onsets[0], said[i].first - said[0].first, 0.1) << i;

    // Played back, every code is heard, and the listener ends with the file, long before 60 s.
    const auto start = std::chrono::steady_clock::now();
    auto heard = runHost(kHost, {"listen", "--mic", "wav:" + path("out.wav"), "--seconds", "60"}, kRunMs);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(15));
    EXPECT_EQ(heard.status, 0) << heard.err;
    for (const auto& s : said) EXPECT_NE(heard.out.find("heard code " + s.second + " "), std::string::npos) << heard.out;
}

TEST_F(Recordings, ChecksRefuseUnusableFilesWithTheirCauseAndLeaveNothingBehind) {
    const std::string good = tone("good.wav", {"-r", "44100"}, 2);
    std::string bytes(4096, '\0'), header(20, '\0');
    std::mt19937 random(20240501);
    for (char& c : bytes) c = static_cast<char>(random());
    std::ifstream(good, std::ios::binary).read(&header[0], 20);  // a header cut short
    std::ofstream(path("garbage.wav"), std::ios::binary) << bytes, std::ofstream(path("truncated.wav")) << header;
    std::ofstream(path("empty.wav")).close();
    struct Row { bool speaker; std::string file, cause; };  // no cause: usable
    const std::vector<Row> rows = {
        {false, path("missing.wav"), "cannot open: No such file or directory"},
        {false, path("empty.wav"), "cannot decode: "},
        {false, path("garbage.wav"), "cannot decode: "},
        {false, path("truncated.wav"), "cannot decode: "},
        {false, mDir, "cannot open: Is a directory"},
        {false, good, ""},
        {true, "/dev/full", "cannot write: No space left on device"},
        {true, path("no/folder.wav"), "cannot write: No such file or directory"},
        {true, mDir, "cannot write: Is a directory"},
        {true, path("new.wav"), ""}, {true, good, ""}, {true, "/dev/null", ""},
    };
    auto files = [&] { return std::make_pair(std::distance(fs::directory_iterator(mDir), {}), fs::file_size(good)); };
    const auto before = files();
    for (const Row& row : rows) {
        std::string reason, route = "wav:" + row.file;
        const bool ok = (row.speaker ? korvo::platform::checkOutputRoute : korvo::platform::checkCaptureRoute)(route, &reason);
        EXPECT_EQ(ok, row.cause.empty()) << route << ": " << reason;
        EXPECT_EQ(reason.rfind(route + ": " + row.cause, 0), ok ? std::string::npos : 0u) << reason;
    }
    EXPECT_EQ(files(), before);  // nothing made or removed, the existing file as it was
    EXPECT_TRUE(fs::is_character_file("/dev/full"));
    EXPECT_TRUE(fs::is_character_file("/dev/null"));
}

}  // namespace
