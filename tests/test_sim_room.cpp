// The sim:ROOM routes across processes, and the card route's failure path.
//
// Other devices are this very binary, re-executed with KORVO_SIMROOM_CHILD set:
// the child runs one role from a static initialiser and exits before any test.
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <fstream>

#include <korvo/platform/Routes.h>

#include "support/PlatformTestSupport.h"

namespace {

using namespace korvo::platform;
using namespace korvo::platformtest;
using Clock = std::chrono::steady_clock;
using Samples = std::vector<int16_t>;

constexpr int kRate = 44100;
constexpr size_t kBlock = 882;  // 20 ms, a typical playback buffer
constexpr double kToneAmp = 8000.0;
constexpr int kLatency = 882;  // the room's fixed latency (20 ms)

size_t msToSamples(int ms) { return size_t(int64_t(ms) * kRate / 1000); }

double envNumber(const char* name, double fallback) {
    const char* v = std::getenv(name);
    return v ? std::atof(v) : fallback;
}

void sayReady() {
    ssize_t ignored = write(STDOUT_FILENO, "ready\n", 6);
    (void)ignored;
}

// Writes a sine (or a constant with freq 0) of `ms` to the route in 20 ms blocks;
// says ready once `readyAfterMs` (> 0) have been written.
void playTone(OutputRoute& out, double freq, double amp, int ms, int readyAfterMs = 0) {
    const size_t total = msToSamples(ms), readyAt = msToSamples(readyAfterMs);
    Samples block(kBlock);
    for (size_t written = 0; written < total;) {
        const size_t n = std::min(kBlock, total - written);
        for (size_t i = 0; i < n; ++i) {
            const double t = double(written + i) / kRate;
            block[i] = int16_t(std::lrint(freq > 0 ? amp * std::sin(2 * M_PI * freq * t) : amp));
        }
        out.write(block.data(), n);
        written += n;
        if (readyAt > 0 && written >= readyAt && written - n < readyAt) sayReady();
    }
}

// ---- child roles -------------------------------------------------------------------
// Takes KORVO_SIMROOM_SLOTS speaker places (extra ones stay silent) and plays a tone.
int childSpeak(const std::string& room) {
    std::vector<std::unique_ptr<OutputRoute>> outs;
    std::string error;
    for (int i = int(envNumber("KORVO_SIMROOM_SLOTS", 1)); i > 0; --i) {
        outs.push_back(makeOutputRoute("sim:" + room, &error));
        if (!outs.back()) return std::fprintf(stderr, "speaker: %s\n", error.c_str()), 3;
    }
    if (outs[0]->open(kRate) != 0) return 3;
    const int readyAfter = int(envNumber("KORVO_SIMROOM_READY_MS", 0));
    if (readyAfter == 0) sayReady();
    playTone(*outs[0], envNumber("KORVO_SIMROOM_FREQ", 1000), envNumber("KORVO_SIMROOM_AMP", kToneAmp),
             int(envNumber("KORVO_SIMROOM_MS", 300)), readyAfter);
    return 0;
}

// Records KORVO_SIMROOM_MS to the raw file KORVO_SIMROOM_OUT (a long one sits in the room until killed).
int childListen(const std::string& room) {
    std::string error;
    auto in = makeCaptureRoute("sim:" + room, &error);
    if (!in || in->open(kRate) != 0) return std::fprintf(stderr, "listener: %s\n", error.c_str()), 3;
    sayReady();
    Samples heard(msToSamples(int(envNumber("KORVO_SIMROOM_MS", 600))));
    for (size_t done = 0; done < heard.size();) {
        const ssize_t n = in->read(heard.data() + done, std::min<size_t>(512, heard.size() - done));
        if (n <= 0) return 4;
        done += size_t(n);
    }
    const char* path = std::getenv("KORVO_SIMROOM_OUT");
    std::ofstream file(path ? path : "/dev/null", std::ios::binary);
    file.write(reinterpret_cast<const char*>(heard.data()), std::streamsize(heard.size() * 2));
    return file ? 0 : 5;
}

const int gChildRole = [] {
    const char* role = std::getenv("KORVO_SIMROOM_CHILD");
    if (!role) return 0;
    const char* room = std::getenv("KORVO_SIMROOM_ROOM");
    const int rc = !std::strcmp(role, "speak") ? childSpeak(room ? room : "")
                   : !std::strcmp(role, "listen") ? childListen(room ? room : "") : 2;
    std::fflush(nullptr);
    _exit(rc);
}();

// ---- parent side ---------------------------------------------------------------------
Child child(const char* role, const std::string& room, std::map<std::string, std::string> vars = {}) {
    vars["KORVO_SIMROOM_CHILD"] = role;
    vars["KORVO_SIMROOM_ROOM"] = room;
    return Child(vars);
}
// Fills every speaker place, then plays 3000 Hz (ready after 100 ms) until killed.
Child hog(const std::string& room) {
    return child("speak", room, {{"KORVO_SIMROOM_SLOTS", "16"}, {"KORVO_SIMROOM_FREQ", "3000"},
                                 {"KORVO_SIMROOM_MS", "20000"}, {"KORVO_SIMROOM_READY_MS", "100"}});
}
// Sits in the room as a microphone until killed.
Child member(const std::string& room) { return child("listen", room, {{"KORVO_SIMROOM_MS", "20000"}}); }

std::string uniqueRoom(const std::string& tag) {
    static int counter = 0;
    return "t" + std::to_string(getpid()) + "-" + tag + "-" + std::to_string(++counter);
}

std::string shmName(const std::string& room) { return "/korvo-room-" + std::to_string(geteuid()) + "-" + room; }
std::string roomFile(const std::string& room) { return "/dev/shm" + shmName(room); }
bool exists(const std::string& path) { return access(path.c_str(), F_OK) == 0; }

// A microphone or speaker of the room, opened at the room's rate unless asked not to.
template <typename Make>
auto route(Make make, const std::string& room, bool open) {
    std::string error;
    auto r = make("sim:" + room, &error);
    if (!r) ADD_FAILURE() << error;
    if (r && open && r->open(kRate) != 0) {
        ADD_FAILURE() << "route did not open";
        r.reset();
    }
    return r;
}
auto mic(const std::string& room, bool open = true) { return route(makeCaptureRoute, room, open); }
auto speaker(const std::string& room) { return route(makeOutputRoute, room, true); }

// Both kinds of route refuse the text with a one-line reason; returns the capture's.
std::string expectRefused(const std::string& text) {
    std::string error, outError;
    EXPECT_EQ(makeCaptureRoute(text, &error), nullptr) << text;
    EXPECT_EQ(makeOutputRoute(text, &outError), nullptr) << text;
    for (const std::string& e : {error, outError}) {
        EXPECT_FALSE(e.empty()) << text;
        EXPECT_EQ(e.find('\n'), std::string::npos) << e;
    }
    return error;
}

Samples readAll(CaptureRoute& in, size_t count) {
    Samples out(count);
    for (size_t done = 0; done < count;) {
        const ssize_t n = in.read(out.data() + done, std::min<size_t>(1024, count - done));
        if (n <= 0) break;
        done += size_t(n);
    }
    return out;
}

double rms(const Samples& x, size_t from, size_t to) {
    double sum = 0;
    for (size_t i = from; i < to; ++i) sum += double(x[i]) * x[i];
    return to > from ? std::sqrt(sum / double(to - from)) : 0.0;
}

double dB(double ratio) { return 20.0 * std::log10(ratio); }

// [first, last] where |x| > threshold.
struct Extent {
    size_t first = 0, last = 0;
    bool found = false;
    size_t length() const { return found ? last - first + 1 : 0; }
};

Extent extent(const Samples& x, int threshold) {
    const auto loud = [threshold](int16_t v) { return std::abs(int(v)) > threshold; };
    const auto first = std::find_if(x.begin(), x.end(), loud);
    if (first == x.end()) return {};
    const auto last = std::find_if(x.rbegin(), x.rend(), loud);
    return {size_t(first - x.begin()), size_t(x.rend() - last) - 1, true};
}

// Start of the first (or last) stretch of `len` samples in [from, to) without a
// dropout (a loaded machine may make a speaker late: it then skips ahead, leaving
// a short silence); `to` when there is none.
size_t steadyWindow(const Samples& x, size_t from, size_t to, size_t len, bool last = false) {
    size_t start = from, zeros = 0, found = to;
    for (size_t i = from; i < to; ++i) {
        zeros = x[i] == 0 ? zeros + 1 : 0;
        if (zeros >= 8) start = i + 1;
        if (i + 1 - start >= len) {
            found = i + 1 - len;
            if (!last) break;
        }
    }
    return found;
}

// Amplitude of the component at `freq` by a direct correlation over whole periods.
double amplitudeAt(const Samples& x, size_t from, size_t to, double freq) {
    double re = 0, im = 0;
    for (size_t i = from; i < to; ++i) {
        const double a = 2 * M_PI * freq * double(i) / kRate;
        re += x[i] * std::cos(a);
        im += x[i] * std::sin(a);
    }
    return 2.0 * std::hypot(re, im) / double(to - from);
}

// Frequency from upward zero crossings (with linear interpolation of the first and last).
double crossingFrequency(const Samples& x, size_t from, size_t to) {
    double first = -1, last = -1;
    int crossings = 0;
    for (size_t i = from + 1; i < to; ++i) {
        if (x[i - 1] < 0 && x[i] >= 0) {
            const double t = double(i - 1) + double(-x[i - 1]) / double(x[i] - x[i - 1]);
            if (first < 0) first = t;
            last = t;
            ++crossings;
        }
    }
    return crossings > 1 ? (crossings - 1) * kRate / (last - first) : 0.0;
}

using SimRoomTest = PlatformFixture;

TEST_F(SimRoomTest, TwoProcessesHearEachOtherAtTheRightFrequencyAndLevel) {
    // One process records 1.5 s, another plays a 1000 Hz tone for 300 ms.
    for (const char* gain : {static_cast<const char*>(nullptr), "-6"}) {
        SCOPED_TRACE(gain ? gain : "0");
        const std::string room = uniqueRoom("tone");
        const std::string file = mFiles.path(room + ".raw");
        std::map<std::string, std::string> listenVars = {{"KORVO_SIMROOM_MS", "1500"}, {"KORVO_SIMROOM_OUT", file}};
        if (gain) listenVars["KORVO_SIM_GAIN"] = gain;
        Child listener = child("listen", room, listenVars);
        EXPECT_TRUE(listener.started());
        EXPECT_TRUE(listener.waitReady());
        Child speaker = child("speak", room, {{"KORVO_SIMROOM_FREQ", "1000"}, {"KORVO_SIMROOM_AMP", "8000"}});
        EXPECT_EQ(speaker.waitExit(), 0);
        EXPECT_EQ(listener.waitExit(), 0);
        const std::string bytes = readFile(file);
        Samples heard(bytes.size() / 2);
        std::memcpy(heard.data(), bytes.data(), heard.size() * 2);
        ASSERT_EQ(heard.size(), msToSamples(1500));
        // The speaker started after the microphone: it cannot be heard before its latency.
        for (int i = 0; i < kLatency; ++i) ASSERT_EQ(heard[size_t(i)], 0) << "at " << i;
        const Extent tone = extent(heard, 500);
        ASSERT_TRUE(tone.found);
        EXPECT_GE(tone.length(), msToSamples(290));
        EXPECT_LE(tone.length(), msToSamples(350)) << "heard once (a late speaker may skip ahead)";
        EXPECT_LT(tone.last + 1, heard.size()) << "the whole tone fits in the recording";
        // Measure over 200 ms (whole periods of 1000 Hz: 8820 samples).
        const size_t from = steadyWindow(heard, tone.first, tone.last, 8820), to = from + 8820;
        ASSERT_LE(to, tone.last);
        EXPECT_NEAR(dB(rms(heard, from, to) / (kToneAmp / std::sqrt(2.0))), gain ? -6.0 : 0.0, 0.5);
        EXPECT_NEAR(crossingFrequency(heard, from, to), 1000.0, 5.0);
        const double at1000 = amplitudeAt(heard, from, to, 1000.0);
        EXPECT_NEAR(dB(at1000 / kToneAmp), gain ? -6.0 : 0.0, 0.5);
        EXPECT_LT(amplitudeAt(heard, from, to, 1500.0), at1000 / 100);
        // Silence after the tone: exact zeros, nothing else was in the room.
        for (size_t i = tone.last + 200; i < heard.size(); ++i) ASSERT_EQ(heard[i], 0) << "at " << i;
        EXPECT_FALSE(exists(roomFile(room))) << "the last leaver removes the room";
    }
}

TEST_F(SimRoomTest, NoiseHasTheAskedLevelAndRepeatsWithItsSeed) {
    const std::string room = uniqueRoom("noise");
    const size_t n = msToSamples(100);
    Samples a, b, c, d;
    {
        mEnv.set("KORVO_SIM_NOISE", "-40");
        mEnv.set("KORVO_SIM_SEED", "7");
        mEnv.set("KORVO_SIM_GAIN", "-20");  // the speaker path's gain does not touch the noise
        auto micA = mic(room), micB = mic(room);
        mEnv.set("KORVO_SIM_SEED", "8");
        auto micC = mic(room);
        mEnv.set("KORVO_SIM_NOISE", "-20");
        auto micD = mic(room);
        ASSERT_TRUE(micA && micB && micC && micD);
        a = readAll(*micA, n);
        b = readAll(*micB, n);
        c = readAll(*micC, n);
        d = readAll(*micD, n);
    }
    EXPECT_EQ(a, b) << "same seed, same noise";
    EXPECT_NE(a, c) << "another seed, other noise";
    EXPECT_NEAR(dB(rms(a, 0, n) / 32768.0), -40.0, 1.0);
    EXPECT_NEAR(dB(rms(c, 0, n) / 32768.0), -40.0, 1.0);
    EXPECT_NEAR(dB(rms(d, 0, n) / 32768.0), -20.0, 1.0);
    double mean = 0, lag1 = 0, lag0 = 0;
    for (int16_t v : a) mean += v;
    EXPECT_LT(std::abs(mean / double(n)), 10.0) << "zero-mean";
    // White: neighbouring samples are uncorrelated.
    for (size_t i = 1; i < n; ++i) {
        lag1 += double(a[i]) * a[i - 1];
        lag0 += double(a[i]) * a[i];
    }
    EXPECT_LT(std::abs(lag1 / lag0), 0.05);
    EXPECT_FALSE(exists(roomFile(room)));
}

TEST_F(SimRoomTest, LateJoinersHearOnlyWhatIsPlayedWhileTheyAreThere) {
    // A microphone that joins while a speaker plays hears the rest of the tone.
    {
        const std::string room = uniqueRoom("latemic");
        Child speaking = child("speak", room, {{"KORVO_SIMROOM_MS", "600"}, {"KORVO_SIMROOM_READY_MS", "300"}});
        ASSERT_TRUE(speaking.waitReady());
        auto in = mic(room);
        ASSERT_TRUE(in);
        const Samples heard = readAll(*in, msToSamples(800));
        EXPECT_EQ(speaking.waitExit(), 0);
        const Extent tone = extent(heard, 500);
        ASSERT_TRUE(tone.found);
        EXPECT_LT(tone.first, 50u) << "the tone is already sounding";
        const size_t from = steadyWindow(heard, tone.first, tone.last, 882);
        ASSERT_LE(from + 882, tone.last);
        EXPECT_NEAR(dB(rms(heard, from, from + 882) / (kToneAmp / std::sqrt(2.0))), 0.0, 0.5);
        EXPECT_LT(tone.length(), msToSamples(330)) << "the first 300 ms were before the mic joined";
        EXPECT_GT(tone.length(), msToSamples(50));
    }
    // A speaker that joins after the microphone is not heard before it joined.
    const std::string room = uniqueRoom("latespk");
    auto in = mic(room);
    ASSERT_TRUE(in);
    EXPECT_FALSE(extent(readAll(*in, msToSamples(100)), 0).found) << "a room without speakers is silent";
    auto out = speaker(room);
    ASSERT_TRUE(out);
    std::thread player([&] { playTone(*out, 1000, kToneAmp, 200); });
    const Samples after = readAll(*in, msToSamples(500));
    player.join();
    const Extent tone = extent(after, 500);
    ASSERT_TRUE(tone.found);
    EXPECT_GE(tone.length(), msToSamples(190));
}

TEST_F(SimRoomTest, SpeakersOfOneProcessAreMixedAndSaturated) {
    // Two constant signals of this process's own speakers: the microphone hears
    // each alone, and their sum clipped to 16 bits where they overlap.
    for (const int sign : {1, -1}) {
        SCOPED_TRACE(sign);
        const std::string room = uniqueRoom("mix");
        auto in = mic(room);
        auto s1 = speaker(room), s2 = speaker(room);
        ASSERT_TRUE(in && s1 && s2);
        std::thread p1([&] { playTone(*s1, 0, sign * 20000, 300); });
        std::thread p2([&] { playTone(*s2, 0, sign * 15000, 300); });
        const Samples heard = readAll(*in, msToSamples(900));
        p1.join();
        p2.join();
        const int16_t clip = sign > 0 ? 32767 : -32768;
        std::map<int, size_t> counts;
        for (int16_t v : heard) ++counts[v];
        for (const auto& [v, count] : counts) {
            EXPECT_TRUE(v == 0 || v == sign * 20000 || v == sign * 15000 || v == clip) << v << " x" << count;
        }
        EXPECT_GT(counts[clip], msToSamples(200)) << "both speakers sound together";
        EXPECT_GE(counts[clip] + counts[sign * 20000], msToSamples(295)) << "speaker 1 is all there";
        EXPECT_GE(counts[clip] + counts[sign * 15000], msToSamples(295)) << "speaker 2 is all there";
    }
}

TEST_F(SimRoomTest, CrashedWriterLeavesTheRoomUsable) {
    const std::string room = uniqueRoom("crash");
    auto in = mic(room, false);
    ASSERT_TRUE(in);
    struct stat st{};
    ASSERT_EQ(stat(roomFile(room).c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u) << "owner only";
    EXPECT_EQ(st.st_uid, geteuid());

    Child hogging = hog(room);
    ASSERT_TRUE(hogging.waitReady());
    std::string error;
    EXPECT_EQ(makeOutputRoute("sim:" + room, &error), nullptr) << "all 16 speaker places are taken";
    EXPECT_NE(error.find("full"), std::string::npos) << error;
    EXPECT_EQ(error.find('\n'), std::string::npos);
    hogging.killNow();  // SIGKILL in the middle of its writes

    auto out = speaker(room);
    ASSERT_TRUE(out) << "places of a dead process are free again";
    ASSERT_EQ(in->open(kRate), 0);
    std::thread player([&] { playTone(*out, 1000, kToneAmp, 200); });
    const Samples heard = readAll(*in, msToSamples(400));
    player.join();
    // The dead writer played 3000 Hz (what it had queued may still sound at first);
    // at the end only the new speaker's 1000 Hz is left.
    const Extent tone = extent(heard, 500);
    ASSERT_TRUE(tone.found);
    EXPECT_GE(tone.length(), msToSamples(190));
    const size_t from = steadyWindow(heard, tone.first, tone.last, 4410, true), to = from + 4410;
    ASSERT_LE(to, tone.last);
    EXPECT_NEAR(dB(amplitudeAt(heard, from, to, 1000.0) / kToneAmp), 0.0, 0.5);
    EXPECT_LT(amplitudeAt(heard, from, to, 3000.0), 50.0);
    out.reset();
    EXPECT_TRUE(exists(roomFile(room))) << "the microphone is still there";
    in.reset();
    EXPECT_FALSE(exists(roomFile(room))) << "the last leaver removes the room";
}

TEST_F(SimRoomTest, RoomsLeftByDeadProcessesAreReclaimed) {
    const std::string stale = uniqueRoom("stale");
    Child first = member(stale);
    ASSERT_TRUE(first.waitReady());
    ASSERT_TRUE(exists(roomFile(stale)));
    first.killNow();

    // An object whose creator died before setting it up, and one of another layout
    // (neither joined nor removed).
    const std::string unborn = uniqueRoom("unborn"), alien = uniqueRoom("alien");
    const int fd = shm_open(shmName(unborn).c_str(), O_RDWR | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(fd, 0);
    close(fd);
    const int afd = shm_open(shmName(alien).c_str(), O_RDWR | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(afd, 0);
    ASSERT_EQ(ftruncate(afd, 4096), 0);
    close(afd);

    const std::string fresh = uniqueRoom("fresh");
    auto in = mic(fresh, false);  // joining looks for abandoned rooms
    ASSERT_TRUE(in);
    EXPECT_FALSE(exists(roomFile(stale)));
    EXPECT_FALSE(exists(roomFile(unborn)));
    EXPECT_TRUE(exists(roomFile(alien)));
    std::string error;
    EXPECT_EQ(makeCaptureRoute("sim:" + alien, &error), nullptr);
    EXPECT_NE(error.find("incompatible"), std::string::npos) << error;
    EXPECT_EQ(error.find('\n'), std::string::npos);
    shm_unlink(shmName(alien).c_str());

    // A room whose creator died: the next device to come simply uses it.
    Child second = member(stale);
    ASSERT_TRUE(second.waitReady());
    second.killNow();
    auto again = mic(stale, false);
    ASSERT_TRUE(again);
    again.reset();
    EXPECT_FALSE(exists(roomFile(stale)));
    in.reset();
    EXPECT_FALSE(exists(roomFile(fresh)));
}

TEST_F(SimRoomTest, BadRoomNamesAndSettingsFailWithOneLine) {
    for (const std::string& bad : {std::string(""), std::string("a/b"), std::string("a b"), std::string(65, 'r'),
                                   std::string("caf\xc3\xa9"), std::string("x\ny")}) {
        expectRefused("sim:" + bad);
    }
    // The longest name and every allowed character.
    const std::string longest = "t" + std::to_string(getpid()) + "-Az09._-" + std::string(64, 'x');
    EXPECT_TRUE(mic(longest.substr(0, 64), false));

    const std::string room = uniqueRoom("env");
    const std::vector<std::pair<const char*, const char*>> badValues = {
        {"KORVO_SIM_GAIN", "abc"},     {"KORVO_SIM_GAIN", "1e999"}, {"KORVO_SIM_GAIN", "nan"},
        {"KORVO_SIM_GAIN", "100"},     {"KORVO_SIM_GAIN", "3dB"},   {"KORVO_SIM_NOISE", "x"},
        {"KORVO_SIM_NOISE", "5"},      {"KORVO_SIM_NOISE", "-40 "}, {"KORVO_SIM_SEED", "-1"},
        {"KORVO_SIM_SEED", "12x"},     {"KORVO_SIM_SEED", "99999999999999999999999"},
        {"KORVO_SIM_NOISE", "-1e9\n"}};
    for (const auto& [name, value] : badValues) {
        SCOPED_TRACE(std::string(name) + "=" + value);
        mEnv.set(name, value);
        std::string error;
        EXPECT_EQ(makeCaptureRoute("sim:" + room, &error), nullptr);
        EXPECT_NE(error.find(name), std::string::npos) << error;
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
        EXPECT_TRUE(makeOutputRoute("sim:" + room, &error)) << "only microphones read these: " << error;
        mEnv.restore();
    }
    for (const char* name : {"KORVO_SIM_GAIN", "KORVO_SIM_NOISE", "KORVO_SIM_SEED"}) mEnv.set(name, "");
    EXPECT_TRUE(mic(room, false)) << "empty values count as unset";
    mEnv.restore();
    EXPECT_FALSE(exists(roomFile(room)));

    // The room runs at 44100 Hz only.
    auto in = mic(room, false);
    auto out = makeOutputRoute("sim:" + room, nullptr);
    ASSERT_TRUE(in && out);
    EXPECT_LT(in->open(48000), 0);
    EXPECT_LT(out->open(48000), 0);
    EXPECT_EQ(outputRateOf("sim:" + room), 44100u);
}

TEST_F(SimRoomTest, AMicrophoneFarBehindGetsSilenceForWhatWasOverwritten) {
    // A speaker keeps about three seconds; a microphone that reads older sound than
    // that must not get newer samples in its place.
    const std::string room = uniqueRoom("lag");
    auto in = mic(room);
    auto out = speaker(room);
    ASSERT_TRUE(in && out);
    std::thread player([&] { playTone(*out, 0, 1000, 4000); });
    Samples heard(msToSamples(5000));
    const ssize_t got = in->read(heard.data(), heard.size());  // one read of 5 s
    player.join();
    ASSERT_EQ(got, ssize_t(heard.size()));
    // Played from ~0 to ~4 s, read all at once at 5 s: the first second is gone.
    for (size_t i = 0; i < msToSamples(400); ++i) ASSERT_EQ(heard[i], 0) << "at " << i;
    size_t kept = 0;
    for (int16_t v : heard) {
        EXPECT_TRUE(v == 0 || v == 1000) << v;
        kept += v == 1000;
    }
    EXPECT_GT(kept, msToSamples(2500));
    EXPECT_LE(kept, size_t(1) << 17);
}

TEST_F(SimRoomTest, CallsArePacedAndStopInterruptsThem) {
    const std::string room = uniqueRoom("stop");
    auto in = mic(room);
    auto out = speaker(room);
    ASSERT_TRUE(in && out);

    // Real-time pace: never faster than the sample rate (lower bounds only).
    auto t0 = Clock::now();
    Samples buf(msToSamples(100));
    EXPECT_EQ(in->read(buf.data(), buf.size()), ssize_t(buf.size()));
    EXPECT_GE(Clock::now() - t0, std::chrono::milliseconds(95));
    t0 = Clock::now();
    playTone(*out, 1000, 1000, 200);
    EXPECT_GE(Clock::now() - t0, std::chrono::milliseconds(170));

    // A ten-second read and write, each stopped from another thread.
    Samples big(msToSamples(10000)), loud(msToSamples(10000), 1000);
    std::atomic<ssize_t> got{-100};
    std::atomic<int> entered{0};
    t0 = Clock::now();
    std::thread reader([&] {
        ++entered;
        got = in->read(big.data(), big.size());
    });
    std::thread writer([&] {
        ++entered;
        out->write(loud.data(), loud.size());
    });
    while (entered < 2 && Clock::now() - t0 < std::chrono::seconds(5)) std::this_thread::yield();
    in->stop();
    out->stop();
    reader.join();
    writer.join();
    EXPECT_LT(Clock::now() - t0, std::chrono::seconds(5)) << "stop() does not wait for the end";
    EXPECT_GE(got.load(), 0);
    EXPECT_LT(got.load(), ssize_t(big.size()));
    // Stopped routes answer at once; open() resumes them.
    t0 = Clock::now();
    out->write(loud.data(), loud.size());
    EXPECT_LT(Clock::now() - t0, std::chrono::seconds(5));
    ASSERT_EQ(in->open(kRate), 0);
    EXPECT_EQ(in->read(buf.data(), 441), 441);
}

TEST(SoundCardRoute, UnknownDevicesFailWithOneLine) {
    EXPECT_NE(expectRefused("card:no-such-device-zq9").find("no-such-device-zq9"), std::string::npos);
    expectRefused("card:9999");
}

}  // namespace
