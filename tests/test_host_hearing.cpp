// How the soundmeter command hears: scan against a live listen on the same recordings,
// the host's decoder on sox-made recordings, the builtin decoder's calibrated level in a
// noisy room, and what the spectrogram and the monitor show of a recording.
#include <cairo.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <regex>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "support/HostProcess.h"

namespace {

namespace fs = std::filesystem;
using namespace korvo::testing;
using Args = std::vector<std::string>;

const std::string kHost = KORVO_HOST_PATH;
constexpr int kRunMs = 90000;  // bounds only: a loaded machine may be slow
constexpr double kFrameSeconds = 512.0 / 44100.0;
constexpr double kToneAmplitude = 0.25;

struct Tone {
    int code;
    int ms;
};
struct Heard {
    int code;
    double seconds;
};

std::string num(double v) {
    char text[32];
    snprintf(text, sizeof text, "%.4f", v);
    return text;
}

// The codes a soundmeter command reported (--json), in order.
std::vector<Heard> heardIn(const ProcessResult& r) {
    std::vector<Heard> heard;
    for (const std::string& line : linesOf(r.out)) {
        const auto e = nlohmann::json::parse(line, nullptr, false);
        if (e.is_object() && e["event"] == "heard") heard.push_back({e["code"].get<int>(), e["t_s"].get<double>()});
    }
    return heard;
}

std::string codesOf(const std::vector<Heard>& heard) {
    std::string s;
    for (const Heard& h : heard) s += std::to_string(h.code) + "@" + num(h.seconds) + " ";
    return s;
}

class HostHearing : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_NE(mkdtemp(&mDir[0]), nullptr); }
    void TearDown() override { fs::remove_all(mDir); }
    std::string path(const std::string& name) const { return mDir + "/" + name; }

    void sox(const Args& args) {
        const ProcessResult r = runHost("/usr/bin/sox", args, kRunMs);
        ASSERT_EQ(r.status, 0) << r.err;
    }

    // sox's synth is band-limited at the file's rate: at 44.1 kHz a 21500 Hz tone (code 22)
    // comes out 25 dB down. Made at 96 kHz and converted with a wide passband, it keeps its level.
    static Args synthAt44k(const std::string& file) {
        return {"-R", "-r", "96000", "-n", "-r", "44100", "-b", "16", "-c", "1", file};
    }
    const Args mToRate = {"rate", "-v", "-b", "99.7", "44100"};

    // A recording made by sox: `leadMs` of quiet, then each tone (amplitude 0.25) after
    // 300 ms of quiet, then 300 ms more; with noise (sox's whitenoise, or "speech": pink
    // noise swelling at 4 Hz) whose RMS is `snrDb` under the tone's. Tone starts in *starts.
    std::string record(const std::string& name, const std::vector<Tone>& tones, double snrDb = NAN, int leadMs = 300,
                       const std::string& noise = "whitenoise", std::vector<double>* starts = nullptr) {
        const std::string tonesFile = path(name + ".tones.wav");
        Args a = synthAt44k(tonesFile);
        double at = leadMs / 1000.0;
        for (size_t i = 0; i < tones.size(); ++i) {
            if (i > 0) a.push_back(":");
            const double before = i == 0 ? leadMs / 1000.0 : 0.3;
            at += i == 0 ? 0.0 : 0.3;
            if (starts) starts->push_back(at);
            at += tones[i].ms / 1000.0;
            a.insert(a.end(), {"synth", num(tones[i].ms / 1000.0), "sine", std::to_string(86 * (30 + 10 * tones[i].code)),
                               "vol", num(kToneAmplitude), "pad", num(before), i + 1 == tones.size() ? "0.3" : "0"});
            a.insert(a.end(), mToRate.begin(), mToRate.end());
        }
        sox(a);
        if (std::isnan(snrDb)) return tonesFile;
        return withNoise(name, tonesFile, at + 0.3, kToneAmplitude / std::sqrt(2.0) / std::pow(10.0, snrDb / 20.0), noise);
    }

    // `seconds` of noise at an RMS of `rms` (of full scale), mixed under `tonesFile` when given.
    std::string withNoise(const std::string& name, const std::string& tonesFile, double seconds, double rms,
                          const std::string& noise = "whitenoise") {
        const std::string raw = path(name + ".noise.wav");
        Args a = synthAt44k(raw);
        a.insert(a.end(), {"synth", num(seconds)});
        a.push_back(noise == "speech" ? "pinknoise" : noise);
        a.insert(a.end(), {"vol", "0.2"});
        if (noise == "speech") a.insert(a.end(), {"tremolo", "4", "90"});
        a.insert(a.end(), mToRate.begin(), mToRate.end());
        sox(a);
        const ProcessResult stat = runHost("/usr/bin/sox", {raw, "-n", "stat"}, kRunMs);
        std::smatch m;
        EXPECT_TRUE(std::regex_search(stat.err, m, std::regex("RMS +amplitude: +([0-9.]+)"))) << stat.err;
        const double gain = rms / std::stod(m[1]);
        const std::string out = path(name + ".wav");
        if (tonesFile.empty()) {
            sox({"-R", "-v", num(gain), raw, out});
        } else {
            sox({"-R", "-m", "-v", "1", tonesFile, "-v", num(gain), raw, out});
        }
        return out;
    }

    std::vector<Heard> scan(const std::string& file, Args extra = {}) {
        Args args = {"--json", "scan", file};
        args.insert(args.end(), extra.begin(), extra.end());
        const ProcessResult r = runHost(kHost, args, kRunMs);
        EXPECT_EQ(r.status, 0) << r.err;
        return heardIn(r);
    }

    std::string mDir = "/tmp/korvo-hearing-XXXXXX";
};

TEST_F(HostHearing, ScanHearsWhatALiveListenHearsFrameForFrame) {
    const std::string files[] = {
        record("noisy", {{3, 300}, {9, 300}, {20, 300}}, 10.0),
        record("short", {{12, 60}, {5, 80}, {17, 300}}),
    };
    for (const std::string& file : files) {
        const std::vector<Heard> live = heardIn(runHost(kHost, {"--json", "listen", "--mic", "wav:" + file}, kRunMs));
        ASSERT_EQ(live.size(), 3u) << file << ": " << codesOf(live);
        // The same frames reach the same decoder: the same codes at the same times.
        EXPECT_EQ(codesOf(scan(file)), codesOf(live)) << file;
    }
}

TEST_F(HostHearing, EveryCodeInNoiseAsSaidAndNoCodeNobodySaid) {
    // Codes 0..22 at 0 dB SNR in white noise.
    std::vector<Tone> all;
    for (int c = 0; c <= 22; ++c) all.push_back({c, 300});
    std::vector<double> starts;
    const std::string noisy = record("all", all, 0.0, 2000, "whitenoise", &starts);
    const std::vector<Heard> heard = scan(noisy);
    ASSERT_EQ(heard.size(), all.size()) << codesOf(heard);
    for (size_t i = 0; i < heard.size(); ++i) {
        EXPECT_EQ(heard[i].code, int(i));
        // Within a few frames of the tone's start (a tone 10 dB over the noise in each frame's bin).
        EXPECT_GT(heard[i].seconds, starts[i]) << codesOf(heard);
        EXPECT_LT(heard[i].seconds, starts[i] + 0.06) << codesOf(heard);
    }

    // Codes 18..23 over a quiet room's noise: the host hears 18..22 as themselves, and nobody
    // hears 23, above half the rate.
    const std::string high = record("high", {{18, 300}, {19, 300}, {20, 300}, {21, 300}, {22, 300}, {23, 300}}, 40.0, 2000);
    std::string codes;
    for (const Heard& h : scan(high)) codes += std::to_string(h.code) + " ";
    EXPECT_EQ(codes, "18 19 20 21 22 ");

    // Noise alone, steady and swelling like speech: no code.
    for (const std::string& file : {withNoise("white", "", 30.0, 0.03), withNoise("speech", "", 30.0, 0.1, "speech")}) {
        EXPECT_EQ(codesOf(scan(file)), "") << file;
    }
}

TEST_F(HostHearing, AFortyMillisecondToneIsHeardOnceAsItSounds) {
    std::vector<double> starts;
    const std::string file = record("short", {{8, 40}}, 20.0, 300, "whitenoise", &starts);
    const std::vector<Heard> heard = scan(file);
    ASSERT_EQ(heard.size(), 1u) << codesOf(heard);
    EXPECT_EQ(heard[0].code, 8);
    EXPECT_GT(heard[0].seconds, starts[0]);
    EXPECT_LT(heard[0].seconds, starts[0] + 0.04);
}

// The luminance (0..255) of a pixel of a decoded picture.
struct Picture {
    explicit Picture(const std::string& png) : surface(cairo_image_surface_create_from_png(png.c_str())) {}
    ~Picture() { cairo_surface_destroy(surface); }
    bool ok() const { return cairo_surface_status(surface) == CAIRO_STATUS_SUCCESS; }
    int width() const { return cairo_image_surface_get_width(surface); }
    int height() const { return cairo_image_surface_get_height(surface); }
    double luminance(int x, int y) const {
        const unsigned char* row = cairo_image_surface_get_data(surface) + y * cairo_image_surface_get_stride(surface);
        const uint32_t p = reinterpret_cast<const uint32_t*>(row)[x];
        return 0.2126 * ((p >> 16) & 0xff) + 0.7152 * ((p >> 8) & 0xff) + 0.0722 * (p & 0xff);
    }
    cairo_surface_t* surface;
};

TEST_F(HostHearing, TheSpectrogramShowsEachCodeInItsBandWhileItSounds) {
    std::vector<double> starts;
    const std::vector<Tone> tones = {{3, 400}, {10, 400}, {17, 400}};
    const std::string file = record("three", tones, 10.0, 500, "whitenoise", &starts);
    const std::string png = path("three.png");
    ProcessResult r = runHost(kHost, {"--json", "spectrogram", file, "--png", png}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(codesOf(heardIn(r)).substr(0, 2), "3@");
    std::string codes;
    for (const Heard& h : heardIn(r)) codes += std::to_string(h.code) + " ";
    EXPECT_EQ(codes, "3 10 17 ");

    // One column of 2 pixels per frame: the file's frames and 21 after its last, 480 pixels
    // at least; margins 80 left and 190 right, 48 above and below 510 rows of bins.
    const ProcessResult samples = runHost("/usr/bin/soxi", {"-s", file}, kRunMs);
    const int columns = (std::stoi(samples.out) + 511) / 512 + 21;
    ASSERT_LT(columns, 480);
    const int columnPixels = (480 + columns - 1) / columns;
    Picture picture(png);
    ASSERT_TRUE(picture.ok()) << cairo_status_to_string(cairo_surface_status(picture.surface));
    EXPECT_EQ(picture.width(), 80 + columns * columnPixels + 190);
    EXPECT_EQ(picture.height(), 48 + 510 + 48);

    const auto x = [&](double seconds) { return 80 + static_cast<int>(seconds / kFrameSeconds) * columnPixels; };
    const auto y = [](int bin) { return 48 + 2 * (255 - bin); };
    const auto band = [&](double seconds, int bin) {
        return std::max({picture.luminance(x(seconds), y(bin)), picture.luminance(x(seconds), y(bin) + 1)});
    };
    for (size_t i = 0; i < tones.size(); ++i) {
        const int bin = 30 + 10 * tones[i].code;
        const double during = starts[i] + 0.2;
        const double after = starts[i] + 0.55;  // a tone's read-out lasts a few frames longer
        // Around: bins 5..12 below the code's, at the same time (the tone's leakage is far under).
        double around = 0.0;
        for (int b = bin - 12; b <= bin - 5; ++b) around = std::max(around, band(during, b));
        EXPECT_GT(band(during, bin), around + 40.0) << "code " << tones[i].code;
        EXPECT_GT(band(during, bin), band(after, bin) + 40.0) << "code " << tones[i].code;
        EXPECT_GT(band(during, bin), band(0.3, bin) + 40.0) << "code " << tones[i].code;
    }

    // From the microphone route in real time: the same codes, and a picture.
    const std::string live = path("live.png");
    r = runHost(kHost, {"--json", "spectrogram", "--mic", "wav:" + file, "--png", live, "--seconds", "30"}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.err;
    codes.clear();
    for (const Heard& h : heardIn(r)) codes += std::to_string(h.code) + " ";
    EXPECT_EQ(codes, "3 10 17 ");
    EXPECT_TRUE(Picture(live).ok());

    // A picture that cannot be written is refused before anything is heard.
    r = runHost(kHost, {"spectrogram", file, "--png", path("missing/x.png")}, kRunMs);
    EXPECT_EQ(r.status, 2);
    EXPECT_NE(r.err.find("missing/x.png: cannot write: No such file or directory"), std::string::npos) << r.err;
}

TEST_F(HostHearing, TheMonitorShowsPeaksFloorsAndTheCodesHeard) {
    const std::string file = record("monitor", {{3, 400}, {10, 400}}, 10.0, 500);
    const ProcessResult r = runHost(kHost, {"monitor", "--mic", "wav:" + file}, kRunMs);
    ASSERT_EQ(r.status, 0) << r.err;
    // The last frame: frames follow each other when the output is not a terminal.
    const std::vector<std::string> lines = linesOf(r.out);
    const auto last = std::find_if(lines.rbegin(), lines.rend(), [](const std::string& l) { return l.find(" s  no detection level") != std::string::npos; });
    ASSERT_NE(last, lines.rend()) << r.out;
    const std::vector<std::string> frame(last.base() - 1, lines.end());
    ASSERT_GE(frame.size(), 27u) << r.out;  // time, legend, 23 codes, a note, heard
    std::smatch m;
    const std::regex row("^code +([0-9]+) +[0-9]+ Hz ([-#.>|]{50}) +([0-9.]+) +([0-9.]+) +([0-9.]+)$");
    for (int c = 0; c < 23; ++c) {
        ASSERT_TRUE(std::regex_match(frame[2 + c], m, row)) << frame[2 + c];
        // No level line: the host's decoder takes no detection level.
        EXPECT_EQ(std::string(m[2]).find('|'), std::string::npos) << frame[2 + c];
        const double now = std::stod(m[3]), floor = std::stod(m[4]), peak = std::stod(m[5]);
        EXPECT_GT(floor, 20.0) << frame[2 + c];
        // Both tones ended less than the 2 s hold before the last frame: their peaks stand
        // far above the noise, which is all the other bands saw.
        if (c == 3 || c == 10) {
            EXPECT_GT(peak, std::max(now, floor) + 15.0) << frame[2 + c];
        } else {
            EXPECT_LT(peak, floor + 15.0) << frame[2 + c];
        }
    }
    EXPECT_TRUE(std::regex_search(frame[26], m, std::regex("^heard: code 10 \\(11180 Hz\\) ([0-9.]+) s ago; code 3 \\(5160 Hz\\) ([0-9.]+) s ago$")))
        << frame[26];
    EXPECT_NEAR(std::stod(m[2]) - std::stod(m[1]), 0.7, 0.3);  // ages on the wall clock of a loaded machine
}

TEST(HostCalibration, TheProposedLevelKeepsANoisyRoomQuietAndTonesHeard) {
    const std::string room = uniqueRoom("calibrate");
    const EnvList noise = {{"KORVO_SIM_NOISE", "-30"}, {"KORVO_SIM_SEED", "7"}};
    auto in = [&room](Args args) {
        args.insert(args.end(), {"--mic", "sim:" + room, "--speaker", "sim:" + room});
        return args;
    };
    ProcessResult r = runHost(kHost, in({"--json", "calibrate", "--decoder", "builtin", "--seconds", "1.5"}), kRunMs, noise);
    ASSERT_EQ(r.status, 0) << r.err;
    const auto proposal = nlohmann::json::parse(r.out);
    const int level = proposal["level"].get<int>();
    EXPECT_GT(level, 0) << r.out;
    EXPECT_LT(proposal["false_per_10k"].get<double>(), 1.0);

    // The plug-in's own level lets the noise through as codes; the proposed one does not.
    r = runHost(kHost, in({"--json", "listen", "--decoder", "builtin", "--level", "0", "--seconds", "2"}), kRunMs, noise);
    EXPECT_FALSE(heardIn(r).empty()) << r.out;
    r = runHost(kHost, in({"--json", "listen", "--decoder", "builtin", "--level", std::to_string(level), "--seconds", "4"}),
                kRunMs, noise);
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(codesOf(heardIn(r)), "");

    HostProcess listener(kHost);
    ASSERT_TRUE(listener.start(in({"listen", "--decoder", "builtin", "--level", std::to_string(level), "--code", "9", "--seconds", "60"}), noise));
    ASSERT_TRUE(listener.waitForOutput("listening for code 9", 30000));
    EXPECT_EQ(runHost(kHost, in({"say", "9", "--ms", "400"}), kRunMs, noise).status, 0);
    r = listener.finish(kRunMs);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_FALSE(roomExists(room));
}

}  // namespace
