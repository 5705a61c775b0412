// The platform stand-in: reference counting, the looping thread, the log, the capture and
// output streams with their test controls, and the audio routes with the simulated room,
// whose other devices are this very binary run again as children.
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <future>
#include <map>
#include <mutex>
#include <random>
#include <thread>
#include <tuple>

#include <korvo/platform/Log.h>
#include <korvo/platform/Routes.h>
#include <log/log.h>
#include <media/AudioRecord.h>
#include <media/AudioTrack.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/Thread.h>

#include "platform/src/routes/common/SampleClock.h"
#include "support/PlatformTestSupport.h"

using namespace android;
using namespace korvo::platform;
using namespace korvo::platformtest;
using Samples = std::vector<int16_t>;
using Clock = std::chrono::steady_clock;
namespace fs = std::filesystem;

namespace {

constexpr uint32_t kRate = 44100;
constexpr size_t kBlock = 882;  // 20 ms, a playback buffer
size_t ms(int millis) { return size_t(millis) * kRate / 1000; }
// Real-time pace as a property: `samples` are never through before the clock has reached them.
bool due(size_t samples, Clock::time_point since) {
    return double(samples) / kRate <= std::chrono::duration<double>(Clock::now() - since).count();
}

// Writes `count` samples of `value` in 20 ms blocks; says "ready" once `readyAt` were written.
void play(OutputRoute& out, int value, size_t count, size_t readyAt = SIZE_MAX) {
    const Samples block(kBlock, int16_t(value));
    for (size_t done = 0; done < count; done += kBlock) {
        if (readyAt >= done && readyAt < done + kBlock) std::puts("ready");
        out.write(block.data(), std::min(kBlock, count - done));
    }
}

Samples record(CaptureRoute& in, size_t count) {
    Samples heard(count);
    for (ssize_t n = 0, done = 0; size_t(done) < count && n >= 0; done += n) {
        n = in.read(heard.data() + done, std::min<size_t>(1024, count - size_t(done)));
    }
    return heard;
}

int envInt(const char* name, int fallback) { return std::getenv(name) ? std::atoi(std::getenv(name)) : fallback; }

// KORVO_CHILD=log logs a line per priority, then one more after switching the log off.
// =speak takes KORVO_ROOM_PLACES speaker places in the room KORVO_ROOM and plays
// KORVO_ROOM_VALUE for KORVO_ROOM_MS on the first, saying "ready" after KORVO_ROOM_READY_MS.
// =listen says "ready" once its microphone is open and records KORVO_ROOM_MS to KORVO_ROOM_OUT.
[[maybe_unused]] const bool sChild = [] {
    if (!std::getenv("KORVO_CHILD")) return false;
    const std::string role = std::getenv("KORVO_CHILD");
    setvbuf(stdout, nullptr, _IONBF, 0);  // "ready" reaches the parent at once
    const std::string room = "sim:" + std::string(std::getenv("KORVO_ROOM") ? std::getenv("KORVO_ROOM") : "");
    if (role == "log") {
        for (int i = 0; i < 6; ++i) __android_log_print(ANDROID_LOG_VERBOSE + i, "T", "%c", "VDIWEF"[i]);
        setenv("KORVO_LOG", "off", 1);  // the environment is read at the first call only
        __android_log_print(ANDROID_LOG_FATAL, "T", "F");
    } else if (role == "speak") {
        std::vector<std::unique_ptr<OutputRoute>> places;
        for (int i = envInt("KORVO_ROOM_PLACES", 1); i > 0; --i) places.push_back(makeOutputRoute(room, nullptr));
        if (!places.back() || places[0]->open(kRate) != 0) _exit(3);
        play(*places[0], envInt("KORVO_ROOM_VALUE", 8000), ms(envInt("KORVO_ROOM_MS", 300)),
             ms(envInt("KORVO_ROOM_READY_MS", 0)));
    } else if (role == "listen") {
        auto in = makeCaptureRoute(room, nullptr);
        if (!in || in->open(kRate) != 0) _exit(3);
        std::puts("ready");
        const Samples heard = record(*in, ms(envInt("KORVO_ROOM_MS", 1000)));
        std::ofstream(std::getenv("KORVO_ROOM_OUT") ? std::getenv("KORVO_ROOM_OUT") : "/dev/null")
            .write(reinterpret_cast<const char*>(heard.data()), std::streamsize(heard.size() * 2));
    }
    _exit(0);
}();


struct Counted : RefBase {
    ~Counted() override { ++destroyed; }
    void onFirstRef() override { ++firstRefs; }
    static inline std::atomic<int> destroyed{0}, firstRefs{0};
};

TEST_F(Platform, LastStrongReferenceDestroysTheObjectOnce) {
    Counted* raw = new Counted;
    {
        sp<Counted> a(raw), b(a), c(std::move(b)), d;
        sp<Counted>& alias = d = a;
        d = alias;  // assigning itself keeps the count
        d = std::move(c);
        sp<RefBase> base(a);
        std::vector<std::thread> threads(4);
        for (auto& t : threads) {
            t = std::thread([a] {
                for (int i = 0; i < 20000; ++i) sp<Counted> copy(a), moved(std::move(copy));
            });
        }
        for (auto& t : threads) t.join();
        EXPECT_EQ(raw->getStrongCount(), 3);
        a.clear();
        d = nullptr;
        EXPECT_TRUE(Counted::destroyed == 0);
        EXPECT_TRUE(Counted::firstRefs == 1);
    }
    EXPECT_EQ(Counted::destroyed, 1);
}

// Counts its turns and ends after `limit` of them (0: never; -1: asks itself to exit).
struct Loop : Thread {
    explicit Loop(int turnsWanted) : Thread(false), limit(turnsWanted) {}
    bool threadLoop() override {
        if (limit < 0) fromInside = requestExitAndWait();
        return limit >= 0 && ++turns != limit;
    }
    std::atomic<int> limit, turns{0};
    std::atomic<status_t> fromInside{OK};
};

TEST_F(Platform, ThreadLoopsUntilFalseOrRequestExitAndWait) {
    sp<Loop> counted = new Loop(25), forever = new Loop(0), inside = new Loop(-1);
    ASSERT_EQ(counted->run("counted"), OK);
    EXPECT_EQ(counted->join(), OK);
    EXPECT_EQ(counted->turns, 25);
    ASSERT_EQ(forever->run("forever"), OK);
    ASSERT_TRUE(waitFor([&] { return forever->turns > 3; }));
    EXPECT_EQ(forever->run("twice"), INVALID_OPERATION);
    EXPECT_EQ(forever->requestExitAndWait(), OK);
    EXPECT_FALSE(forever->isRunning());
    ASSERT_EQ(inside->run("inside"), OK);
    ASSERT_TRUE(waitFor([&] { return !inside->isRunning(); }));
    EXPECT_EQ(inside->fromInside, WOULD_BLOCK);  // waiting for itself would never end
}

// ---- log ------------------------------------------------------------------------------

TEST_F(Platform, LogWritesOneLinePerCallAsPriorityTagMessageAndCanKeepIt) {
    const std::string path = tempPath("format.log"), longTag(1500, 't'), longMsg(5000, 'm');
    setLogTarget(path, 'V');
    test::captureLog(true);  // also kept in memory, with the trailing newlines removed
    const std::tuple<int, std::string, std::string, std::string> cases[] = {
        {ANDROID_LOG_DEBUG, "TQX", "[SoundMeter] start 200\n", "D/TQX: [SoundMeter] start 200\n"},
        {ANDROID_LOG_WARN, "T", "two\nlines\n\n", "W/T: two\nlines\n"},
        {ANDROID_LOG_DEFAULT, "T", "below verbose", "V/T: below verbose\n"},
        {ANDROID_LOG_DEBUG, longTag, longMsg, "D/" + longTag + ": " + longMsg + "\n"},
    };
    std::string expected, kept;
    for (const auto& [prio, tag, msg, line] : cases) {
        __android_log_print(prio, tag.c_str(), "%s", msg.c_str());
        expected += line;
    }
    __android_log_print(ANDROID_LOG_ERROR, "T", "[%s] level %d", "W", -5);
    EXPECT_EQ(readFile(path), expected + "E/T: [W] level -5\n");
    for (const auto& l : test::logLines()) kept += std::string(1, "VVVDIWEF"[l.prio]) + "/" + l.tag + ": " + l.msg + "\n";
    EXPECT_EQ(kept, readFile(path));
    test::clearLog();
    setLogTarget("off", 'E');
    __android_log_print(ANDROID_LOG_DEBUG, "T", "captured whatever the destination");
    EXPECT_EQ(test::logLines().size(), 1u);
}

TEST_F(Platform, LogDestinationAndLevelAreReadFromTheEnvironmentAtTheFirstCall) {
    const std::string file = tempPath("env.log");
    // KORVO_LOG ("F": the file) and KORVO_LOG_LEVEL ("": unset); the priorities on stderr and
    // in the file, which each process appends to.
    const std::tuple<std::string, const char*, std::string, std::string> cases[] = {
        {"", "", "", ""},        {"off", "V", "", ""}, {"stderr", "", "DIWEFF", ""}, {"", "W", "WEFF", ""},
        {"F", "", "", "DIWEFF"}, {"F", "V", "", "DIWEFFVDIWEFF"}, {"F", "e", "", "DIWEFFVDIWEFFEFF"}};
    const auto lines = [](const std::string& letters) {
        std::string s;
        for (char p : letters) s += std::string(1, p) + "/T: " + p + "\n";
        return s;
    };
    for (const auto& [log, level, toStderr, toFile] : cases) {
        Child child({{"KORVO_CHILD", "log"}, {"KORVO_LOG", log == "F" ? file : log}, {"KORVO_LOG_LEVEL", level}}, true);
        EXPECT_EQ(child.waitExit(), 0);
        EXPECT_EQ(child.err(), lines(toStderr)) << log << " " << level;
        EXPECT_EQ(readFile(file), lines(toFile)) << log << " " << level;
    }
}

// ---- capture stream -------------------------------------------------------------------

sp<AudioRecord> makeRecord(size_t frames = 1024, status_t expected = OK) {
    sp<AudioRecord> r = new AudioRecord(String16());
    EXPECT_EQ(r->set(AUDIO_SOURCE_MIC, kRate, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO, frames), expected);
    return r;
}

TEST_F(Platform, RecordSetRulesAndTheScriptedMicrophone) {
    sp<AudioRecord> r = makeRecord();
    EXPECT_EQ(r->set(AUDIO_SOURCE_MIC, kRate, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_IN_MONO), INVALID_OPERATION);
    test::setMinFrameCount(300);  // frame count 0 asks for the minimum
    EXPECT_EQ(makeRecord(0)->frameCount(), 300u);
    test::failMinFrameCount(-EIO);
    makeRecord(0, -EIO);

    test::scriptMic(true);
    Samples frame(512), buf(512, 0);
    for (size_t i = 0; i < frame.size(); ++i) frame[i] = int16_t(i * 7 - 1000);
    test::pushMicSamples(frame.data(), 4);
    EXPECT_EQ(r->read(buf.data(), 8), 0);  // not started: nothing taken
    ASSERT_EQ(r->start(), OK);
    EXPECT_EQ(r->read(buf.data(), 8), 8);
    test::pushMicResult(600);  // a short count takes that much; the rest waits
    test::pushMicSamples(frame.data(), frame.size());
    EXPECT_EQ(r->read(buf.data(), 1024), 600);
    EXPECT_EQ(r->read(buf.data() + 300, 424), 424);
    EXPECT_EQ(test::lastMicReadRequest(), 424u);
    EXPECT_EQ(buf, frame);
    for (ssize_t result : {7, 0, -32}) test::pushMicResult(result);  // 0 and errors take nothing
    test::pushMicSamples(frame.data(), 10);
    EXPECT_EQ(r->read(buf.data(), 20), 6);  // whole samples
    EXPECT_EQ(r->read(buf.data(), 20), 0);
    EXPECT_EQ(r->read(buf.data(), 20), -32);
    EXPECT_EQ(test::micSamplesQueued(), 7u);
    setenv("KORVO_MIC", "foo", 1);  // a bad route makes a stream unusable, scripted or not
    r = makeRecord(1024, NO_INIT);
    EXPECT_EQ(r->start(), NO_INIT);
    EXPECT_EQ(r->read(buf.data(), 8), NO_INIT);
}

TEST_F(Platform, BlockedReadReturnsWithItsSamplesOrOnStop) {
    test::scriptMic(true);
    bool scripted = true;
    sp<AudioRecord> r = makeRecord();
    Samples frame(512, 5), buf(kRate, 1);
    const auto blockedRead = [&](size_t bytes) {  // once it has begun, and waits in the script if on
        auto f = std::async(std::launch::async, [&, bytes] { return r->read(buf.data(), bytes); });
        EXPECT_TRUE(waitFor([&] { return test::lastMicReadRequest() == bytes && test::micReadersWaiting() == scripted; }));
        return f;
    };
    ASSERT_EQ(r->start(), OK);
    auto whole = blockedRead(1024);  // returns once all it asked for is there
    test::pushMicSamples(frame.data(), 100);
    test::pushMicSamples(frame.data(), 412);
    EXPECT_EQ(whole.get(), 1024);
    test::pushMicSamples(frame.data(), 30);
    auto partial = blockedRead(1024);
    r->stop();
    EXPECT_EQ(partial.get(), 60);
    ASSERT_EQ(r->start(), OK);
    auto released = blockedRead(1024);
    test::resetAll();  // as the next test's SetUp does
    EXPECT_EQ(released.get(), 0);
    scripted = false;  // on the null route a one-second read stopped midway returns what it had: silence
    auto paced = blockedRead(2 * kRate);
    r->stop();
    const ssize_t got = paced.get();
    ASSERT_TRUE(got >= 0);
    EXPECT_TRUE(got < ssize_t(2 * kRate));
    EXPECT_TRUE(std::count(buf.begin(), buf.begin() + got / 2, 0) == got / 2);
}

// ---- output track ---------------------------------------------------------------------

// What a test's callback sees and does. Call c fills sample i with c * 1000 + i.
struct Probe {
    std::atomic<int> calls{0};
    std::atomic<std::thread::id> thread{};
    std::atomic<std::mutex*> gate{nullptr};  // taken in every call
    int stopAt = 0, emptyAt = 0;            // stop the track, produce nothing, in call n
    size_t shortBytes = 0;                  // report only this many bytes (0: all)
    AudioTrack* track = nullptr;
};

void probeCallback(int event, void* user, void* info) {
    Probe* p = static_cast<Probe*>(user);
    auto* b = static_cast<AudioTrack::Buffer*>(info);
    if (event != AudioTrack::EVENT_MORE_DATA) return;
    const int call = ++p->calls;
    if (std::mutex* gate = p->gate) std::lock_guard<std::mutex> lock(*gate);
    p->thread = std::this_thread::get_id();
    for (size_t i = 0; i < b->size / 2; ++i) b->i16[i] = short(call * 1000 + int(i));
    if (p->shortBytes) b->size = p->shortBytes;
    if (call == p->emptyAt) b->size = 0;
    if (call == p->stopAt) p->track->stop();
}

// Samples of the given calls (call, count); call 0 is silence.
Samples probeSamples(std::initializer_list<std::pair<int, int>> calls) {
    Samples s;
    for (const auto& [call, n] : calls) {
        for (int i = 0; i < n; ++i) s.push_back(int16_t(call ? call * 1000 + i : 0));
    }
    return s;
}

sp<AudioTrack> makeTrack(Probe& p, status_t expected = OK) {
    sp<AudioTrack> t = new AudioTrack();
    p.track = t.get();
    EXPECT_EQ(t->set(AUDIO_STREAM_MUSIC, 0, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_OUT_MONO, 0, AUDIO_OUTPUT_FLAG_FAST,
                     probeCallback, &p), expected);
    return t;
}

TEST_F(Platform, TrackSetRulesAndForcedFailures) {
    Probe p;
    sp<AudioTrack> t = makeTrack(p);
    EXPECT_EQ(t->set(AUDIO_STREAM_MUSIC, 0, AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_OUT_MONO), INVALID_OPERATION);
    test::setOutputSamplingRate(48000);  // rate 0 takes the output rate
    EXPECT_EQ(makeTrack(p)->getSampleRate(), 48000u);
    const std::tuple<void (*)(status_t), status_t, status_t, status_t, status_t> forced[] = {
        // forced call and status; then what set, initCheck and start return
        {test::failTrackSet, NO_INIT, NO_INIT, NO_INIT, NO_INIT},
        {test::failOutputSamplingRate, DEAD_OBJECT, DEAD_OBJECT, DEAD_OBJECT, DEAD_OBJECT},
        {test::failTrackInitCheck, BAD_VALUE, OK, BAD_VALUE, OK},
        {test::failTrackStart, -EPIPE, OK, OK, -EPIPE}};
    for (const auto& [force, status, set, init, start] : forced) {
        force(status);
        t = makeTrack(p, set);
        EXPECT_EQ(t->initCheck(), init);
        EXPECT_EQ(t->start(), start);
        force(0);
    }
    setenv("KORVO_SPEAKER", "loudspeaker", 1);  // a bad route: set fails
    EXPECT_EQ(makeTrack(p, BAD_VALUE)->start(), BAD_VALUE);
}

TEST_F(Platform, TrackCallbackThreadIsPacedAndStops) {
    Probe p;
    std::mutex gate;  // outlives the track and its thread
    p.stopAt = 12;
    sp<AudioTrack> t = makeTrack(p);
    const auto t0 = Clock::now();
    ASSERT_EQ(t->start(), OK);
    EXPECT_TRUE(test::trackPlaying());
    ASSERT_TRUE(test::waitTrackStopped(10000));
    EXPECT_TRUE(due(10 * kBlock, t0)) << "the writer keeps one buffer ahead: call 12 comes after 10 played";
    EXPECT_NE(p.thread.load(), std::this_thread::get_id());
    EXPECT_FALSE(waitFor([&] { return p.calls > 12; }, 100));  // none while stopped
    EXPECT_EQ(test::trackStops(), 1);
    // stop() never waits for a callback, here one blocked on a lock this thread holds.
    std::unique_lock<std::mutex> held(gate);
    p.gate = &gate;
    ASSERT_EQ(t->start(), OK);  // resumes
    ASSERT_TRUE(waitFor([&] { return p.calls > 12; }));
    auto stopping = std::async(std::launch::async, [&] { t->stop(); });
    EXPECT_EQ(stopping.wait_for(std::chrono::seconds(5)), std::future_status::ready);
    held.unlock();
}

TEST_F(Platform, PumpedSamplesReachTheWavSpeakerAndTheWavMicrophonePlaysThemBack) {
    const std::string path = tempPath("round-trip.wav");
    test::manualTrackCallbacks(true);
    {
        Probe p;
        setenv("KORVO_SPEAKER", ("wav:" + path).c_str(), 1);
        sp<AudioTrack> t = makeTrack(p);
        ASSERT_EQ(t->start(), OK);
        EXPECT_EQ(test::pumpTrack().samples, probeSamples({{1, 882}}));  // on this thread
        EXPECT_EQ(p.thread.load(), std::this_thread::get_id());
        p.emptyAt = 3;  // nothing produced: silence of the buffer's length
        test::pumpTrack();
        test::pumpTrack();
        p.shortBytes = 100;
        EXPECT_EQ(test::pumpTrack().sizeBytes, 100u);
    }
    // The recording holds every sample period: a pump slower than real time (a loaded machine,
    // a sanitizer) adds the silence the device played meanwhile, nothing else.
    const Samples written = probeSamples({{1, 882}, {2, 882}, {0, 882}, {4, 50}});
    int rate = 0;
    const Samples file = readWav(path, &rate);
    const auto sound = [](Samples x) { return x.erase(std::remove(x.begin(), x.end(), 0), x.end()), x; };
    EXPECT_TRUE(file.size() >= written.size());
    EXPECT_TRUE(file.size() < written.size() + 3000);
    EXPECT_TRUE(sound(file) == sound(written));
    EXPECT_EQ(rate, 44100);
    setenv("KORVO_MIC", ("wav:" + path).c_str(), 1);
    sp<AudioRecord> r = makeRecord();
    Samples heard(file.size() + 500, 1);
    ASSERT_EQ(r->start(), OK);
    ASSERT_EQ(r->read(heard.data(), heard.size() * 2), ssize_t(heard.size() * 2));
    EXPECT_TRUE(std::equal(file.begin(), file.end(), heard.begin()));
    EXPECT_EQ(Samples(heard.begin() + file.size(), heard.end()), Samples(500, 0));
}

// ---- routes ---------------------------------------------------------------------------

Child device(const char* role, const std::string& room, korvo::host::EnvList env) {
    env.insert(env.end(), {{"KORVO_CHILD", role}, {"KORVO_ROOM", room}});
    return Child(env);
}

std::string uniqueRoom(const std::string& tag) {
    static int counter = 0;
    return "t" + std::to_string(getpid()) + "-" + tag + "-" + std::to_string(++counter);
}

std::string roomFile(const std::string& room) { return "/dev/shm/korvo-" + std::to_string(geteuid()) + "/" + room; }

std::map<int, size_t> histogram(const Samples& x) {
    std::map<int, size_t> counts;
    for (int16_t v : x) ++counts[v];
    return counts;
}

TEST_F(Platform, RouteTextsAreCheckedWithAOneLineReason) {
    for (const char* good : {"null", "wav:/tmp/x.wav", "wav:x.wav", "sim:Az09._-", "card", "card:0"})
        EXPECT_TRUE(validateRoute(good, nullptr)) << good;
    const std::string bad[] = {"", "NULL", " null", "nul", "wav", "wav:", "sim:", "card:", "speaker", "sim:a/b",
                               "sim:has space", "sim:caf\xc3\xa9", "sim:" + std::string(65, 'r')};
    for (const std::string& text : bad) {
        std::string error;
        EXPECT_FALSE(validateRoute(text, &error)) << text;
        EXPECT_TRUE(!error.empty()) << error;
        EXPECT_TRUE(error.find('\n') == std::string::npos) << error;
    }
}

TEST_F(Platform, EveryRouteKeepsRealTimePace) {
    for (const std::string& text : {std::string("null"), "wav:" + tempPath("paced.wav"), "sim:" + uniqueRoom("pace")}) {
        auto out = makeOutputRoute(text, nullptr);
        auto t0 = Clock::now();
        ASSERT_EQ(out->open(kRate), 0) << text;
        Samples block(kBlock, 100);
        for (size_t k = 1; k <= 10; ++k) {
            out->write(block.data(), kBlock);
            EXPECT_TRUE(due((k - 1) * kBlock, t0)) << text << ": a writer stays at most one buffer ahead";
        }
        auto in = makeCaptureRoute(text, nullptr);  // a wav microphone reads the file written so far
        t0 = Clock::now();
        ASSERT_EQ(in->open(kRate), 0) << text;
        for (size_t k = 1; k <= 10; ++k) {
            ASSERT_EQ(in->read(block.data(), kBlock), ssize_t(kBlock)) << text;
            EXPECT_TRUE(due(k * kBlock - 1, t0)) << text << ": samples are heard when they are due";
        }
    }
}

TEST_F(Platform, TwoProcessesInOneRoomHearEachOther) {
    // A room keeps time with the wall clock: a device that falls behind loses what it missed.
    if (!emulator().empty()) GTEST_SKIP() << "needs real-time pacing, which processes under " << emulator() << " do not keep";
    // A gain in dB, or a distance: at 2 m a path has half the level of one at 1 m.
    for (const auto& [gain, distance, level] : {std::tuple{"", "", 8000.0}, std::tuple{"-6", "", 8000 * std::pow(10.0, -6 / 20.0)},
                                                std::tuple{"", "2", 4000.0}}) {
        SCOPED_TRACE(std::string(gain) + distance);
        const std::string room = uniqueRoom("two"), file = tempPath(room + ".raw");
        Child listener = device("listen", room, {{"KORVO_ROOM_MS", "1500"}, {"KORVO_ROOM_OUT", file}, {"KORVO_SIM_GAIN", gain},
                                                 {"KORVO_SIM_DISTANCE", distance}});
        ASSERT_TRUE(listener.waitReady());
        Child speaker = device("speak", room, {{"KORVO_ROOM_VALUE", "8000"}, {"KORVO_ROOM_MS", "300"}});
        EXPECT_EQ(speaker.waitExit(), 0);
        EXPECT_EQ(listener.waitExit(), 0);
        const std::string bytes = readFile(file);
        Samples heard(bytes.size() / 2);
        std::memcpy(heard.data(), bytes.data(), heard.size() * 2);
        ASSERT_EQ(heard.size(), ms(1500));
        const auto counts = histogram(heard);
        ASSERT_EQ(counts.size(), 2u) << "silence and the speaker's level";
        EXPECT_NEAR(counts.rbegin()->first, level, 1.0);
        EXPECT_GE(counts.rbegin()->second, ms(290)) << "what was played is heard";
        EXPECT_LE(counts.rbegin()->second, ms(300)) << "and heard once";
        EXPECT_FALSE(fs::exists(roomFile(room))) << "the last device to leave removes the room";
    }
}

TEST_F(Platform, RoomSpeakersAreMixedAndClippedTo16Bits) {
    // A room keeps time with the wall clock: a device that falls behind loses what it missed.
    if (!emulator().empty()) GTEST_SKIP() << "needs real-time pacing, which processes under " << emulator() << " do not keep";
    for (const int sign : {1, -1}) {
        const std::string room = "sim:" + uniqueRoom("mix");
        auto in = makeCaptureRoute(room, nullptr);
        auto s1 = makeOutputRoute(room, nullptr), s2 = makeOutputRoute(room, nullptr);
        ASSERT_TRUE(in->open(kRate) == 0);
        ASSERT_TRUE(s1->open(kRate) == 0);
        ASSERT_TRUE(s2->open(kRate) == 0);
        std::thread p1([&] { play(*s1, sign * 20000, ms(300)); });
        std::thread p2([&] { play(*s2, sign * 15000, ms(300)); });
        auto counts = histogram(record(*in, ms(900)));
        p1.join();
        p2.join();
        const int clip = sign > 0 ? 32767 : -32768;
        for (const auto& [v, n] : counts) EXPECT_TRUE(v == 0 || v == sign * 20000 || v == sign * 15000 || v == clip) << v;
        EXPECT_GT(counts[clip], ms(200)) << "both speakers sound together";
        EXPECT_GE(counts[clip] + counts[sign * 20000], ms(290));
        EXPECT_GE(counts[clip] + counts[sign * 15000], ms(290));
    }
}

// The room's and the device's presets, read from the environment when a route opens.
class RoomSetting {
public:
    RoomSetting(const char* name, const char* value) : mName(name) { setenv(name, value, 1); }
    ~RoomSetting() { unsetenv(mName); }

private:
    const char* mName;
};

TEST_F(Platform, RoomPresetsShapeWhatTheMicrophoneHears) {
    // A room keeps time with the wall clock: a device that falls behind loses what it missed.
    if (!emulator().empty()) GTEST_SKIP() << "needs real-time pacing, which processes under " << emulator() << " do not keep";
    for (const auto& [name, value, says] : {
             std::tuple{"KORVO_SIM_ROOM", "cave", "KORVO_SIM_ROOM='cave' is not a room (quiet, office, kitchen, hall, street)"},
             std::tuple{"KORVO_SIM_DEVICE", "tablet", "KORVO_SIM_DEVICE='tablet' is not a device (ideal, phone, laptop, cheap-speaker)"},
             std::tuple{"KORVO_SIM_DISTANCE", "0", "KORVO_SIM_DISTANCE='0' is not a distance in metres between 0.1 and 100"},
             std::tuple{"KORVO_SIM_CLOCK_PPM", "2e3", "KORVO_SIM_CLOCK_PPM='2e3' is not a clock offset in ppm between -1000 and 1000"}}) {
        RoomSetting setting(name, value);
        std::string error;
        EXPECT_EQ(makeCaptureRoute("sim:" + uniqueRoom("bad"), &error), nullptr);
        EXPECT_EQ(error, says);
        EXPECT_EQ(makeOutputRoute("sim:" + uniqueRoom("bad"), &error), nullptr);
        EXPECT_EQ(error, says);
    }
    {
        // A street: traffic at -25 dBFS, broadband noise at -30 and passers-by at -45.
        RoomSetting street("KORVO_SIM_ROOM", "street");
        auto in = makeCaptureRoute("sim:" + uniqueRoom("street"), nullptr);
        ASSERT_TRUE(in);
        ASSERT_EQ(in->open(kRate), 0);
        const Samples heard = record(*in, ms(2000));
        double energy = 0.0;
        for (int16_t v : heard) energy += double(v) * v;
        const double want = 10.0 * std::log10(std::pow(10.0, -2.5) + std::pow(10.0, -3.0) + std::pow(10.0, -4.5));
        EXPECT_NEAR(10.0 * std::log10(energy / double(heard.size()) / (32768.0 * 32768.0)), want, 1.5);
    }
    // A phone hears its own loudspeaker from 12 cm: a loud tone clips at the microphone's full
    // scale, as a real one does.
    RoomSetting phone("KORVO_SIM_DEVICE", "phone");
    const std::string room = "sim:" + uniqueRoom("clip");
    auto in = makeCaptureRoute(room, nullptr);
    auto out = makeOutputRoute(room, nullptr);
    ASSERT_TRUE(in && out);
    ASSERT_EQ(in->open(kRate), 0);
    ASSERT_EQ(out->open(kRate), 0);
    std::thread speaker([&] {
        Samples tone(ms(300));
        for (size_t i = 0; i < tone.size(); ++i) tone[i] = int16_t(12000 * std::sin(2 * M_PI * 4000.0 * double(i) / kRate));
        for (size_t at = 0; at < tone.size(); at += kBlock) out->write(&tone[at], std::min(kBlock, tone.size() - at));
    });
    const auto counts = histogram(record(*in, ms(700)));
    speaker.join();
    EXPECT_GT(counts.count(32767) ? counts.at(32767) : 0, ms(20));
    EXPECT_GT(counts.count(-32768) ? counts.at(-32768) : 0, ms(20));
}

TEST(SampleClock, PositionsAndTheirDeadlinesAreExactLongAfterA64BitProductOverflows) {
    using korvo::platform::nanosecondsOf;
    using korvo::platform::samplesIn;
    static_assert(samplesIn(1000000000ull, 44100) == 44100 && samplesIn(22675, 44100) == 0 && samplesIn(22676, 44100) == 1);
    static_assert(nanosecondsOf(1, 44100) == 22676 && nanosecondsOf(44100, 44100) == 1000000000ull);
    // A deadline is the first nanosecond of its position: one earlier is still before it.
    // Up to 2^40 samples (290 days at 44.1 kHz), where ns * rate needs 75 bits.
    std::mt19937_64 random(7);
    for (int i = 0; i < 2000; ++i) {
        const uint32_t rate = i % 2 ? 44100u : 8000u + static_cast<uint32_t>(random() % 184000);
        const uint64_t p = 1 + random() % (uint64_t(1) << (1 + i % 40));
        const uint64_t ns = nanosecondsOf(p, rate);
        ASSERT_EQ(samplesIn(ns, rate), p) << p << " at " << rate;
        ASSERT_EQ(samplesIn(ns - 1, rate), p - 1) << p << " at " << rate;
    }
}

TEST_F(Platform, WhatDeadProcessesLeftIsReclaimedAndRoomsArePrivate) {
    const std::string room = uniqueRoom("crash"), stale = uniqueRoom("stale"), unborn = uniqueRoom("unborn"),
                      alien = uniqueRoom("alien"), dotted = "." + uniqueRoom("dot");
    auto in = makeCaptureRoute("sim:" + room, nullptr);
    EXPECT_EQ(fs::status(roomFile(room)).permissions(), fs::perms::owner_read | fs::perms::owner_write);
    Child hog = device("speak", room, {{"KORVO_ROOM_PLACES", "16"}, {"KORVO_ROOM_VALUE", "3000"},
                                       {"KORVO_ROOM_MS", "20000"}, {"KORVO_ROOM_READY_MS", "100"}});
    Child member = device("listen", stale, {{"KORVO_ROOM_MS", "20000"}});
    Child hidden = device("listen", dotted, {{"KORVO_ROOM_MS", "20000"}});
    ASSERT_TRUE(hog.waitReady());
    ASSERT_TRUE(member.waitReady());
    ASSERT_TRUE(hidden.waitReady());
    ASSERT_TRUE(fs::exists(roomFile(stale)));
    ASSERT_TRUE(fs::exists(roomFile(dotted)));
    std::string error;
    EXPECT_EQ(makeOutputRoute("sim:" + room, &error), nullptr);
    EXPECT_NE(error.find("full"), std::string::npos) << error;
    hog.kill();  // in the middle of its writes
    member.kill();
    hidden.kill();
    auto out = makeOutputRoute("sim:" + room, &error);
    ASSERT_TRUE(out) << error;
    ASSERT_TRUE(in->open(kRate) == 0) << error;
    ASSERT_TRUE(out->open(kRate) == 0) << error;
    std::thread player([&] { play(*out, 1000, ms(200)); });
    const Samples heard = record(*in, ms(400));
    player.join();
    EXPECT_GE(histogram(heard)[1000], ms(150)) << "a place of the dead speaker is free again";
    const auto last = std::find_if(heard.rbegin(), heard.rend(), [](int16_t v) { return v != 0; });
    ASSERT_TRUE(last != heard.rend()) << "in the end only the new speaker sounds";
    EXPECT_TRUE(*last == 1000) << "in the end only the new speaker sounds";
    // Rooms whose maker died before setting them up, or of another layout.
    for (const auto& [name, size] : {std::pair{unborn, 0}, std::pair{alien, 4096}}) {
        std::ofstream(roomFile(name)).close();
        fs::resize_file(roomFile(name), size);
    }
    EXPECT_EQ(makeCaptureRoute("sim:" + alien, &error), nullptr);  // joining reclaims abandoned rooms
    EXPECT_NE(error.find("incompatible"), std::string::npos) << error;
    EXPECT_FALSE(fs::exists(roomFile(stale)));
    EXPECT_FALSE(fs::exists(roomFile(unborn)));
    EXPECT_FALSE(fs::exists(roomFile(dotted)));
    EXPECT_TRUE(fs::remove(roomFile(alien))) << "a room of another layout is left alone";
}

}  // namespace
