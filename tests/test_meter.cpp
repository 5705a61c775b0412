// The meter object: construction, accessors, and its ownership of the analysis
// thread and of the tone generator.
#include <cstdio>
#include <string>
#include <vector>

#include <log/log.h>

#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "interface/SoundMeter_vir.h"
#include "meter/SoundMeter.h"
#include "support/MeterTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace test = korvo::platform::test;
using korvo::testing::logHas;
using korvo::testing::logIndex;
using korvo::testing::logOf;
using korvo::testing::PlatformTest;

class MeterTest : public PlatformTest {};

TEST_F(MeterTest, ConstructionSetsFieldsAndLogsInOrder) {
    test::setMinFrameCount(1024);
    ::testing::internal::CaptureStdout();
    SoundMeter* meter = new SoundMeter();
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "Created");

    EXPECT_EQ(meter->getRole(), 0);
    EXPECT_EQ(meter->getCount(), 0);
    EXPECT_EQ(meter->getRecordState(), 0);
    EXPECT_EQ(meter->sleep, 11);
    EXPECT_EQ(meter->need_ack, 0);
    EXPECT_EQ(meter->last_said, -1);
    EXPECT_EQ(meter->last_heard, -1);
    EXPECT_EQ(meter->listener_state, 0);
    EXPECT_EQ(meter->speaker_state, 0);
    EXPECT_EQ(meter->sampleRate, 44100);
    EXPECT_EQ(meter->frameSamples, 512);
    EXPECT_EQ(meter->bufferSize, 4096);        // 2 × (1 channel × 2 bytes × 1024 frames)
    EXPECT_EQ(meter->recordFrameCount, 2048);  // the minimum buffer in bytes, used as frames
    EXPECT_EQ(meter->prepareCountdown, 200);
    EXPECT_EQ(meter->ringIndex.load(), 0);
    EXPECT_EQ(meter->frameFill.load(), 0);
    EXPECT_EQ(meter->toneGenerator, nullptr);
    EXPECT_EQ(meter->audioRecord, nullptr);

    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{
                                "D/[SoundMeter] SoundMeter start!",
                                "D/[SoundMeter] audio_is_input_channel succeeded",
                                "V/[SoundMeter] android_media_AudioRecord_get_min_buff_size(44100, 1, 2)",
                                "V/[SoundMeter] FrameCount[1024] x nbChannels[1] x bytesPerSample[2]",
                                "D/[SoundMeter] bufferSize=4096",
                                "D/[SoundMeter] nbChannels=0x1, bytesPerSample=0x2",
                                "D/[SoundMeter] AudioRecord Set succeeded. sleep set to 11",
                                "D/[SoundMeter] AudioRecord Set succeeded. sleep set to 11"}));

    test::clearLog();
    ::testing::internal::CaptureStdout();
    soundMeter_destroy(meter);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "deleted");
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] end_wf_thread"});
}

TEST_F(MeterTest, AccessorsStoreWhatTheyAreGiven) {
    SoundMeter meter;
    meter.setRole(7);
    EXPECT_EQ(meter.getRole(), 7);
    EXPECT_EQ(meter.role, 7);
    meter.setNeedAck(true);
    EXPECT_EQ(meter.need_ack, 1);
    meter.setNeedAck(false);
    EXPECT_EQ(meter.need_ack, 0);
    EXPECT_EQ(meter.SayString(const_cast<char*>("anything")), 0);
}

TEST_F(MeterTest, FailedMinimumBufferStillLetsTheStreamStart) {
    test::failMinFrameCount(android::NO_INIT);
    test::scriptMic(true);
    SoundMeter meter;
    EXPECT_EQ(meter.bufferSize, -2);
    EXPECT_EQ(meter.recordFrameCount, -1);
    EXPECT_TRUE(logHas("TQX", ANDROID_LOG_DEBUG, "[SoundMeter] bufferSize=-2"));
    test::failMinFrameCount(0);
    // The stream gets frame count 0 (its own minimum) instead of a negative one.
    meter.startRecord();
    EXPECT_EQ(meter.getRecordState(), 1);
    EXPECT_GT(meter.audioRecord->frameCount(), 0u);
    EXPECT_LT(meter.audioRecord->frameCount(), 1000000u);
    meter.stopRecord();
}

TEST(MeterFactory, DestroyOfNullDoesNothing) {
    ::testing::internal::CaptureStdout();
    soundMeter_destroy(nullptr);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "");
}

TEST(MeterFactory, MakerReturnsAWorkingMeterThroughTheInterface) {
    ::testing::internal::CaptureStdout();
    SoundMeter_vir* meter = soundMeter_maker();
    ASSERT_NE(meter, nullptr);
    meter->setRole(2);
    EXPECT_EQ(meter->getRole(), 2);
    soundMeter_destroy(meter);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "Createddeleted");
}

class AnalysisOwnershipTest : public PlatformTest {
protected:
    void SetUp() override {
        PlatformTest::SetUp();
        // The shared record's first use logs a line; have it happen before the thread's first turn.
        Mmic_data_t record;
        int unused = 0;
        read_write_audio(&unused, 0, &record);
    }
};

TEST_F(AnalysisOwnershipTest, OneThreadPerProcessStartedAndEnded) {
    SoundMeter first;
    SoundMeter second;
    EXPECT_FALSE(first.getStateWFthread());
    // Without a thread the forwarders answer like a fresh thread and touch nothing.
    float out[256];
    for (float& v : out) v = 3.0f;
    EXPECT_EQ(first.getSpectrumData(out), 0);
    EXPECT_EQ(first.getSpectrumData_zorv(out), 0);
    EXPECT_EQ(out[100], 3.0f);
    EXPECT_EQ(first.getDetectionLevel(), 0);
    first.setDetectionLevel(9);
    first.setActive(true);

    test::clearLog();
    first.start_wf_thread();
    android::WaveformCanvas* thread = WF_Thread.get();
    ASSERT_NE(thread, nullptr);
    second.start_wf_thread();
    EXPECT_EQ(WF_Thread.get(), thread);
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{"D/[SoundMeter] start_wf_thread",
                                                      "D/[SoundMeter] start_wf_thread"}));
    EXPECT_TRUE(second.getStateWFthread());

    second.setDetectionLevel(-5);
    EXPECT_EQ(first.getDetectionLevel(), -5);

    test::clearLog();
    first.end_wf_thread();
    EXPECT_FALSE(second.getStateWFthread());
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{"D/[SoundMeter] WF_Thread threadLoop finished",
                                                      "D/[WAVEFORM_CANVAS] WaveformCanvas Relese",
                                                      "D/[SoundMeter] end_wf_thread"}));
    test::clearLog();
    first.end_wf_thread();
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] end_wf_thread"});
}

TEST_F(AnalysisOwnershipTest, DestroyingAnyMeterEndsTheThreadBeforeDeleted) {
    SoundMeter keeper;
    SoundMeter* meter = new SoundMeter();
    meter->start_wf_thread();
    test::clearLog();
    ::testing::internal::CaptureStdout();
    soundMeter_destroy(meter);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "deleted");
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{"D/[SoundMeter] WF_Thread threadLoop finished",
                                                      "D/[WAVEFORM_CANVAS] WaveformCanvas Relese",
                                                      "D/[SoundMeter] end_wf_thread"}));
    EXPECT_FALSE(keeper.getStateWFthread());
}

class ToneOwnershipTest : public PlatformTest {};

TEST_F(ToneOwnershipTest, MakeAndReleaseWithTheirLogLines) {
    SoundMeter meter;
    test::clearLog();
    meter.releaseToneGenerator();
    meter.releaseToneGenerator();
    EXPECT_EQ(logOf("TQX"), (std::vector<std::string>{"D/[SoundMeter] releaseToneGenerator",
                                                      "D/[SoundMeter] releaseToneGenerator"}));
    EXPECT_EQ(meter.toneGenerator, nullptr);

    test::clearLog();
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    ASSERT_NE(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.toneGenerator->getMaxToneIndex(), 39);
    const int make = logIndex("TQX", "[SoundMeter] makeToneGenerator");
    const int ctor = logIndex("MiniToneGenerator", "MiniToneGenerator constructor: streamType=3, volume=0.800000");
    ASSERT_GE(make, 0);
    EXPECT_GT(ctor, make);

    // A second make releases the first generator instead of losing it.
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    ASSERT_NE(meter.toneGenerator, nullptr);

    test::clearLog();
    meter.releaseToneGenerator();
    EXPECT_EQ(meter.toneGenerator, nullptr);
    const int release = logIndex("TQX", "[SoundMeter] releaseToneGenerator");
    const int dtor = logIndex("MiniToneGenerator", "MiniToneGenerator destructor");
    ASSERT_GE(release, 0);
    EXPECT_GT(dtor, release);
}
