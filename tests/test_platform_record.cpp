// The capture stream: configuration, the scripted microphone, stop against a blocked read,
// the null route's real-time pace and a WAV file heard through the stream.
#include <future>

#include <log/log.h>
#include <media/AudioRecord.h>
#include <utils/Timers.h>

#include "support/PlatformTestSupport.h"

using namespace android;
using namespace korvo::platformtest;

namespace {

sp<AudioRecord> makeRecord(size_t frameCount = 0) {
    sp<AudioRecord> r = new AudioRecord(String16());
    r->set(AUDIO_SOURCE_MIC, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO, frameCount, nullptr, nullptr, 0,
           false, AUDIO_SESSION_ALLOCATE, AudioRecord::TRANSFER_SYNC, AUDIO_INPUT_FLAG_NONE, -1, -1, nullptr);
    return r;
}

std::vector<int16_t> ramp(size_t n, int start) {
    std::vector<int16_t> v(n);
    for (size_t i = 0; i < n; ++i) v[i] = static_cast<int16_t>(start + static_cast<int>(i) * 7);
    return v;
}

// A blocking read of 1024 bytes on another thread, once it waits in the script.
std::future<ssize_t> blockedRead(const sp<AudioRecord>& r, std::vector<int16_t>& buf) {
    auto f = std::async(std::launch::async, [r, &buf] { return r->read(buf.data(), 1024, true); });
    EXPECT_TRUE(waitUntil([] { return test::micReadersWaiting() == 1; }));
    return f;
}

using RecordTest = PlatformFixture;

TEST_F(RecordTest, ConfigurationAndBadRoutes) {
    size_t frames = 0;
    EXPECT_EQ(AudioRecord::getMinFrameCount(&frames, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO), OK);
    EXPECT_EQ(frames, 1024u);
    test::setMinFrameCount(300);
    EXPECT_EQ(AudioRecord::getMinFrameCount(&frames, 8000, AUDIO_FORMAT_AMR_WB, 0x8000003Fu), OK);
    EXPECT_EQ(frames, 300u);
    test::failMinFrameCount(-EIO);
    frames = 77;
    EXPECT_EQ(AudioRecord::getMinFrameCount(&frames, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO), -EIO);
    EXPECT_EQ(frames, 77u);
    EXPECT_EQ(AudioRecord::getMinFrameCount(nullptr, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO), BAD_VALUE);
    test::resetAll();

    sp<AudioRecord> unset = new AudioRecord(String16());
    EXPECT_EQ(unset->initCheck(), NO_INIT);
    int16_t buf[8];
    EXPECT_EQ(unset->read(buf, sizeof(buf), true), NO_INIT);
    EXPECT_EQ(unset->start(), NO_INIT);

    sp<AudioRecord> r = makeRecord(0);  // 0: the platform minimum
    EXPECT_EQ(r->initCheck(), OK);
    EXPECT_EQ(r->frameCount(), 1024u);
    EXPECT_EQ(r->frameSize(), 2u);
    EXPECT_EQ(r->getSampleRate(), 44100u);
    EXPECT_TRUE(r->stopped());
    EXPECT_EQ(r->set(AUDIO_SOURCE_MIC, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO), INVALID_OPERATION);
    EXPECT_EQ(makeRecord(2048)->frameCount(), 2048u);

    // Only 16-bit mono is delivered.
    sp<AudioRecord> stereo = new AudioRecord(String16());
    EXPECT_EQ(stereo->set(AUDIO_SOURCE_MIC, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_STEREO), BAD_VALUE);
    EXPECT_EQ(stereo->initCheck(), BAD_VALUE);
    EXPECT_EQ(stereo->frameSize(), 4u);

    // The minimum is looked up when the frame count is 0 and may fail.
    test::failMinFrameCount(-EIO);
    EXPECT_EQ(makeRecord(0)->initCheck(), -EIO);
    test::resetAll();

    // A bad route text makes the stream unusable.
    setenv("KORVO_MIC", "foo", 1);
    test::captureLog(true);
    sp<AudioRecord> bad = new AudioRecord(String16());
    EXPECT_EQ(bad->set(AUDIO_SOURCE_MIC, 44100, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO, 1024), NO_INIT);
    EXPECT_EQ(bad->initCheck(), NO_INIT);
    const auto lines = test::logLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].prio, ANDROID_LOG_ERROR);
    EXPECT_EQ(lines[0].tag, "AudioRecord");
    EXPECT_NE(lines[0].msg.find("unknown audio route 'foo' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])"),
              std::string::npos);
    EXPECT_EQ(bad->start(), NO_INIT);
    test::scriptMic(true);  // even a script does not revive it
    EXPECT_EQ(bad->read(buf, sizeof(buf), true), NO_INIT);

    setenv("KORVO_MIC", "wav:/nonexistent-korvo-dir/none.wav", 1);
    test::clearLog();
    EXPECT_EQ(makeRecord()->initCheck(), NO_INIT);
    ASSERT_EQ(test::logLines().size(), 1u);
    EXPECT_NE(test::logLines()[0].msg.find("cannot open: No such file or directory"), std::string::npos);
}

TEST_F(RecordTest, ScriptedMicrophone) {
    test::scriptMic(true);
    int16_t four[4] = {1, 2, 3, 4};
    test::pushMicSamples(four, 4);
    sp<AudioRecord> r = makeRecord();
    EXPECT_EQ(test::lastMicReadRequest(), 0u);
    // Reads outside a started stream.
    EXPECT_EQ(r->read(four, sizeof(four), true), 0);  // never started
    EXPECT_EQ(r->read(four, sizeof(four), false), INVALID_OPERATION);
    EXPECT_EQ(r->read(nullptr, 8, true), BAD_VALUE);
    ASSERT_EQ(r->start(), OK);
    EXPECT_FALSE(r->stopped());
    alignas(int16_t) char bytes[16];
    EXPECT_EQ(r->read(bytes + 1, 8, true), BAD_VALUE);  // not on a sample boundary
    r->stop();
    EXPECT_TRUE(r->stopped());
    EXPECT_EQ(r->read(four, sizeof(four), true), 0);  // stopped
    EXPECT_EQ(test::micSamplesQueued(), 4u);
    ASSERT_EQ(r->start(), OK);  // a second start resumes
    std::vector<int16_t> buf(512, 0);
    EXPECT_EQ(r->read(buf.data(), 8, true), 8);
    EXPECT_EQ(buf[3], 4);
    EXPECT_EQ(test::lastMicReadRequest(), 8u);

    // Whole frames.
    const auto frame = ramp(512, -1000);
    test::pushMicSamples(frame.data(), frame.size());
    EXPECT_EQ(r->read(buf.data(), 1024, true), 1024);
    EXPECT_EQ(buf, frame);
    EXPECT_EQ(test::lastMicReadRequest(), 1024u);

    // A short count takes only that much; the rest waits for the next read.
    test::pushMicResult(600);
    test::pushMicSamples(frame.data(), frame.size());
    std::fill(buf.begin(), buf.end(), 0);
    EXPECT_EQ(r->read(buf.data(), 1024, true), 600);
    EXPECT_TRUE(std::equal(frame.begin(), frame.begin() + 300, buf.begin()));
    EXPECT_EQ(buf[300], 0);
    EXPECT_EQ(test::micSamplesQueued(), 212u);
    EXPECT_EQ(r->read(buf.data() + 300, 424, true), 424);
    EXPECT_EQ(test::lastMicReadRequest(), 424u);
    EXPECT_EQ(buf, frame);
    EXPECT_EQ(test::micSamplesQueued(), 0u);

    // A result larger than the request delivers the request; an odd one whole samples.
    test::pushMicResult(5000);
    test::pushMicResult(7);
    test::pushMicSamples(frame.data(), 20);
    EXPECT_EQ(r->read(buf.data(), 20, true), 20);
    EXPECT_EQ(r->read(buf.data(), 20, true), 6);
    EXPECT_EQ(test::micSamplesQueued(), 7u);

    // 0 and negative statuses come back as they are and consume nothing.
    for (ssize_t status : {ssize_t(0), ssize_t(-32), ssize_t(NO_INIT)}) test::pushMicResult(status);
    for (ssize_t status : {ssize_t(0), ssize_t(-32), ssize_t(NO_INIT)}) {
        EXPECT_EQ(r->read(buf.data(), 1024, true), status);
    }
    EXPECT_EQ(test::micSamplesQueued(), 7u);
}

TEST_F(RecordTest, BlockedReadWaitsForSamplesAndStop) {
    test::scriptMic(true);
    sp<AudioRecord> r = makeRecord();
    ASSERT_EQ(r->start(), OK);
    const auto frame = ramp(512, 5);
    std::vector<int16_t> buf(512, 0);

    // Blocked until the whole request is queued.
    auto whole = blockedRead(r, buf);
    test::pushMicSamples(frame.data(), 100);
    test::pushMicSamples(frame.data() + 100, 412);
    EXPECT_EQ(whole.get(), 1024);
    EXPECT_EQ(buf, frame);
    EXPECT_EQ(test::micReadersWaiting(), 0);

    // A queued short count waits for its own size only.
    test::pushMicResult(200);
    auto shortRead = blockedRead(r, buf);
    test::pushMicSamples(frame.data(), 100);
    EXPECT_EQ(shortRead.get(), 200);

    // stop() from another thread ends a blocked read with nothing...
    auto stopped = blockedRead(r, buf);
    r->stop();
    EXPECT_EQ(stopped.get(), 0);

    // ... or with what had arrived.
    ASSERT_EQ(r->start(), OK);
    test::pushMicSamples(frame.data(), 30);
    auto partial = blockedRead(r, buf);
    r->stop();
    EXPECT_EQ(partial.get(), 60);

    // Switching the script off (resetAll in a test's SetUp) releases a reader too.
    ASSERT_EQ(r->start(), OK);
    auto released = blockedRead(r, buf);
    test::resetAll();
    EXPECT_EQ(released.get(), 0);
}

TEST_F(RecordTest, NullRouteDeliversSilenceAtRealTimePaceUntilStopped) {
    sp<AudioRecord> r = makeRecord();
    std::vector<int16_t> buf(44100, 123);
    const nsecs_t t0 = systemTime(SYSTEM_TIME_MONOTONIC);
    ASSERT_EQ(r->start(), OK);
    EXPECT_EQ(r->read(buf.data(), 8820, true), 8820);
    EXPECT_GE(systemTime(SYSTEM_TIME_MONOTONIC) - t0, 100000000);  // 4410 samples are 100 ms: never sooner
    for (size_t i = 0; i < 4410; ++i) ASSERT_EQ(buf[i], 0);
    // Small reads add up to the same pace.
    for (int i = 0; i < 10; ++i) ASSERT_EQ(r->read(buf.data(), 882, true), 882);
    EXPECT_GE(systemTime(SYSTEM_TIME_MONOTONIC) - t0, 200000000);

    // stop() races one-second reads.
    r->stop();
    for (int round = 0; round < 20; ++round) {
        ASSERT_EQ(r->start(), OK);
        std::atomic<bool> reading{false};
        std::fill(buf.begin(), buf.end(), 1);
        auto reader = std::async(std::launch::async, [&] {
            reading = true;
            return r->read(buf.data(), buf.size() * 2, true);
        });
        ASSERT_TRUE(waitUntil([&] { return reading.load(); }));
        if (round % 2) std::this_thread::sleep_for(std::chrono::milliseconds(2));  // vary the race
        r->stop();
        const ssize_t got = reader.get();
        EXPECT_GE(got, 0);
        EXPECT_LT(got, static_cast<ssize_t>(buf.size() * 2));
        EXPECT_EQ(got % 2, 0);
        for (ssize_t i = 0; i < got / 2; ++i) ASSERT_EQ(buf[static_cast<size_t>(i)], 0);
    }
}

TEST_F(RecordTest, WavFileHeardThroughTheStream) {
    const std::string path = mFiles.path("mic.wav");
    std::vector<int16_t> samples(3000);
    for (size_t i = 0; i < samples.size(); ++i) samples[i] = static_cast<int16_t>((i * 2654435761u) >> 16);
    ASSERT_TRUE(writeWav(path, 44100, 1, samples));
    setenv("KORVO_MIC", ("wav:" + path).c_str(), 1);
    test::captureLog(true);
    sp<AudioRecord> r = makeRecord();
    ASSERT_EQ(r->initCheck(), OK);
    ASSERT_EQ(r->start(), OK);
    std::vector<int16_t> heard(4000, 1);
    ASSERT_EQ(r->read(heard.data(), 2000 * 2, true), 4000);
    r->stop();  // a pause in the middle resumes where the file was
    ASSERT_EQ(r->start(), OK);
    ASSERT_EQ(r->read(heard.data() + 2000, 2000 * 2, true), 4000);
    EXPECT_TRUE(std::equal(samples.begin(), samples.end(), heard.begin()));
    for (size_t i = 3000; i < 4000; ++i) ASSERT_EQ(heard[i], 0) << i;  // then silence
    EXPECT_TRUE(test::logLines().empty());

    // Two channels are mixed into one and another rate converted to the stream's, quietly:
    // 10 ms of a constant at 48 kHz are heard as 441 samples of their mean.
    const std::string stereoPath = mFiles.path("stereo48k.wav");
    std::vector<int16_t> frames(2 * 480);
    for (size_t i = 0; i < 480; ++i) frames[2 * i] = 8000, frames[2 * i + 1] = 4000;
    ASSERT_TRUE(writeWav(stereoPath, 48000, 2, frames));
    setenv("KORVO_MIC", ("wav:" + stereoPath).c_str(), 1);
    sp<AudioRecord> stereo = makeRecord();
    ASSERT_EQ(stereo->start(), OK);
    std::fill(heard.begin(), heard.end(), 1);
    ASSERT_EQ(stereo->read(heard.data(), 1200, true), 1200);
    for (size_t i = 100; i < 340; ++i) ASSERT_NEAR(heard[i], 6000, 120) << i;
    for (size_t i = 520; i < 600; ++i) ASSERT_NEAR(heard[i], 0, 60) << i;
    EXPECT_TRUE(test::logLines().empty());
}

}  // namespace
