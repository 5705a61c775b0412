// The meter object's life, the shared frame record, the capture stream and the capture
// step, through the scripted microphone.
#include <atomic>
#include <cmath>
#include <cstring>
#include <thread>

#include <korvo/platform/Routes.h>

#include "analysis/WaveformCanvas.h"
#include "capture/CaptureLoop.h"
#include "capture/CaptureStream.h"
#include "capture/FrameExchange.h"
#include "meter/SoundMeter.h"
#include "support/LibraryTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace {

using namespace korvo::testing;

Mmic_data_t readShared(int direction = 0) {
    Mmic_data_t r;
    std::memset(&r, 0x5A, sizeof r);
    EXPECT_EQ(read_write_audio(nullptr, direction, &r), 1);
    return r;
}

class Capture : public LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        test::scriptMic(true);
        korvo::resetSharedRecordForTests();
    }
};

TEST_F(Capture, MeterLifeAndItsLogLines) {
    test::setMinFrameCount(1024);
    SoundMeter* meter = nullptr;
    EXPECT_EQ(stdoutOf([&] { meter = static_cast<SoundMeter*>(soundMeter_maker()); }), "Created");
    EXPECT_EQ(meter->sleep, 11);
    EXPECT_EQ(meter->bufferSize, 4096);        // 2 x (1 channel x 2 bytes x 1024 frames)
    EXPECT_EQ(meter->recordFrameCount, 2048);  // the minimum buffer in bytes, used as frames
    EXPECT_EQ(logOf("TQX"), (Strings{"D/[SoundMeter] SoundMeter start!", "D/[SoundMeter] audio_is_input_channel succeeded",
                                     "V/[SoundMeter] android_media_AudioRecord_get_min_buff_size(44100, 1, 2)",
                                     "V/[SoundMeter] FrameCount[1024] x nbChannels[1] x bytesPerSample[2]",
                                     "D/[SoundMeter] bufferSize=4096", "D/[SoundMeter] nbChannels=0x1, bytesPerSample=0x2",
                                     "D/[SoundMeter] AudioRecord Set succeeded. sleep set to 11",
                                     "D/[SoundMeter] AudioRecord Set succeeded. sleep set to 11"}));

    // One analysis thread per process; any meter's destruction ends it before "deleted".
    SoundMeter other;
    readShared();  // the record's first use and its line, before the thread's first turn
    meter->start_wf_thread();
    android::WaveformCanvas* thread = WF_Thread.get();
    ASSERT_NE(thread, nullptr);
    test::clearLog();
    other.start_wf_thread();
    EXPECT_EQ(WF_Thread.get(), thread);
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] start_wf_thread"});
    other.setDetectionLevel(-5);
    EXPECT_EQ(meter->getDetectionLevel(), -5);
    test::clearLog();
    EXPECT_EQ(stdoutOf([&] { soundMeter_destroy(meter); }), "deleted");
    EXPECT_EQ(logOf("TQX"), (Strings{"D/[SoundMeter] WF_Thread threadLoop finished", "D/[WAVEFORM_CANVAS] WaveformCanvas Relese",
                                     "D/[SoundMeter] end_wf_thread"}));
    EXPECT_FALSE(other.getStateWFthread());
    test::clearLog();
    other.end_wf_thread();
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] end_wf_thread"});

    // Without a thread the forwarders answer like a fresh thread and touch nothing.
    float out[256];
    std::fill(out, out + 256, 3.0f);
    EXPECT_EQ(other.getSpectrumData(out) + other.getSpectrumData_zorv(out) + other.getDetectionLevel(), 0);
    EXPECT_EQ(out[100], 3.0f);
}

TEST_F(Capture, ToneGeneratorOwnership) {
    SoundMeter meter;
    test::clearLog();
    meter.releaseToneGenerator();
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] releaseToneGenerator"});
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    ASSERT_NE(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.toneGenerator->getMaxToneIndex(), 39);
    // A second make releases the first generator (its destructor runs) before the new one.
    test::clearLog();
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    Strings lines;
    for (const auto& l : test::logLines())
        if (l.msg == "[SoundMeter] makeToneGenerator" || l.msg == "MiniToneGenerator destructor" ||
            l.msg.rfind("MiniToneGenerator constructor", 0) == 0)
            lines.push_back(l.msg);
    EXPECT_EQ(lines, (Strings{"[SoundMeter] makeToneGenerator", "MiniToneGenerator destructor",
                              "MiniToneGenerator constructor: streamType=3, volume=0.800000"}));
    meter.releaseToneGenerator();  // its lines: the C host's check
    EXPECT_EQ(meter.toneGenerator, nullptr);
}

TEST_F(Capture, MinimumBufferSize) {
    test::setMinFrameCount(1000);
    const int sizes[][4] = {{44100, 16, 2, 2000}, {44100, 12, 2, 4000}, {44100, 0x3F0000, 2, 12000},
                            {8000, 16, 101, 61000}, {8000, 16, 104, 1000}, {44100, 4, 2, -1}, {44100, 16, 3, -1}};
    for (const auto& s : sizes) EXPECT_EQ(AudioRecord_getMinBufferSize(s[0], s[1], s[2]), s[3]) << s[1] << "/" << s[2];
    EXPECT_EQ(logOf("TQX", "Invalid"), (Strings{"D/[SoundMeter] getMinBufferSize(): Invalid channel configuration.",
                                                "D/[SoundMeter] getMinBufferSize(): Invalid audio format."}));
    test::setMinFrameCount(0);
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 2), -1);  // a size of 0 is refused
    test::failMinFrameCount(android::NO_INIT);
    test::clearLog();
    EXPECT_EQ(AudioRecord_getMinBufferSize(44100, 16, 2), -1);
    EXPECT_EQ(logOf("TQX").size(), 1u);  // only the verbose query line
    recorderCallback(3, nullptr, nullptr);
    EXPECT_EQ(logOf("TQX").back(), "D/[SoundMeter] recorderCallback event[3]");

    // Decided: a meter without a minimum size hands the stream 0 (its own minimum).
    SoundMeter meter;
    EXPECT_EQ(meter.recordFrameCount, -1);
    test::failMinFrameCount(0);
    test::setMinFrameCount(1000);
    meter.startRecord();
    EXPECT_EQ(meter.getRecordState(), 1);
    EXPECT_GT(meter.audioRecord->frameCount(), 0u);
    EXPECT_LT(meter.audioRecord->frameCount(), 1000000u);
}

TEST_F(Capture, SharedRecordAndLevels) {
    const Mmic_data_t fresh = readShared();
    EXPECT_TRUE(fresh.index == 0);
    EXPECT_TRUE(fresh.level == 0.0f);
    EXPECT_TRUE(fresh.count == 0);
    EXPECT_TRUE(fresh.reserved == 0);
    for (int16_t s : fresh.data) ASSERT_EQ(s, 0);
    readShared();
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] Initialize MDATA"});
    Mmic_data_t written = fresh;
    written.index = 3, written.level = -12.5f, written.count = 212, written.reserved = 77;
    for (int i = 0; i < 2560; ++i) written.data[i] = static_cast<int16_t>(i - 1280);
    EXPECT_EQ(read_write_audio(nullptr, 1, &written), 1);
    for (int direction : {0, 2, -1}) {
        const Mmic_data_t r = readShared(direction);
        EXPECT_EQ(std::memcmp(&r, &written, sizeof r), 0) << direction;
    }
    int value = 99;
    EXPECT_EQ(read_write_audio_int(0, &value), 1);
    EXPECT_EQ(value, 0);
    value = -4242;
    read_write_audio_int(1, &value);
    value = 0;
    read_write_audio_int(5, &value);
    EXPECT_EQ(value, -4242);

    std::vector<short> square(512);
    for (int i = 0; i < 512; ++i) square[i] = i % 2 ? 32767 : -32767;
    EXPECT_NEAR(readDone(square.data(), 512), 0.6, 0.001);
    std::vector<short> constant(512, 1234);
    EXPECT_EQ(readDone(constant.data(), 512), -INFINITY);
    // A sine of amplitude A: variance A^2/2, so 20 log10(A / 32768) - 3.01 + 0.6.
    const std::vector<short> wave = binTone(8, 0.25);
    EXPECT_NEAR(readDone(const_cast<short*>(wave.data()), 512), 20 * std::log10(0.25) - 3.0103 + 0.6, 0.01);
    EXPECT_FALSE(std::isfinite(readDone(square.data(), 0)));
}

TEST_F(Capture, StreamStartAndStop) {
    SoundMeter meter;
    meter.stopRecord();  // decided: before startRecord, nothing happens
    meter.stopAudio();
    test::clearLog();
    const auto t0 = std::chrono::steady_clock::now();
    meter.startRecord();
    EXPECT_GE(std::chrono::steady_clock::now() - t0, std::chrono::milliseconds(200));
    EXPECT_EQ(logOf("TQX"), (Strings{"D/[SoundMeter] AudioRecord preparation 200", "D/[SoundMeter] AudioRecord preparation 150",
                                     "D/[SoundMeter] AudioRecord preparation 100", "D/[SoundMeter] AudioRecord preparation 50",
                                     "D/[SoundMeter] AudioRecord Started"}));
    EXPECT_EQ(meter.audioRecord->frameCount(), static_cast<size_t>(meter.recordFrameCount));
    test::clearLog();
    meter.stopRecord();
    EXPECT_EQ(meter.getRecordState(), 0);
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] AudioRecord Stopped"});
    // Stopped: a step reads, locks and logs nothing.
    test::clearLog();
    meter.processAudio();
    EXPECT_TRUE(logOf("TQX").empty());
    EXPECT_EQ(test::lastMicReadRequest(), 0u);
}

TEST_F(Capture, WholeAndPartialFrames) {
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
        EXPECT_EQ(std::memcmp(&r.data[step * 512], &pushed[step * 512u], 1024), 0);
        EXPECT_FLOAT_EQ(r.level, static_cast<float>(readDone(&pushed[step * 512u], 512)));
    }
    EXPECT_EQ(meter.ringIndex.load(), 0);
    EXPECT_EQ(std::memcmp(meter.pcmRing, pushed.data(), sizeof meter.pcmRing), 0);

    // 300 of 512 samples: logged, kept in the slot, nothing published; the rest completes it.
    test::pushMicSamples(pushed.data(), 512);
    test::pushMicResult(600);
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] ================== end 300"});
    EXPECT_EQ(meter.frameFill.load(), 300);
    EXPECT_EQ(readShared().index, 4);
    meter.processAudio();
    EXPECT_EQ(test::lastMicReadRequest(), 424u);
    const Mmic_data_t r = readShared();
    EXPECT_EQ(r.index, 0);
    EXPECT_EQ(r.count, 212);
    EXPECT_EQ(std::memcmp(r.data, pushed.data(), 1024), 0);
    EXPECT_FLOAT_EQ(r.level, static_cast<float>(readDone(&pushed[300], 212)));
    EXPECT_EQ(meter.frameFill.load(), 0);
    EXPECT_EQ(meter.ringIndex.load(), 1);

    // Failed reads store nothing and keep the position; -1 is not logged as a failure.
    test::pushMicResult(-10);
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), (Strings{"D/[SoundMeter] Audio read failed rror = -5", "D/[SoundMeter] ================== end 0"}));
    test::pushMicSamples(pushed.data(), 100);
    test::pushMicResult(200);
    meter.processAudio();
    test::pushMicResult(-1);
    test::clearLog();
    meter.processAudio();
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] ================== end 100"});
    EXPECT_EQ(meter.frameFill.load(), 100);
    EXPECT_EQ(meter.ringIndex.load(), 1);
}

TEST_F(Capture, StopDuringABlockedReadGivesTheStepUp) {
    SoundMeter meter;
    meter.startRecord();
    // The stream is stopped only once the recording state and the ring position are cleared.
    int stateAtStop = -1, fillAtStop = -1;
    test::onMicStop([&] { stateAtStop = meter.getRecordState(), fillAtStop = meter.frameFill.load(); });
    meter.frameFill.store(100);
    // A read that waits for 412 samples while 300 are there: the stop releases it with them.
    test::pushMicSamples(std::vector<int16_t>(300, 9).data(), 300);
    std::atomic<bool> returned{false};
    std::thread capture([&] { meter.processAudio(), returned = true; });
    ASSERT_TRUE(waitFor([] { return test::micReadersWaiting() == 1; }));
    EXPECT_FALSE(returned.load());
    test::clearLog();
    meter.stopRecord();
    capture.join();
    EXPECT_EQ(stateAtStop, 0);
    EXPECT_EQ(fillAtStop, 0);
    EXPECT_EQ(test::micSamplesQueued(), 0u);  // the stopped read delivered its samples
    EXPECT_EQ(logOf("TQX"), Strings{"D/[SoundMeter] AudioRecord Stopped"});
    EXPECT_EQ(meter.frameFill.load(), 0);
    EXPECT_EQ(meter.ringIndex.load(), 0);
    EXPECT_EQ(readShared().count, 0);  // nothing published
    EXPECT_EQ(pthread_mutex_trylock(&AudioBufferLock), 0);
    pthread_mutex_unlock(&AudioBufferLock);
}

TEST_F(Capture, HearingOnAnUnusableRouteIsPacedLikeAMicrophone) {
    test::scriptMic(false);
    setenv("KORVO_MIC", "wav:/nonexistent/x.wav", 1);
    SoundMeter meter;
    meter.setRole(1);
    meter.startRecord();
    unsetenv("KORVO_MIC");
    const korvo::platform::RouteStatus status = korvo::platform::microphoneStatus();
    EXPECT_TRUE(status.failed) << status.reason;
    EXPECT_TRUE(status.reason.rfind("wav:/nonexistent/x.wav: cannot", 0) == 0) << status.reason;
    timespec cpu0, cpu1;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &cpu0);
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(1);
    int steps = 0;
    for (; std::chrono::steady_clock::now() < end; ++steps) meter.HearFreqIdx(3);
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &cpu1);
    // A read that cannot deliver takes a frame's time (11.6 ms): about 86 steps a second.
    EXPECT_LE(steps, 100);
    EXPECT_EQ(logOf("TQX", "Audio read failed").size(), size_t(steps));
    EXPECT_LT((cpu1.tv_sec - cpu0.tv_sec) * 1e3 + (cpu1.tv_nsec - cpu0.tv_nsec) / 1e6, 50.0);  // under 5 % of a core
    meter.stopRecord();
}

TEST_F(Capture, PublishedFrameWaitsForTheAnalysisThread) {
    // With a long frame period the wait's deadline lies seconds ahead: the step ends
    // when the analysis side signals, not before.
    SoundMeter meter;
    meter.sleep = 20000000;  // 1000 x sleep ns = 20 s
    meter.startRecord();
    pushFrames(1000, 0.5, 1);
    std::atomic<bool> returned{false};
    std::thread capture([&] { meter.processAudio(), returned = true; });
    ASSERT_TRUE(waitFor([] { return readShared().count == 512; }));
    EXPECT_FALSE(waitFor([&] { return returned.load(); }, 300));
    pthread_mutex_lock(&AudioBufferLock);  // free while the step waits
    pthread_cond_signal(&WaitAudioBuffer);
    pthread_mutex_unlock(&AudioBufferLock);
    EXPECT_TRUE(waitFor([&] { return returned.load(); }, 10000));
    capture.join();
    EXPECT_EQ(meter.ringIndex.load(), 1);

    EXPECT_EQ(korvo::captureWaitNs(11, 1000), 10000);
    EXPECT_EQ(korvo::captureWaitNs(11, 6000), 5000);
    const timespec d = korvo::captureDeadline({7, 999999999}, 2500000001LL);
    EXPECT_TRUE(d.tv_sec == 10) << d.tv_sec << "." << d.tv_nsec;
    EXPECT_TRUE(d.tv_nsec == 500000000) << d.tv_sec << "." << d.tv_nsec;
    const timespec e = korvo::captureDeadline({100, 999998000}, 5000);
    EXPECT_TRUE(e.tv_sec == 101) << e.tv_sec << "." << e.tv_nsec;
    EXPECT_TRUE(e.tv_nsec == 3000) << e.tv_sec << "." << e.tv_nsec;
}

}  // namespace
