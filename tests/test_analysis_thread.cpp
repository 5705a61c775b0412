// The analysis thread: its fields, single turns of its loop, and the running thread.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <ctime>
#include <thread>
#include <vector>

#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"

namespace kt = korvo::platform::test;

namespace android {
struct WaveformCanvasTestAccess {
    static bool turn(WaveformCanvas& w) { return w.threadLoop(); }
};
}  // namespace android

using android::sp;
using android::WaveformCanvas;
using android::WaveformCanvasTestAccess;

namespace {

void putTone(int16_t* frame, int bin, double amplitude) {
    for (int j = 0; j < 512; ++j) {
        frame[j] = static_cast<int16_t>(
            std::lround(amplitude * 32767.0 * std::sin(2.0 * M_PI * bin * j / 512.0)));
    }
}

int strongestBin(const WaveformCanvas& w) {
    const double* d = w.spectrum->data;
    return static_cast<int>(std::max_element(d + 1, d + 256) - d);
}

class AnalysisThreadTest : public ::testing::Test {
protected:
    void SetUp() override {
        kt::resetAll();
        // Written before the capture starts: the process's first exchange logs its own line.
        Mmic_data_t zero;
        std::memset(&zero, 0, sizeof zero);
        read_write_audio(nullptr, 1, &zero);
        kt::captureLog(true);
        kt::clearLog();
    }
};

}  // namespace

TEST_F(AnalysisThreadTest, NewObjectFields) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    EXPECT_EQ(w->historyLength, 1);
    EXPECT_EQ(w->frameIndex, 0);
    EXPECT_EQ(w->historyIndex, 0);
    EXPECT_EQ(w->getDetectionLevel(), 0);
    EXPECT_EQ(w->rwFlag, 0);
    ASSERT_NE(w->spectrum, nullptr);
    ASSERT_EQ(w->spectrum->length, 256);
    for (int i = 0; i < 256; ++i) EXPECT_EQ(w->spectrum->data[i], 0.0);
    ASSERT_NE(w->history, nullptr);
    EXPECT_EQ(w->history->length, 256);
    EXPECT_EQ(w->history->width, 1);
    for (int i = 0; i < 256; ++i) EXPECT_EQ(w->history->data[i], 0.0);
    EXPECT_FALSE(w->isRunning());

    // init_variables puts fresh tables in place and clears the level and history slot.
    sp<WaveTable_Double> old = w->spectrum;
    w->historyIndex = 3;
    testing::internal::CaptureStdout();
    w->setDetectionLevel(12);
    testing::internal::GetCapturedStdout();
    w->init_variables();
    EXPECT_NE(w->spectrum.get(), old.get());
    EXPECT_EQ(w->historyIndex, 0);
    EXPECT_EQ(w->getDetectionLevel(), 0);
}

TEST_F(AnalysisThreadTest, TurnsFollowTheirOwnSlotCounter) {
    // Slot k holds a tone on bin 20 + 10k; the record claims slot 3 throughout.
    Mmic_data_t rec;
    std::memset(&rec, 0, sizeof rec);
    for (int k = 0; k < 5; ++k) putTone(&rec.data[512 * k], 20 + 10 * k, 0.5);
    rec.index = 3;
    rec.count = 512;
    read_write_audio(nullptr, 1, &rec);

    sp<WaveformCanvas> w = new WaveformCanvas();
    std::vector<int> before, analysed;
    for (int t = 0; t < 6; ++t) {
        before.push_back(w->frameIndex);
        EXPECT_TRUE(WaveformCanvasTestAccess::turn(*w));
        analysed.push_back((strongestBin(*w) - 20) / 10);
    }
    EXPECT_EQ(before, (std::vector<int>{0, 1, 2, 3, 4, 0}));
    EXPECT_EQ(analysed, (std::vector<int>{0, 1, 2, 3, 4, 0}));
    EXPECT_EQ(w->frameIndex, 1);

    // A count beyond the copied ring is cut at its end: slot 4 with count 700 analyses
    // the slot itself and reads nothing past the copy.
    rec.count = 700;
    read_write_audio(nullptr, 1, &rec);
    w->frameIndex = 4;
    EXPECT_TRUE(WaveformCanvasTestAccess::turn(*w));
    EXPECT_EQ(strongestBin(*w), 60);
    EXPECT_EQ(w->frameIndex, 0);
}

TEST_F(AnalysisThreadTest, TurnWakesTheCaptureLoop) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    bool waiting = false;  // guarded by AudioBufferLock
    int waitResult = -1;
    std::thread waiter([&] {
        pthread_mutex_lock(&AudioBufferLock);
        waiting = true;
        timespec deadline;
        clock_gettime(CLOCK_REALTIME, &deadline);
        deadline.tv_sec += 10;
        waitResult = pthread_cond_timedwait(&WaitAudioBuffer, &AudioBufferLock, &deadline);
        pthread_mutex_unlock(&AudioBufferLock);
    });
    // Holding the lock with `waiting` set means the waiter sits in its timed wait.
    for (;;) {
        pthread_mutex_lock(&AudioBufferLock);
        const bool ready = waiting;
        pthread_mutex_unlock(&AudioBufferLock);
        if (ready) break;
        std::this_thread::yield();
    }
    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(WaveformCanvasTestAccess::turn(*w));
    waiter.join();
    EXPECT_EQ(waitResult, 0);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
}

TEST_F(AnalysisThreadTest, DetectionLevelAndRelease) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    testing::internal::CaptureStdout();
    w->setDetectionLevel(-5);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "[WAVEFORM_CANVAS] detection Level is -5\n");
    EXPECT_EQ(w->getDetectionLevel(), -5);
    w->setActive(true);
    EXPECT_TRUE(w->active.load());
    w->setActive(false);
    EXPECT_FALSE(w->active.load());

    // The read-outs use -5.0: a bin of level about -3 is written, not counted.
    w->spectrum->data[40] = std::pow(10.0, -6.18);
    std::vector<float> out(256, 1.0f);
    EXPECT_EQ(w->getSpectrumData(out.data()), 0);
    EXPECT_NEAR(out[40], -3.0f, 1e-4);

    w->release();
    const auto lines = kt::logLines();
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[0].prio, 6);
    EXPECT_EQ(lines[0].tag, "TQX");
    EXPECT_EQ(lines[0].msg, "[WAVEFORM_CANVAS] detection Level is -5");
    EXPECT_EQ(lines[1].prio, 3);
    EXPECT_EQ(lines[1].tag, "TQX");
    EXPECT_EQ(lines[1].msg, "[WAVEFORM_CANVAS] WaveformCanvas Relese");
}

TEST_F(AnalysisThreadTest, RunningThreadAnalysesThePublishedTone) {
    Mmic_data_t rec;
    std::memset(&rec, 0, sizeof rec);
    for (int k = 0; k < 5; ++k) putTone(&rec.data[512 * k], 47, 0.3);
    rec.count = 512;
    read_write_audio(nullptr, 1, &rec);

    sp<WaveformCanvas> w = new WaveformCanvas();
    sp<WaveTable_Double> table = w->spectrum;
    ASSERT_EQ(w->run("WaveformCanvas", 0, 0), android::OK);
    std::vector<float> out(256, 0.0f);
    int strongest = -1;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (std::chrono::steady_clock::now() < deadline) {
        std::fill(out.begin(), out.end(), 0.0f);
        if (w->getSpectrumData(out.data()) > 0) {
            strongest =
                static_cast<int>(std::max_element(out.begin() + 1, out.end()) - out.begin());
            if (strongest == 47) break;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    EXPECT_EQ(strongest, 47);

    // release() only logs: the thread goes on and the table stays.
    w->release();
    EXPECT_TRUE(w->isRunning());
    EXPECT_EQ(w->spectrum.get(), table.get());
    std::fill(out.begin(), out.end(), 0.0f);
    w->getSpectrumData(out.data());
    EXPECT_GT(out[47], 80.0f);

    EXPECT_EQ(w->requestExitAndWait(), android::OK);
    EXPECT_FALSE(w->isRunning());
}

TEST_F(AnalysisThreadTest, DroppingARunningThreadStopsItFirst) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    ASSERT_EQ(w->run("WaveformCanvas", 0, 0), android::OK);
    std::vector<float> out(256);
    w->getSpectrumData(out.data());
    w.clear();  // the destructor ends the loop before the tables go
    SUCCEED();
}
