// The sim:ROOM routes across processes, and the card route's failure path.
//
// Other devices are this very binary, re-executed with KORVO_SIMROOM_CHILD set:
// the child runs one role from a static initialiser and exits before any test.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/Routes.h>
#include <korvo/platform/TestControl.h>

extern char** environ;

namespace {

using korvo::platform::CaptureRoute;
using korvo::platform::makeCaptureRoute;
using korvo::platform::makeOutputRoute;
using korvo::platform::OutputRoute;
using Clock = std::chrono::steady_clock;

constexpr int kRate = 44100;
constexpr size_t kBlock = 882;  // 20 ms, a typical playback buffer
constexpr double kToneAmp = 8000.0;
constexpr int kLatency = 882;  // the room's fixed latency (20 ms)

size_t msToSamples(int ms) { return size_t(int64_t(ms) * kRate / 1000); }

std::string envOr(const char* name, const char* fallback) {
    const char* v = std::getenv(name);
    return v ? v : fallback;
}

// Writes a sine (or a constant with freq 0) of `ms` to the route in 20 ms blocks.
// `afterMs`/`onAfter` report once that much has been written.
void playTone(OutputRoute& out, double freq, double amp, int ms, int afterMs = -1,
              void (*onAfter)() = nullptr) {
    const size_t total = msToSamples(ms);
    std::vector<int16_t> block(kBlock);
    size_t written = 0;
    while (written < total) {
        const size_t n = std::min(kBlock, total - written);
        for (size_t i = 0; i < n; ++i) {
            const double t = double(written + i) / kRate;
            block[i] = int16_t(std::lrint(freq > 0 ? amp * std::sin(2 * M_PI * freq * t) : amp));
        }
        out.write(block.data(), n);
        written += n;
        if (onAfter && afterMs >= 0 && written >= msToSamples(afterMs) &&
            written - n < msToSamples(afterMs)) {
            onAfter();
        }
    }
}

void sayReady() {
    const char line[] = "ready\n";
    ssize_t ignored = write(STDOUT_FILENO, line, sizeof line - 1);
    (void)ignored;
}

// ---- child roles -------------------------------------------------------------------
int childSpeak(const std::string& room) {
    std::string error;
    auto out = makeOutputRoute("sim:" + room, &error);
    if (!out || out->open(kRate) != 0) {
        std::fprintf(stderr, "speaker: %s\n", error.c_str());
        return 3;
    }
    const int readyAfter = std::atoi(envOr("KORVO_SIMROOM_READY_MS", "0").c_str());
    if (readyAfter == 0) sayReady();
    playTone(*out, std::atof(envOr("KORVO_SIMROOM_FREQ", "1000").c_str()),
             std::atof(envOr("KORVO_SIMROOM_AMP", "8000").c_str()),
             std::atoi(envOr("KORVO_SIMROOM_MS", "300").c_str()), readyAfter,
             readyAfter > 0 ? &sayReady : nullptr);
    return 0;
}

int childListen(const std::string& room) {
    std::string error;
    auto in = makeCaptureRoute("sim:" + room, &error);
    if (!in || in->open(kRate) != 0) {
        std::fprintf(stderr, "listener: %s\n", error.c_str());
        return 3;
    }
    sayReady();
    std::vector<int16_t> heard(msToSamples(std::atoi(envOr("KORVO_SIMROOM_MS", "600").c_str())));
    for (size_t done = 0; done < heard.size();) {
        const ssize_t n = in->read(heard.data() + done, std::min<size_t>(512, heard.size() - done));
        if (n <= 0) return 4;
        done += size_t(n);
    }
    std::ofstream file(envOr("KORVO_SIMROOM_OUT", "/dev/null"), std::ios::binary);
    file.write(reinterpret_cast<const char*>(heard.data()), std::streamsize(heard.size() * 2));
    return file ? 0 : 5;
}

// Fills every speaker slot, then plays until killed (bounded all the same).
int childHog(const std::string& room) {
    std::vector<std::unique_ptr<OutputRoute>> outs;
    std::string error;
    for (int i = 0; i < 16; ++i) {
        outs.push_back(makeOutputRoute("sim:" + room, &error));
        if (!outs.back()) {
            std::fprintf(stderr, "hog: %s\n", error.c_str());
            return 3;
        }
    }
    outs[0]->open(kRate);
    playTone(*outs[0], 3000, kToneAmp, 20000, 100, &sayReady);
    return 0;
}

// Sits in the room as a microphone until killed (bounded all the same).
int childMember(const std::string& room) {
    std::string error;
    auto in = makeCaptureRoute("sim:" + room, &error);
    if (!in) {
        std::fprintf(stderr, "member: %s\n", error.c_str());
        return 3;
    }
    sayReady();
    std::this_thread::sleep_for(std::chrono::seconds(20));
    return 0;
}

int runChildIfAsked() {
    const char* role = std::getenv("KORVO_SIMROOM_CHILD");
    if (!role) return 0;
    const std::string room = envOr("KORVO_SIMROOM_ROOM", "");
    int rc = 2;
    if (!std::strcmp(role, "speak")) rc = childSpeak(room);
    if (!std::strcmp(role, "listen")) rc = childListen(room);
    if (!std::strcmp(role, "hog")) rc = childHog(room);
    if (!std::strcmp(role, "member")) rc = childMember(room);
    std::fflush(nullptr);
    _exit(rc);
}

const int gChildRole = runChildIfAsked();

// ---- parent side ---------------------------------------------------------------------
class Child {
public:
    explicit Child(const std::map<std::string, std::string>& vars) {
        int fds[2];
        if (pipe2(fds, O_CLOEXEC) != 0) return;
        std::vector<std::string> env;
        for (char** e = environ; *e; ++e) {
            if (std::strncmp(*e, "KORVO_SIM", 9) != 0) env.emplace_back(*e);
        }
        for (const auto& kv : vars) env.push_back(kv.first + "=" + kv.second);
        std::vector<char*> envp;
        for (auto& s : env) envp.push_back(s.data());
        envp.push_back(nullptr);
        char self[4096] = {};
        if (readlink("/proc/self/exe", self, sizeof self - 1) <= 0) return;
        char* argv[] = {self, nullptr};
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
        if (posix_spawn(&mPid, self, &actions, nullptr, argv, envp.data()) != 0) mPid = -1;
        posix_spawn_file_actions_destroy(&actions);
        close(fds[1]);
        mOut = fds[0];
    }
    ~Child() {
        if (mPid > 0) {
            kill(mPid, SIGKILL);
            waitpid(mPid, nullptr, 0);
        }
        if (mOut >= 0) close(mOut);
    }

    bool started() const { return mPid > 0; }

    // Waits (bounded) for the child's "ready" line.
    bool waitReady(int timeoutMs = 15000) {
        const auto deadline = Clock::now() + std::chrono::milliseconds(timeoutMs);
        std::string got;
        while (got.find("ready\n") == std::string::npos) {
            const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
            if (left.count() <= 0) return false;
            pollfd p{mOut, POLLIN, 0};
            if (poll(&p, 1, int(left.count())) <= 0) continue;
            char buf[64];
            const ssize_t n = read(mOut, buf, sizeof buf);
            if (n <= 0) return false;
            got.append(buf, size_t(n));
        }
        return true;
    }

    // Exit code, or -1 when it did not end in time (it is then killed).
    int waitExit(int timeoutMs = 20000) {
        const auto deadline = Clock::now() + std::chrono::milliseconds(timeoutMs);
        int status = 0;
        while (waitpid(mPid, &status, WNOHANG) == 0) {
            if (Clock::now() > deadline) return -1;
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
        mPid = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -2;
    }

    void killNow() {
        kill(mPid, SIGKILL);
        waitpid(mPid, nullptr, 0);
        mPid = -1;
    }

private:
    pid_t mPid = -1;
    int mOut = -1;
};

std::string uniqueRoom(const std::string& tag) {
    static int counter = 0;
    return "t" + std::to_string(getpid()) + "-" + tag + "-" + std::to_string(++counter);
}

std::string roomFile(const std::string& room) {
    return "/dev/shm/korvo-room-" + std::to_string(geteuid()) + "-" + room;
}

bool exists(const std::string& path) {
    struct stat st{};
    return stat(path.c_str(), &st) == 0;
}

// Sets environment variables for one scope.
class EnvGuard {
public:
    void set(const char* name, const char* value) {
        if (!mSaved.count(name)) {
            const char* old = std::getenv(name);
            mSaved[name] = old ? std::make_unique<std::string>(old) : nullptr;
        }
        setenv(name, value, 1);
    }
    ~EnvGuard() {
        for (auto& kv : mSaved) {
            if (kv.second) {
                setenv(kv.first.c_str(), kv.second->c_str(), 1);
            } else {
                unsetenv(kv.first.c_str());
            }
        }
    }

private:
    std::map<std::string, std::unique_ptr<std::string>> mSaved;
};

std::vector<int16_t> readAll(CaptureRoute& in, size_t count) {
    std::vector<int16_t> out(count);
    for (size_t done = 0; done < count;) {
        const ssize_t n = in.read(out.data() + done, std::min<size_t>(1024, count - done));
        if (n <= 0) break;
        done += size_t(n);
    }
    return out;
}

std::vector<int16_t> readFile(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    std::vector<char> bytes((std::istreambuf_iterator<char>(f)), std::istreambuf_iterator<char>());
    std::vector<int16_t> s(bytes.size() / 2);
    std::memcpy(s.data(), bytes.data(), s.size() * 2);
    return s;
}

double rms(const std::vector<int16_t>& x, size_t from, size_t to) {
    double sum = 0;
    for (size_t i = from; i < to; ++i) sum += double(x[i]) * x[i];
    return to > from ? std::sqrt(sum / double(to - from)) : 0.0;
}

double dB(double ratio) { return 20.0 * std::log10(ratio); }

struct Extent {
    size_t first = 0, last = 0;  // [first, last] where |x| > threshold
    bool found = false;
    size_t length() const { return found ? last - first + 1 : 0; }
};

Extent extent(const std::vector<int16_t>& x, int threshold) {
    Extent e;
    for (size_t i = 0; i < x.size(); ++i) {
        if (std::abs(int(x[i])) > threshold) {
            if (!e.found) e.first = i;
            e.found = true;
            e.last = i;
        }
    }
    return e;
}

// Start of the first (or last) stretch of `len` samples in [from, to) without a
// dropout (a loaded machine may make a speaker late: it then skips ahead, leaving
// a short silence); `to` when there is none.
size_t steadyWindow(const std::vector<int16_t>& x, size_t from, size_t to, size_t len,
                    bool last = false) {
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
double amplitudeAt(const std::vector<int16_t>& x, size_t from, size_t to, double freq) {
    double re = 0, im = 0;
    for (size_t i = from; i < to; ++i) {
        const double a = 2 * M_PI * freq * double(i) / kRate;
        re += x[i] * std::cos(a);
        im += x[i] * std::sin(a);
    }
    return 2.0 * std::hypot(re, im) / double(to - from);
}

// Frequency from upward zero crossings (with linear interpolation of the first and last).
double crossingFrequency(const std::vector<int16_t>& x, size_t from, size_t to) {
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

class SimRoomTest : public ::testing::Test {
protected:
    void SetUp() override { korvo::platform::test::resetAll(); }
};

// One process plays a 1000 Hz tone for 300 ms, another records; returns the recording.
std::vector<int16_t> exchangeTone(const std::string& room, const char* gainDb) {
    const std::string file = "/tmp/korvo-simroom-" + room + ".raw";
    std::map<std::string, std::string> listenVars = {{"KORVO_SIMROOM_CHILD", "listen"},
                                                     {"KORVO_SIMROOM_ROOM", room},
                                                     {"KORVO_SIMROOM_MS", "1500"},
                                                     {"KORVO_SIMROOM_OUT", file}};
    if (gainDb) listenVars["KORVO_SIM_GAIN"] = gainDb;
    Child listener(listenVars);
    EXPECT_TRUE(listener.started());
    EXPECT_TRUE(listener.waitReady());
    Child speaker({{"KORVO_SIMROOM_CHILD", "speak"}, {"KORVO_SIMROOM_ROOM", room},
                   {"KORVO_SIMROOM_FREQ", "1000"}, {"KORVO_SIMROOM_AMP", "8000"},
                   {"KORVO_SIMROOM_MS", "300"}});
    EXPECT_EQ(speaker.waitExit(), 0);
    EXPECT_EQ(listener.waitExit(), 0);
    std::vector<int16_t> heard = readFile(file);
    unlink(file.c_str());
    return heard;
}

TEST_F(SimRoomTest, TwoProcessesHearEachOtherAtTheRightFrequencyAndLevel) {
    const double expectedRms = kToneAmp / std::sqrt(2.0);
    for (const char* gain : {static_cast<const char*>(nullptr), "-6"}) {
        SCOPED_TRACE(gain ? gain : "0");
        const std::string room = uniqueRoom("tone");
        const std::vector<int16_t> heard = exchangeTone(room, gain);
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
        const double level = dB(rms(heard, from, to) / expectedRms);
        EXPECT_NEAR(level, gain ? -6.0 : 0.0, 0.5);
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
    std::vector<int16_t> a, b, c, d;
    {
        EnvGuard env;
        env.set("KORVO_SIM_NOISE", "-40");
        env.set("KORVO_SIM_SEED", "7");
        env.set("KORVO_SIM_GAIN", "-20");  // the speaker path's gain does not touch the noise
        std::string error;
        auto micA = makeCaptureRoute("sim:" + room, &error);
        auto micB = makeCaptureRoute("sim:" + room, &error);
        env.set("KORVO_SIM_SEED", "8");
        auto micC = makeCaptureRoute("sim:" + room, &error);
        env.set("KORVO_SIM_NOISE", "-20");
        auto micD = makeCaptureRoute("sim:" + room, &error);
        ASSERT_TRUE(micA && micB && micC && micD) << error;
        for (auto* mic : {micA.get(), micB.get(), micC.get(), micD.get()}) ASSERT_EQ(mic->open(kRate), 0);
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
    double mean = 0;
    for (int16_t v : a) mean += v;
    EXPECT_LT(std::abs(mean / double(n)), 10.0) << "zero-mean";
    // White: neighbouring samples are uncorrelated.
    double lag1 = 0, lag0 = 0;
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
        Child speaker({{"KORVO_SIMROOM_CHILD", "speak"}, {"KORVO_SIMROOM_ROOM", room},
                       {"KORVO_SIMROOM_MS", "600"}, {"KORVO_SIMROOM_READY_MS", "300"}});
        ASSERT_TRUE(speaker.waitReady());
        std::string error;
        auto mic = makeCaptureRoute("sim:" + room, &error);
        ASSERT_TRUE(mic) << error;
        ASSERT_EQ(mic->open(kRate), 0);
        const std::vector<int16_t> heard = readAll(*mic, msToSamples(800));
        EXPECT_EQ(speaker.waitExit(), 0);
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
    {
        const std::string room = uniqueRoom("latespk");
        std::string error;
        auto mic = makeCaptureRoute("sim:" + room, &error);
        ASSERT_TRUE(mic) << error;
        ASSERT_EQ(mic->open(kRate), 0);
        const std::vector<int16_t> before = readAll(*mic, msToSamples(100));
        EXPECT_EQ(extent(before, 0).found, false) << "a room without speakers is silent";
        auto speaker = makeOutputRoute("sim:" + room, &error);
        ASSERT_TRUE(speaker) << error;
        ASSERT_EQ(speaker->open(kRate), 0);
        std::thread player([&] { playTone(*speaker, 1000, kToneAmp, 200); });
        const std::vector<int16_t> after = readAll(*mic, msToSamples(500));
        player.join();
        const Extent tone = extent(after, 500);
        ASSERT_TRUE(tone.found);
        EXPECT_GE(tone.length(), msToSamples(190));
    }
}

TEST_F(SimRoomTest, SpeakersOfOneProcessAreMixedAndSaturated) {
    // Two constant signals of this process's own speakers: the microphone hears
    // each alone, and their sum clipped to 16 bits where they overlap.
    for (const int sign : {1, -1}) {
        SCOPED_TRACE(sign);
        const std::string room = uniqueRoom("mix");
        std::string error;
        auto mic = makeCaptureRoute("sim:" + room, &error);
        auto s1 = makeOutputRoute("sim:" + room, &error);
        auto s2 = makeOutputRoute("sim:" + room, &error);
        ASSERT_TRUE(mic && s1 && s2) << error;
        ASSERT_EQ(mic->open(kRate), 0);
        ASSERT_EQ(s1->open(kRate), 0);
        ASSERT_EQ(s2->open(kRate), 0);
        std::thread p1([&] { playTone(*s1, 0, sign * 20000, 300); });
        std::thread p2([&] { playTone(*s2, 0, sign * 15000, 300); });
        const std::vector<int16_t> heard = readAll(*mic, msToSamples(900));
        p1.join();
        p2.join();
        const int16_t clip = sign > 0 ? 32767 : -32768;
        std::map<int, size_t> counts;
        for (int16_t v : heard) ++counts[v];
        std::set<int> values;
        for (const auto& kv : counts) values.insert(kv.first);
        for (int v : values) {
            EXPECT_TRUE(v == 0 || v == sign * 20000 || v == sign * 15000 || v == clip) << v;
        }
        EXPECT_GT(counts[clip], msToSamples(200)) << "both speakers sound together";
        EXPECT_GE(counts[clip] + counts[sign * 20000], msToSamples(295)) << "speaker 1 is all there";
        EXPECT_GE(counts[clip] + counts[sign * 15000], msToSamples(295)) << "speaker 2 is all there";
    }
}

TEST_F(SimRoomTest, CrashedWriterLeavesTheRoomUsable) {
    const std::string room = uniqueRoom("crash");
    std::string error;
    auto mic = makeCaptureRoute("sim:" + room, &error);
    ASSERT_TRUE(mic) << error;
    struct stat st{};
    ASSERT_EQ(stat(roomFile(room).c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u) << "owner only";
    EXPECT_EQ(st.st_uid, geteuid());

    Child hog({{"KORVO_SIMROOM_CHILD", "hog"}, {"KORVO_SIMROOM_ROOM", room}});
    ASSERT_TRUE(hog.waitReady());
    EXPECT_EQ(makeOutputRoute("sim:" + room, &error), nullptr) << "all 16 speaker places are taken";
    EXPECT_NE(error.find("full"), std::string::npos) << error;
    EXPECT_EQ(error.find('\n'), std::string::npos);
    hog.killNow();  // SIGKILL in the middle of its writes

    error.clear();
    auto speaker = makeOutputRoute("sim:" + room, &error);
    ASSERT_TRUE(speaker) << "places of a dead process are free again: " << error;
    ASSERT_EQ(speaker->open(kRate), 0);
    ASSERT_EQ(mic->open(kRate), 0);
    std::thread player([&] { playTone(*speaker, 1000, kToneAmp, 200); });
    const std::vector<int16_t> heard = readAll(*mic, msToSamples(400));
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
    speaker.reset();
    EXPECT_TRUE(exists(roomFile(room))) << "the microphone is still there";
    mic.reset();
    EXPECT_FALSE(exists(roomFile(room))) << "the last leaver removes the room";
}

TEST_F(SimRoomTest, RoomsLeftByDeadProcessesAreReclaimed) {
    const std::string stale = uniqueRoom("stale");
    Child member({{"KORVO_SIMROOM_CHILD", "member"}, {"KORVO_SIMROOM_ROOM", stale}});
    ASSERT_TRUE(member.waitReady());
    ASSERT_TRUE(exists(roomFile(stale)));
    member.killNow();

    // An object whose creator died before setting it up.
    const std::string unborn = uniqueRoom("unborn");
    const std::string unbornName = "/korvo-room-" + std::to_string(geteuid()) + "-" + unborn;
    const int fd = shm_open(unbornName.c_str(), O_RDWR | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(fd, 0);
    close(fd);
    // An object of another layout: neither joined nor removed.
    const std::string alien = uniqueRoom("alien");
    const std::string alienName = "/korvo-room-" + std::to_string(geteuid()) + "-" + alien;
    const int afd = shm_open(alienName.c_str(), O_RDWR | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(afd, 0);
    ASSERT_EQ(ftruncate(afd, 4096), 0);
    close(afd);

    std::string error;
    const std::string fresh = uniqueRoom("fresh");
    auto mic = makeCaptureRoute("sim:" + fresh, &error);  // joining looks for abandoned rooms
    ASSERT_TRUE(mic) << error;
    EXPECT_FALSE(exists(roomFile(stale)));
    EXPECT_FALSE(exists(roomFile(unborn)));
    EXPECT_TRUE(exists(roomFile(alien)));
    EXPECT_EQ(makeCaptureRoute("sim:" + alien, &error), nullptr);
    EXPECT_NE(error.find("incompatible"), std::string::npos) << error;
    EXPECT_EQ(error.find('\n'), std::string::npos);
    shm_unlink(alienName.c_str());

    // A room whose creator died: the next device to come simply uses it.
    Child member2({{"KORVO_SIMROOM_CHILD", "member"}, {"KORVO_SIMROOM_ROOM", stale}});
    ASSERT_TRUE(member2.waitReady());
    member2.killNow();
    auto again = makeCaptureRoute("sim:" + stale, &error);
    ASSERT_TRUE(again) << error;
    again.reset();
    EXPECT_FALSE(exists(roomFile(stale)));
    mic.reset();
    EXPECT_FALSE(exists(roomFile(fresh)));
}

TEST_F(SimRoomTest, BadRoomNamesAndSettingsFailWithOneLine) {
    std::string error;
    for (const std::string& bad :
         {std::string(""), std::string("a/b"), std::string("a b"), std::string(65, 'r'),
          std::string("caf\xc3\xa9"), std::string("x\ny")}) {
        SCOPED_TRACE(bad);
        error.clear();
        EXPECT_EQ(makeCaptureRoute("sim:" + bad, &error), nullptr);
        EXPECT_FALSE(error.empty());
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
        error.clear();
        EXPECT_EQ(makeOutputRoute("sim:" + bad, &error), nullptr);
        EXPECT_FALSE(error.empty());
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
    }
    // The longest name and every allowed character.
    const std::string longest = "t" + std::to_string(getpid()) + "-Az09._-" + std::string(64, 'x');
    const std::string edge = longest.substr(0, 64);
    auto ok = makeCaptureRoute("sim:" + edge, &error);
    EXPECT_TRUE(ok) << error;
    ok.reset();

    const std::string room = uniqueRoom("env");
    const std::vector<std::pair<const char*, const char*>> badValues = {
        {"KORVO_SIM_GAIN", "abc"},     {"KORVO_SIM_GAIN", "1e999"}, {"KORVO_SIM_GAIN", "nan"},
        {"KORVO_SIM_GAIN", "100"},     {"KORVO_SIM_GAIN", "3dB"},   {"KORVO_SIM_NOISE", "x"},
        {"KORVO_SIM_NOISE", "5"},      {"KORVO_SIM_NOISE", "-40 "}, {"KORVO_SIM_SEED", "-1"},
        {"KORVO_SIM_SEED", "12x"},     {"KORVO_SIM_SEED", "99999999999999999999999"},
        {"KORVO_SIM_NOISE", "-1e9\n"}};
    for (const auto& [name, value] : badValues) {
        SCOPED_TRACE(std::string(name) + "=" + value);
        EnvGuard env;
        env.set(name, value);
        error.clear();
        EXPECT_EQ(makeCaptureRoute("sim:" + room, &error), nullptr);
        EXPECT_NE(error.find(name), std::string::npos) << error;
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
        // Only microphones read these.
        auto out = makeOutputRoute("sim:" + room, &error);
        EXPECT_TRUE(out) << error;
    }
    {
        EnvGuard env;  // empty values count as unset
        env.set("KORVO_SIM_GAIN", "");
        env.set("KORVO_SIM_NOISE", "");
        env.set("KORVO_SIM_SEED", "");
        EXPECT_TRUE(makeCaptureRoute("sim:" + room, &error)) << error;
    }
    EXPECT_FALSE(exists(roomFile(room)));

    // The room runs at 44100 Hz only.
    auto mic = makeCaptureRoute("sim:" + room, &error);
    auto out = makeOutputRoute("sim:" + room, &error);
    ASSERT_TRUE(mic && out) << error;
    EXPECT_LT(mic->open(48000), 0);
    EXPECT_LT(out->open(48000), 0);
    EXPECT_EQ(korvo::platform::outputRateOf("sim:" + room), 44100u);
}

TEST_F(SimRoomTest, AMicrophoneFarBehindGetsSilenceForWhatWasOverwritten) {
    // A speaker keeps about three seconds; a microphone that reads older sound than
    // that must not get newer samples in its place.
    const std::string room = uniqueRoom("lag");
    std::string error;
    auto mic = makeCaptureRoute("sim:" + room, &error);
    auto out = makeOutputRoute("sim:" + room, &error);
    ASSERT_TRUE(mic && out) << error;
    ASSERT_EQ(mic->open(kRate), 0);
    ASSERT_EQ(out->open(kRate), 0);
    std::thread player([&] { playTone(*out, 0, 1000, 4000); });
    std::vector<int16_t> heard(msToSamples(5000));
    const ssize_t got = mic->read(heard.data(), heard.size());  // one read of 5 s
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
    std::string error;
    auto mic = makeCaptureRoute("sim:" + room, &error);
    auto out = makeOutputRoute("sim:" + room, &error);
    ASSERT_TRUE(mic && out) << error;
    ASSERT_EQ(mic->open(kRate), 0);
    ASSERT_EQ(out->open(kRate), 0);

    // Real-time pace: never faster than the sample rate (lower bounds only).
    auto t0 = Clock::now();
    std::vector<int16_t> buf(msToSamples(100));
    EXPECT_EQ(mic->read(buf.data(), buf.size()), ssize_t(buf.size()));
    EXPECT_GE(Clock::now() - t0, std::chrono::milliseconds(95));
    t0 = Clock::now();
    playTone(*out, 1000, 1000, 200);
    EXPECT_GE(Clock::now() - t0, std::chrono::milliseconds(170));

    // A ten-second read and write, each stopped from another thread.
    std::vector<int16_t> big(msToSamples(10000));
    std::atomic<ssize_t> got{-100};
    std::atomic<bool> readDone{false}, writeDone{false};
    std::atomic<int> entered{0};
    t0 = Clock::now();
    std::thread reader([&] {
        ++entered;
        got = mic->read(big.data(), big.size());
        readDone = true;
    });
    std::vector<int16_t> loud(msToSamples(10000), 1000);
    std::thread writer([&] {
        ++entered;
        out->write(loud.data(), loud.size());
        writeDone = true;
    });
    while (entered < 2 && Clock::now() - t0 < std::chrono::seconds(5)) std::this_thread::yield();
    mic->stop();
    out->stop();
    reader.join();
    writer.join();
    EXPECT_LT(Clock::now() - t0, std::chrono::seconds(5)) << "stop() does not wait for the end";
    EXPECT_TRUE(readDone && writeDone);
    EXPECT_GE(got.load(), 0);
    EXPECT_LT(got.load(), ssize_t(big.size()));
    // Stopped routes answer at once; open() resumes them.
    t0 = Clock::now();
    out->write(loud.data(), loud.size());
    EXPECT_LT(Clock::now() - t0, std::chrono::seconds(5));
    ASSERT_EQ(mic->open(kRate), 0);
    EXPECT_EQ(mic->read(buf.data(), 441), 441);
}

TEST(SoundCardRoute, UnknownDevicesFailWithOneLine) {
    for (const char* device : {"card:no-such-device-zq9", "card:9999"}) {
        SCOPED_TRACE(device);
        std::string error;
        EXPECT_EQ(makeCaptureRoute(device, &error), nullptr);
        EXPECT_FALSE(error.empty());
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
        error.clear();
        EXPECT_EQ(makeOutputRoute(device, &error), nullptr);
        EXPECT_FALSE(error.empty());
        EXPECT_EQ(error.find('\n'), std::string::npos) << error;
    }
    std::string error;
    makeCaptureRoute("card:no-such-device-zq9", &error);
    EXPECT_NE(error.find("no-such-device-zq9"), std::string::npos) << error;
}

}  // namespace
