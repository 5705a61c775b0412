// Route texts, the routes in force, and the null and wav routes used directly.
#include <sndfile.h>

#include <future>

#include <korvo/platform/Routes.h>
#include <log/log.h>
#include <utils/Timers.h>

#include "support/PlatformTestSupport.h"

using namespace korvo::platform;
using namespace korvo::platformtest;

namespace {

using RoutesTest = PlatformFixture;

TEST_F(RoutesTest, RouteTexts) {
    for (const char* good : {"null", "wav:/tmp/x.wav", "wav:relative.wav", "sim:room-1", "card", "card:0", "card:USB Audio"}) {
        std::string error = "untouched";
        EXPECT_TRUE(validateRoute(good, &error)) << good;
        EXPECT_EQ(error, "untouched") << good;
    }
    std::string error;
    EXPECT_FALSE(validateRoute("foo", &error));
    EXPECT_EQ(error, "unknown audio route 'foo' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])");
    EXPECT_FALSE(validateRoute("foo", nullptr));
    // The last two are room names that the room would refuse: refused up front, naming the room.
    for (const std::string bad : {"", "NULL", " null", "null ", "nul", "wav", "wav:", "sim:", "card:", "speaker",
                                  "file:/x", "sim:a/b", "sim:has space"}) {
        error.clear();
        EXPECT_FALSE(validateRoute(bad, &error)) << "'" << bad << "'";
        EXPECT_FALSE(error.empty()) << bad;
        EXPECT_EQ(error.find('\n'), std::string::npos) << bad;
        const std::string named = bad.size() > 4 && bad.rfind("sim:", 0) == 0 ? bad.substr(4) : bad;
        EXPECT_NE(error.find("'" + named + "'"), std::string::npos) << error;
    }

    error.clear();
    EXPECT_EQ(makeCaptureRoute("bogus:x", &error), nullptr);
    EXPECT_EQ(error, "unknown audio route 'bogus:x' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])");
    error.clear();
    EXPECT_EQ(makeOutputRoute("wav:", &error), nullptr);
    EXPECT_FALSE(error.empty());
    EXPECT_NE(makeCaptureRoute("null", nullptr), nullptr);
    EXPECT_NE(makeOutputRoute("null", nullptr), nullptr);

    // A wav route says why it cannot use its file.
    error.clear();
    EXPECT_EQ(makeCaptureRoute("wav:/nonexistent-korvo-dir/in.wav", &error), nullptr);
    EXPECT_EQ(error, "cannot open: No such file or directory");
    error.clear();
    EXPECT_EQ(makeOutputRoute("wav:/nonexistent-korvo-dir/out.wav", &error), nullptr);
    EXPECT_EQ(error, "cannot write: No such file or directory");

    // The routes in force come from the environment.
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

TEST_F(RoutesTest, WavOutputKeepsEverySampleAtTheFirstRate) {
    const std::string path = mFiles.path("out.wav");
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
    EXPECT_EQ(readWav(path).frames, 2646);
    route.reset();
    auto w = readWav(path);
    ASSERT_TRUE(w.ok);
    EXPECT_EQ(w.channels, 1);
    EXPECT_EQ(w.rate, 44100);
    EXPECT_EQ(w.format, SF_FORMAT_WAV | SF_FORMAT_PCM_16);
    EXPECT_EQ(w.samples, written);

    // At the track's rate; a later open at another rate keeps the file's first rate and says so.
    const std::string path48 = mFiles.path("out48k.wav");
    route = makeOutputRoute("wav:" + path48, nullptr);
    ASSERT_NE(route, nullptr);
    ASSERT_EQ(route->open(48000), 0);
    std::vector<int16_t> b(960, 1234);
    route->write(b.data(), b.size());
    route->stop();
    test::captureLog(true);
    ASSERT_EQ(route->open(44100), 0);
    route->write(b.data(), 10);
    route.reset();
    ASSERT_EQ(test::logLines().size(), 1u);
    EXPECT_EQ(test::logLines()[0].prio, ANDROID_LOG_ERROR);
    w = readWav(path48);
    ASSERT_TRUE(w.ok);
    EXPECT_EQ(w.rate, 48000);
    EXPECT_EQ(w.frames, 970);
}

TEST_F(RoutesTest, OutputIsPacedAndStopInterruptsWaits) {
    for (const std::string& text : {std::string("null"), "wav:" + mFiles.path("paced.wav")}) {
        auto route = makeOutputRoute(text, nullptr);
        ASSERT_NE(route, nullptr);
        ASSERT_EQ(route->open(44100), 0);
        std::vector<int16_t> block(882, 0);  // 20 ms
        const nsecs_t t0 = systemTime(SYSTEM_TIME_MONOTONIC);
        for (int i = 0; i < 6; ++i) route->write(block.data(), block.size());
        // The writer stays one buffer ahead: six buffers return after five have played.
        EXPECT_GE(systemTime(SYSTEM_TIME_MONOTONIC) - t0, 100000000) << text;
    }

    // Output: the second ten-second buffer would wait for the first to play.
    auto out = makeOutputRoute("null", nullptr);
    ASSERT_EQ(out->open(44100), 0);
    std::vector<int16_t> tenSeconds(441000, 0);
    out->write(tenSeconds.data(), tenSeconds.size());
    std::atomic<bool> started{false};
    auto writer = std::async(std::launch::async, [&] {
        started = true;
        out->write(tenSeconds.data(), tenSeconds.size());
    });
    while (!started) std::this_thread::yield();
    out->stop();
    writer.get();
    out->write(tenSeconds.data(), tenSeconds.size());  // stays stopped until the next open

    // Capture: a ten-second read comes back short.
    auto in = makeCaptureRoute("null", nullptr);
    int16_t probe[4];
    EXPECT_LT(in->read(probe, 4), 0);  // not opened
    ASSERT_EQ(in->open(44100), 0);
    started = false;
    auto reader = std::async(std::launch::async, [&] {
        started = true;
        return in->read(tenSeconds.data(), tenSeconds.size());
    });
    while (!started) std::this_thread::yield();
    in->stop();
    const ssize_t got = reader.get();
    EXPECT_GE(got, 0);
    EXPECT_LT(got, static_cast<ssize_t>(tenSeconds.size()));
    EXPECT_LT(in->read(tenSeconds.data(), tenSeconds.size()), static_cast<ssize_t>(tenSeconds.size()));
    EXPECT_EQ(in->open(0), android::BAD_VALUE);
}

}  // namespace
