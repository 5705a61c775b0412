// Route texts, the routes in force, and the null and wav routes used directly.
#include <gtest/gtest.h>

#include <sndfile.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <future>
#include <string>
#include <thread>
#include <vector>

#include <korvo/platform/Routes.h>
#include <korvo/platform/TestControl.h>
#include <log/log.h>
#include <utils/Timers.h>

using namespace korvo::platform;

namespace {

class RoutesTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        unsetenv("KORVO_MIC");
        unsetenv("KORVO_SPEAKER");
    }
    void TearDown() override {
        unsetenv("KORVO_MIC");
        unsetenv("KORVO_SPEAKER");
        for (const auto& p : mFiles) unlink(p.c_str());
    }
    std::string file(const char* name) {
        mFiles.push_back("/tmp/korvo-routes-" + std::to_string(getpid()) + "-" + name);
        unlink(mFiles.back().c_str());
        return mFiles.back();
    }
    std::vector<std::string> mFiles;
};

struct WavContents {
    SF_INFO info{};
    std::vector<int16_t> samples;
    bool ok = false;
};

WavContents readWav(const std::string& path) {
    WavContents w;
    SNDFILE* f = sf_open(path.c_str(), SFM_READ, &w.info);
    if (!f) return w;
    w.samples.resize(static_cast<size_t>(w.info.frames * w.info.channels));
    sf_readf_short(f, w.samples.data(), w.info.frames);
    sf_close(f);
    w.ok = true;
    return w;
}

}  // namespace

TEST_F(RoutesTest, RouteTexts) {
    for (const char* good : {"null", "wav:/tmp/x.wav", "wav:relative.wav", "sim:room-1", "card", "card:0", "card:USB Audio"}) {
        std::string error = "untouched";
        EXPECT_TRUE(validateRoute(good, &error)) << good;
        EXPECT_EQ(error, "untouched") << good;
    }
    std::string error;
    EXPECT_FALSE(validateRoute("foo", &error));
    EXPECT_EQ(error, "unknown audio route 'foo' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])");
    for (const char* bad : {"", "NULL", " null", "null ", "nul", "wav", "wav:", "sim:", "card:", "speaker", "file:/x"}) {
        error.clear();
        EXPECT_FALSE(validateRoute(bad, &error)) << "'" << bad << "'";
        EXPECT_FALSE(error.empty()) << bad;
        EXPECT_EQ(error.find('\n'), std::string::npos) << bad;
        EXPECT_NE(error.find(std::string("'") + bad + "'"), std::string::npos) << error;
    }
    EXPECT_FALSE(validateRoute("foo", nullptr));
    // A room name that the room would refuse is refused up front.
    for (const char* bad : {"sim:a/b", "sim:has space"}) {
        error.clear();
        EXPECT_FALSE(validateRoute(bad, &error)) << bad;
        EXPECT_FALSE(error.empty()) << bad;
    }

    error.clear();
    EXPECT_EQ(makeCaptureRoute("bogus:x", &error), nullptr);
    EXPECT_EQ(error, "unknown audio route 'bogus:x' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])");
    error.clear();
    EXPECT_EQ(makeOutputRoute("wav:", &error), nullptr);
    EXPECT_FALSE(error.empty());
    EXPECT_NE(makeCaptureRoute("null", nullptr), nullptr);
    EXPECT_NE(makeOutputRoute("null", nullptr), nullptr);

    // A wav route reports the file it cannot use.
    error.clear();
    EXPECT_EQ(makeCaptureRoute("wav:/nonexistent-korvo-dir/in.wav", &error), nullptr);
    EXPECT_NE(error.find("cannot read WAV file '/nonexistent-korvo-dir/in.wav'"), std::string::npos) << error;
    error.clear();
    EXPECT_EQ(makeOutputRoute("wav:/nonexistent-korvo-dir/out.wav", &error), nullptr);
    EXPECT_NE(error.find("cannot write WAV file '/nonexistent-korvo-dir/out.wav'"), std::string::npos) << error;
}

TEST_F(RoutesTest, RoutesInForceComeFromTheEnvironment) {
    EXPECT_EQ(micRoute(), "null");
    EXPECT_EQ(speakerRoute(), "null");
    setenv("KORVO_MIC", "wav:/tmp/in.wav", 1);
    setenv("KORVO_SPEAKER", "sim:kitchen", 1);
    EXPECT_EQ(micRoute(), "wav:/tmp/in.wav");
    EXPECT_EQ(speakerRoute(), "sim:kitchen");
    setenv("KORVO_MIC", "", 1);
    EXPECT_EQ(micRoute(), "null");
    for (const char* r : {"null", "wav:/tmp/out.wav", "sim:kitchen", "card", "card:1"}) {
        EXPECT_EQ(outputRateOf(r), 44100u) << r;
    }
}

TEST_F(RoutesTest, WavOutputKeepsEverySample) {
    const std::string path = file("out.wav");
    std::string error;
    auto route = makeOutputRoute("wav:" + path, &error);
    ASSERT_NE(route, nullptr) << error;
    ASSERT_EQ(route->open(44100), 0);
    std::vector<int16_t> written;
    for (int block = 0; block < 3; ++block) {
        std::vector<int16_t> b(882);
        for (size_t i = 0; i < b.size(); ++i) b[i] = static_cast<int16_t>(block * 10000 - 15000 + static_cast<int>(i));
        route->write(b.data(), b.size());
        written.insert(written.end(), b.begin(), b.end());
    }
    // The header is kept up to date while the route lives.
    WavContents live = readWav(path);
    ASSERT_TRUE(live.ok);
    EXPECT_EQ(live.info.frames, 2646);
    route.reset();

    WavContents w = readWav(path);
    ASSERT_TRUE(w.ok);
    EXPECT_EQ(w.info.channels, 1);
    EXPECT_EQ(w.info.samplerate, 44100);
    EXPECT_EQ(w.info.format, SF_FORMAT_WAV | SF_FORMAT_PCM_16);
    EXPECT_EQ(w.samples, written);
}

TEST_F(RoutesTest, WavOutputAtTheTracksRate) {
    const std::string path = file("out48k.wav");
    auto route = makeOutputRoute("wav:" + path, nullptr);
    ASSERT_NE(route, nullptr);
    ASSERT_EQ(route->open(48000), 0);
    std::vector<int16_t> b(960, 1234);
    route->write(b.data(), b.size());
    route->stop();
    // A later open at another rate keeps the file's first rate and says so.
    test::captureLog(true);
    ASSERT_EQ(route->open(44100), 0);
    route->write(b.data(), 10);
    route.reset();
    ASSERT_EQ(test::logLines().size(), 1u);
    EXPECT_EQ(test::logLines()[0].prio, ANDROID_LOG_ERROR);
    WavContents w = readWav(path);
    ASSERT_TRUE(w.ok);
    EXPECT_EQ(w.info.samplerate, 48000);
    EXPECT_EQ(w.info.frames, 970);
}

TEST_F(RoutesTest, OutputIsPacedAtRealTime) {
    for (const std::string& text : {std::string("null"), "wav:" + file("paced.wav")}) {
        auto route = makeOutputRoute(text, nullptr);
        ASSERT_NE(route, nullptr);
        ASSERT_EQ(route->open(44100), 0);
        std::vector<int16_t> block(882, 0);  // 20 ms
        const nsecs_t t0 = systemTime(SYSTEM_TIME_MONOTONIC);
        for (int i = 0; i < 6; ++i) route->write(block.data(), block.size());
        // The writer stays one buffer ahead: six buffers return after five have played.
        EXPECT_GE(systemTime(SYSTEM_TIME_MONOTONIC) - t0, 100000000) << text;
    }
}

TEST_F(RoutesTest, StopInterruptsWaits) {
    // Output: the second ten-second buffer would wait for the first to play.
    auto out = makeOutputRoute("null", nullptr);
    ASSERT_EQ(out->open(44100), 0);
    std::vector<int16_t> tenSeconds(441000, 0);
    out->write(tenSeconds.data(), tenSeconds.size());
    std::atomic<bool> writing{false};
    auto writer = std::async(std::launch::async, [&] {
        writing = true;
        out->write(tenSeconds.data(), tenSeconds.size());
    });
    while (!writing) std::this_thread::yield();
    out->stop();
    writer.get();
    out->write(tenSeconds.data(), tenSeconds.size());  // stays stopped until the next open

    // Capture: a ten-second read comes back short.
    auto in = makeCaptureRoute("null", nullptr);
    int16_t probe[4];
    EXPECT_LT(in->read(probe, 4), 0);  // not opened
    ASSERT_EQ(in->open(44100), 0);
    std::atomic<bool> reading{false};
    auto reader = std::async(std::launch::async, [&] {
        reading = true;
        return in->read(tenSeconds.data(), tenSeconds.size());
    });
    while (!reading) std::this_thread::yield();
    in->stop();
    const ssize_t got = reader.get();
    EXPECT_GE(got, 0);
    EXPECT_LT(got, static_cast<ssize_t>(tenSeconds.size()));
    EXPECT_LT(in->read(tenSeconds.data(), tenSeconds.size()), static_cast<ssize_t>(tenSeconds.size()));
    EXPECT_EQ(in->open(0), android::BAD_VALUE);
}
