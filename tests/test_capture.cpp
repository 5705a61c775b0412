// The capture stream and the capture loop, through the scripted microphone.
#include <atomic>
#include <chrono>
#include <cmath>
#include <cstring>
#include <thread>
#include <vector>

#include <log/log.h>

#include "capture/CaptureLoop.h"
#include "capture/CaptureStream.h"
#include "capture/FrameExchange.h"
#include "meter/SoundMeter.h"
#include "support/MeterTestSupport.h"

namespace test = korvo::platform::test;
using korvo::testing::logHas;
using korvo::testing::logIndex;
using korvo::testing::logOf;
using korvo::testing::PlatformTest;
using korvo::testing::waitFor;

namespace {
Mmic_data_t readShared() {
    Mmic_data_t r;
    int unused = 0;
    read_write_audio(&unused, 0, &r);
    return r;
}
}  // namespace

class MinBufferSizeTest : public PlatformTest {};

TEST_F(MinBufferSizeTest, ChannelsFormatsAndSizes) {
    test::setMinFrameCount(1000);
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 2), 2000);
    EXPECT_TRUE(logHas("TQX", ANDROID_LOG_VERBOSE, "[SoundMeter] android_media_AudioRecord_get_min_buff_size(44100, 1, 2)"));
    EXPECT_TRUE(logHas("TQX", ANDROID_LOG_VERBOSE, "[SoundMeter] FrameCount[1000] x nbChannels[1] x bytesPerSample[2]"));
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 12, 2), 4000);     // stereo
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 0x3F0000, 2), 12000);  // six channels
    EXPECT_EQ(AudioRecord_getMinBufferSize(8000, 16, 101), 61000);   // 61 bytes per sample
    EXPECT_EQ(AudioRecord_getMinBufferSize(8000, 16, 104), 1000);

    test::clearLog();
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 4, 2), -1);
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] getMinBufferSize(): Invalid channel configuration."});
    test::clearLog();
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 3), -1);
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] getMinBufferSize(): Invalid audio format."});

    test::clearLog();
    test::failMinFrameCount(android::NO_INIT);
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 2), -1);
    EXPECT_EQ(logOf("TQX").size(), 1u);  // only the verbose query line

    test::failMinFrameCount(0);
    test::setMinFrameCount(0);
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 2), -1);  // a size of 0 is refused
}

TEST_F(MinBufferSizeTest, RecorderCallbackOnlyLogs) {
    recorderCallback(3, nullptr, nullptr);
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] recorderCallback event[3]"});
}

class CaptureTest : public PlatformTest {
protected:
    void SetUp() override {
        PlatformTest::SetUp();
        test::scriptMic(true);
        korvo::resetSharedRecordForTests();
    }
};

TEST_F(CaptureTest, StartStopAndRecordingState) {
    SoundMeter meter;
    // Nothing to stop before startRecord: nothing happens, nothing is logged.
    test::clearLog();
    meter.stopRecord();
    meter.stopAudio();
    EXPECT_TRUE(logOf("TQX").empty());

    const auto t0 = std::chrono::steady_clock::now();
    meter.startRecord();
    EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(200));
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{
                                "D/[SoundMeter] AudioRecord preparation 200",
                                "D/[SoundMeter] AudioRecord preparation 150",
                                "D/[SoundMeter] AudioRecord preparation 100",
                                "D/[SoundMeter] AudioRecord preparation 50",
                                "D/[SoundMeter] AudioRecord Started"}));
    EXPECT_EQ(meter.getRecordState(), 1);
    EXPECT_EQ(meter.audioRecord->frameCount(), static_cast<size_t>(meter.recordFrameCount));

    meter.stopAudio();
    EXPECT_EQ(meter.getRecordState(), 1);
    meter.stopRecord();
    EXPECT_EQ(meter.getRecordState(), 0);
    EXPECT_TRUE(logHas("TQX", ANDROID_LOG_DEBUG, "[SoundMeter] AudioRecord Stopped"));

    // After stopRecord a step does nothing: no read, no lock, no log.
    test::clearLog();
    meter.processAudio();
    EXPECT_TRUE(logOf("TQX").empty());
    EXPECT_EQ(test::lastMicReadRequest(), 0u);
}

TEST_F(CaptureTest, FiveWholeFramesPublishSlotsZeroToFour) {
    SoundMeter meter;
    meter.startRecord();
    std::vector<int16_t> pushed(5 * 512);
    for (size_t i = 0; i < pushed.size(); ++i) pushed[i] = static_cast<int16_t>(i * 7 - 9000);
    test::pushMicSamples(pushed.data(), pushed.size());
    for (int step = 0; step < 5; ++step) {
        meter.processAudio();
        EXPECT_EQ(test::lastMicReadRequest(), 1024u);
        const Mmic_data_t r = readShared();
        EXPECT_EQ(r.index, step);
        EXPECT_EQ(r.count, 512);
        EXPECT_EQ(memcmp(&r.data[step * 512], &pushed[static_cast<size_t>(step) * 512], 1024), 0);
        EXPECT_FLOAT_EQ(r.level, static_cast<float>(readDone(&pushed[static_cast<size_t>(step) * 512], 512)));
    }
    EXPECT_EQ(meter.ringIndex.load(), 0);
    EXPECT_EQ(meter.frameFill.load(), 0);
    EXPECT_EQ(memcmp(meter.pcmRing, pushed.data(), sizeof meter.pcmRing), 0);
}

TEST_F(CaptureTest, LevelsOfConstantAndFullScaleFrames) {
    SoundMeter meter;
    meter.startRecord();
    std::vector<int16_t> constant(512, 300);
    test::pushMicSamples(constant.data(), constant.size());
    meter.processAudio();
    EXPECT_TRUE(std::isinf(readShared().level));
    std::vector<int16_t> square(512);
    for (int i = 0; i < 512; ++i) square[i] = i % 2 ? 32767 : -32767;
    test::pushMicSamples(square.data(), square.size());
    meter.processAudio();
    EXPECT_NEAR(readShared().level, 0.6f, 0.001f);
}

TEST_F(CaptureTest, PartialReadsCompleteTheSameSlot) {
    SoundMeter meter;
    meter.startRecord();
    std::vector<int16_t> samples(512);
    for (int i = 0; i < 512; ++i) samples[i] = static_cast<int16_t>(i + 1);
    test::pushMicSamples(samples.data(), samples.size());
    test::pushMicResult(600);  // 300 samples
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] ================== end 300"});
    EXPECT_EQ(meter.frameFill.load(), 300);
    EXPECT_EQ(meter.ringIndex.load(), 0);
    EXPECT_EQ(readShared().count, 0);  // nothing published (the record is still the fresh one)

    meter.processAudio();
    EXPECT_EQ(test::lastMicReadRequest(), 424u);
    const Mmic_data_t r = readShared();
    EXPECT_EQ(r.index, 0);
    EXPECT_EQ(r.count, 212);
    EXPECT_EQ(memcmp(r.data, samples.data(), 1024), 0);
    EXPECT_FLOAT_EQ(r.level, static_cast<float>(readDone(&samples[300], 212)));
    EXPECT_EQ(meter.frameFill.load(), 0);
    EXPECT_EQ(meter.ringIndex.load(), 1);
}

TEST_F(CaptureTest, FailedReadsStoreNothing) {
    SoundMeter meter;
    meter.startRecord();
    test::pushMicResult(-10);
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{"D/[SoundMeter] Audio read failed rror = -5",
                                                      "D/[SoundMeter] ================== end 0"}));
    EXPECT_EQ(meter.frameFill.load(), 0);
    EXPECT_EQ(meter.ringIndex.load(), 0);

    // A failure in the middle of a frame keeps what was already stored.
    test::pushMicSamples(std::vector<int16_t>(100, 5).data(), 100);
    test::pushMicResult(200);
    meter.processAudio();
    test::pushMicResult(-1);  // -1 is not logged as a failure
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] ================== end 100"});
    EXPECT_EQ(meter.frameFill.load(), 100);
}

TEST_F(CaptureTest, StopRecordFromAnotherThreadEndsABlockedStep) {
    SoundMeter meter;
    meter.startRecord();
    std::atomic<bool> returned{false};
    std::thread capture([&] {
        meter.processAudio();
        returned = true;
    });
    ASSERT_TRUE(waitFor([] { return test::micReadersWaiting() == 1; }, std::chrono::seconds(5)));
    EXPECT_FALSE(returned.load());
    meter.stopRecord();
    capture.join();
    EXPECT_TRUE(returned.load());
    EXPECT_EQ(readShared().count, 0);  // nothing published
    EXPECT_EQ(meter.getRecordState(), 0);
    // The lock was given back: the analysis side can take it.
    EXPECT_EQ(pthread_mutex_trylock(&AudioBufferLock), 0);
    pthread_mutex_unlock(&AudioBufferLock);
}

TEST(CaptureDeadline, WaitIsAtLeastFiveMicrosecondsAndCarriesSeconds) {
    EXPECT_EQ(korvo::captureWaitNs(11, 1000), 10000);
    EXPECT_EQ(korvo::captureWaitNs(11, 6000), 5000);
    EXPECT_EQ(korvo::captureWaitNs(11, 5000000), 5000);
    struct timespec now = {100, 999998000};
    struct timespec d = korvo::captureDeadline(now, 5000);
    EXPECT_EQ(d.tv_sec, 101);
    EXPECT_EQ(d.tv_nsec, 3000);
    now = {7, 999999999};
    d = korvo::captureDeadline(now, 2500000001LL);
    EXPECT_EQ(d.tv_sec, 10);
    EXPECT_EQ(d.tv_nsec, 500000000);
    for (long ns = 0; ns < 1000000000; ns += 99999989) {
        d = korvo::captureDeadline({1, ns}, 999999999);
        EXPECT_LT(d.tv_nsec, 1000000000);
        EXPECT_GE(d.tv_nsec, 0);
    }
}
