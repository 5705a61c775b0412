// The analysis thread: its fields, single turns of its loop, and the running thread.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <ctime>
#include <string>
#include <thread>
#include <vector>

#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "support/DspTestSupport.h"

namespace kt = korvo::platform::test;

namespace android {
struct WaveformCanvasTestAccess {
    static bool turn(WaveformCanvas& w) { return w.threadLoop(); }
};
}  // namespace android

using android::sp;
using android::WaveformCanvas;
using android::WaveformCanvasTestAccess;
using korvo::dsptest::stdoutOf;

namespace {

// Publishes a record whose five slots hold a tone on bin(k).
template <class BinOf>
void publishTones(BinOf bin, double amplitude, int count, int index = 0) {
    Mmic_data_t rec;
    std::memset(&rec, 0, sizeof rec);
    for (int k = 0; k < 5; ++k) {
        const std::vector<short> tone = korvo::dsptest::toneFrame(bin(k), amplitude);
        std::copy(tone.begin(), tone.end(), &rec.data[512 * k]);
    }
    rec.index = index;
    rec.count = count;
    read_write_audio(nullptr, 1, &rec);
}

int strongestBin(const WaveformCanvas& w) {
    const double* d = w.spectrum->data;
    return static_cast<int>(std::max_element(d + 1, d + 256) - d);
}

class AnalysisThreadTest : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        Mmic_data_t zero;
        std::memset(&zero, 0, sizeof zero);
        read_write_audio(nullptr, 1, &zero);
        kt::clearLog();  // the process's first exchange logs its own line
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
    ASSERT_NE(w->history, nullptr);
    EXPECT_EQ(std::vector<double>(w->spectrum->data, w->spectrum->data + w->spectrum->length),
              std::vector<double>(256, 0.0));
    EXPECT_EQ(w->history->length, 256);
    EXPECT_EQ(w->history->width, 1);
    EXPECT_EQ(std::vector<double>(w->history->data, w->history->data + 256), std::vector<double>(256, 0.0));
    EXPECT_FALSE(w->isRunning());

    // init_variables puts fresh tables in place and clears the level and history slot.
    sp<WaveTable_Double> old = w->spectrum;
    w->historyIndex = 3;
    stdoutOf([&] { w->setDetectionLevel(12); });
    w->init_variables();
    EXPECT_NE(w->spectrum.get(), old.get());
    EXPECT_EQ(w->historyIndex, 0);
    EXPECT_EQ(w->getDetectionLevel(), 0);
}

TEST_F(AnalysisThreadTest, TurnsFollowTheirOwnSlotCounter) {
    // Slot k holds a tone on bin 20 + 10k; the record claims slot 3 throughout.
    publishTones([](int k) { return 20 + 10 * k; }, 0.5, 512, 3);
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
    publishTones([](int k) { return 20 + 10 * k; }, 0.5, 700, 3);
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
    for (bool ready = false; !ready; std::this_thread::yield()) {
        pthread_mutex_lock(&AudioBufferLock);
        ready = waiting;
        pthread_mutex_unlock(&AudioBufferLock);
    }
    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(WaveformCanvasTestAccess::turn(*w));
    waiter.join();
    EXPECT_EQ(waitResult, 0);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
}

TEST_F(AnalysisThreadTest, DetectionLevelAndRelease) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    EXPECT_EQ(stdoutOf([&] { w->setDetectionLevel(-5); }), "[WAVEFORM_CANVAS] detection Level is -5\n");
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
    std::vector<std::string> lines;  // priority, tag, message
    for (const auto& l : kt::logLines()) lines.push_back(std::to_string(l.prio) + " " + l.tag + " " + l.msg);
    EXPECT_EQ(lines, (std::vector<std::string>{"6 TQX [WAVEFORM_CANVAS] detection Level is -5",
                                               "3 TQX [WAVEFORM_CANVAS] WaveformCanvas Relese"}));
}

TEST_F(AnalysisThreadTest, RunningThreadAnalysesThePublishedTone) {
    publishTones([](int) { return 47; }, 0.3, 512);
    sp<WaveformCanvas> w = new WaveformCanvas();
    sp<WaveTable_Double> table = w->spectrum;
    ASSERT_EQ(w->run("WaveformCanvas", 0, 0), android::OK);
    std::vector<float> out(256, 0.0f);
    int strongest = -1;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (strongest != 47 && std::chrono::steady_clock::now() < deadline) {
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
        std::fill(out.begin(), out.end(), 0.0f);
        if (w->getSpectrumData(out.data()) > 0)
            strongest = static_cast<int>(std::max_element(out.begin() + 1, out.end()) - out.begin());
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

    // Dropping a running thread: the destructor ends the loop before the tables go.
    sp<WaveformCanvas> dropped = new WaveformCanvas();
    ASSERT_EQ(dropped->run("WaveformCanvas", 0, 0), android::OK);
    dropped->getSpectrumData(out.data());
    dropped.clear();
}
