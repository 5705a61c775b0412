// The platform log: line format, priorities, destinations, capture and whole lines under
// concurrent writers.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <set>
#include <sstream>

#include <korvo/platform/Log.h>
#include <log/log.h>

#include "support/PlatformTestSupport.h"

using namespace korvo::platformtest;
using korvo::platform::reloadLogConfig;

namespace {

// Child half of ReadsTheEnvironmentAtTheFirstCall: started with KORVO_LOG_CHILD set, the
// program logs with the environment it was started with, before any test runs, and exits.
[[maybe_unused]] const bool sLogChild = [] {
    if (!std::getenv("KORVO_LOG_CHILD")) return false;
    __android_log_print(ANDROID_LOG_VERBOSE, "C", "v");
    __android_log_print(ANDROID_LOG_INFO, "C", "first %d", 1);
    setenv("KORVO_LOG", "off", 1);  // read once: later changes need reloadLogConfig
    __android_log_print(ANDROID_LOG_INFO, "C", "second");
    _exit(0);
}();

// Sends this process's stderr to a file while alive.
class StderrToFile {
public:
    explicit StderrToFile(const std::string& path) : mPath(path) {
        fflush(stderr);
        mSaved = dup(STDERR_FILENO);
        const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
        dup2(fd, STDERR_FILENO);
        close(fd);
    }
    ~StderrToFile() { finish(); }
    std::string finish() {
        if (mSaved >= 0) {
            fflush(stderr);
            dup2(mSaved, STDERR_FILENO);
            close(mSaved);
            mSaved = -1;
        }
        return readFile(mPath);
    }

private:
    std::string mPath;
    int mSaved = -1;
};

class LogTest : public PlatformFixture {
protected:
    void TearDown() override {
        PlatformFixture::TearDown();
        mEnv.restore();
        reloadLogConfig();
    }
    // Sets both variables (nullptr: unset) and reloads the configuration.
    void configure(const char* log, const char* level) {
        mEnv.set("KORVO_LOG", log);
        mEnv.set("KORVO_LOG_LEVEL", level);
        reloadLogConfig();
    }
};

TEST_F(LogTest, LineFormatAndPriorityLetters) {
    const std::string path = mFiles.path("format.log");
    korvo::platform::setLogTarget(path, 'V');
    __android_log_print(ANDROID_LOG_DEBUG, "TQX", "[%s] AudioRecord preparation %d\n", "SoundMeter", 200);
    __android_log_print(ANDROID_LOG_VERBOSE, "TQX", "v");
    __android_log_print(ANDROID_LOG_INFO, "TQX", "i\n\n\n");
    __android_log_print(ANDROID_LOG_WARN, "MiniToneGenerator", "two\nlines\n");
    __android_log_print(ANDROID_LOG_ERROR, "TQX", "[%s] detection Level is %d\n", "WAVEFORM_CANVAS", -5);
    __android_log_print(ANDROID_LOG_FATAL, "KeyedVector", "%s", "");
    __android_log_print(ANDROID_LOG_DEFAULT, "T", "below verbose");
    __android_log_print(ANDROID_LOG_DEBUG, "TQX", "[%s] Audio read failed rror = %d", "SoundMeter", -16);
    // Long lines stay whole, and so does one that just fills the line buffer.
    const std::string tag(1500, 't'), msg(5000, 'm');
    __android_log_print(ANDROID_LOG_DEBUG, tag.c_str(), "%s|%d\n", msg.c_str(), 42);
    __android_log_print(ANDROID_LOG_DEBUG, "T", "%s", std::string(1014, 'x').c_str());
    EXPECT_EQ(readFile(path),
              "D/TQX: [SoundMeter] AudioRecord preparation 200\n"
              "V/TQX: v\n"
              "I/TQX: i\n"
              "W/MiniToneGenerator: two\nlines\n"
              "E/TQX: [WAVEFORM_CANVAS] detection Level is -5\n"
              "F/KeyedVector: \n"
              "V/T: below verbose\n"
              "D/TQX: [SoundMeter] Audio read failed rror = -16\n"
              "D/" + tag + ": " + msg + "|42\n" + "D/T: " + std::string(1014, 'x') + "\n");
}

TEST_F(LogTest, LevelsFilesAndOffFromTheEnvironment) {
    const std::string path = mFiles.path("env.log");
    const std::pair<const char*, const char*> cases[] = {
        {nullptr, "D/T: d\nI/T: i\nW/T: w\nE/T: e\nF/T: f\n"},  // KORVO_LOG alone: from D on
        {"V", "V/T: v\nD/T: d\nI/T: i\nW/T: w\nE/T: e\nF/T: f\n"},
        {"D", "D/T: d\nI/T: i\nW/T: w\nE/T: e\nF/T: f\n"},
        {"I", "I/T: i\nW/T: w\nE/T: e\nF/T: f\n"},
        {"W", "W/T: w\nE/T: e\nF/T: f\n"},
        {"E", "E/T: e\nF/T: f\n"},
    };
    for (const auto& [level, expected] : cases) {
        unlink(path.c_str());
        configure(path.c_str(), level);
        for (int p = ANDROID_LOG_VERBOSE; p <= ANDROID_LOG_FATAL; ++p) {
            const char letter[] = {"vdiwef"[p - ANDROID_LOG_VERBOSE], '\0'};
            __android_log_print(p, "T", "%s", letter);
        }
        EXPECT_EQ(readFile(path), expected) << "level " << (level ? level : "(unset)");
    }
    // The file is appended to, never truncated.
    reloadLogConfig();
    __android_log_print(ANDROID_LOG_ERROR, "T", "again");
    EXPECT_EQ(readFile(path), "E/T: e\nF/T: f\nE/T: again\n");
    // off writes nothing, whatever the level.
    unlink(path.c_str());
    configure("off", "V");
    __android_log_print(ANDROID_LOG_FATAL, "T", "nothing");
    EXPECT_NE(access(path.c_str(), F_OK), 0);
}

TEST_F(LogTest, StderrTargets) {
    struct Case {
        const char *log, *level, *expected;
    };
    const Case cases[] = {
        {nullptr, nullptr, ""},  // the default: silent
        {"", "", ""},
        {"stderr", nullptr, "D/S: d\nE/S: e\n"},
        {nullptr, "W", "E/S: e\n"},  // a level alone means stderr
        {"stderr", "V", "V/S: v\nD/S: d\nE/S: e\n"},
        {"off", "V", ""},
    };
    for (const Case& c : cases) {
        configure(c.log, c.level);
        StderrToFile capture(mFiles.path("stderr.txt"));
        __android_log_print(ANDROID_LOG_VERBOSE, "S", "v");
        __android_log_print(ANDROID_LOG_DEBUG, "S", "d\n");
        __android_log_print(ANDROID_LOG_ERROR, "S", "e");
        EXPECT_EQ(capture.finish(), c.expected)
            << "KORVO_LOG=" << (c.log ? c.log : "(unset)") << " KORVO_LOG_LEVEL=" << (c.level ? c.level : "(unset)");
    }

    // A log file that cannot be opened is reported once on stderr; the log stays off.
    StderrToFile capture(mFiles.path("stderr-bad.txt"));
    configure("/nonexistent-korvo-dir/x.log", nullptr);
    __android_log_print(ANDROID_LOG_ERROR, "S", "lost");
    const std::string err = capture.finish();
    EXPECT_EQ(err.find("lost"), std::string::npos);
    EXPECT_NE(err.find("/nonexistent-korvo-dir/x.log"), std::string::npos);
    EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1);
}

TEST_F(LogTest, CaptureKeepsEveryLine) {
    korvo::platform::setLogTarget("off", 'E');
    __android_log_print(ANDROID_LOG_DEBUG, "TQX", "before capture");
    test::captureLog(true);
    __android_log_print(ANDROID_LOG_VERBOSE, "TQX", "[%s] android_media_AudioRecord_get_min_buff_size(%d, %d, %d)",
                        "SoundMeter", 44100, 1, 2);
    __android_log_print(ANDROID_LOG_ERROR, "MiniToneGenerator", "trail\n\n");
    __android_log_print(ANDROID_LOG_DEBUG, "TQX", "a\nb\n");
    auto lines = test::logLines();
    ASSERT_EQ(lines.size(), 3u);
    EXPECT_EQ(lines[0].prio, ANDROID_LOG_VERBOSE);
    EXPECT_EQ(lines[0].tag, "TQX");
    EXPECT_EQ(lines[0].msg, "[SoundMeter] android_media_AudioRecord_get_min_buff_size(44100, 1, 2)");
    EXPECT_EQ(lines[1].prio, ANDROID_LOG_ERROR);
    EXPECT_EQ(lines[1].tag, "MiniToneGenerator");
    EXPECT_EQ(lines[1].msg, "trail");
    EXPECT_EQ(lines[2].msg, "a\nb");
    test::clearLog();
    EXPECT_TRUE(test::logLines().empty());
    test::captureLog(false);
    __android_log_print(ANDROID_LOG_ERROR, "TQX", "not kept");
    EXPECT_TRUE(test::logLines().empty());
    test::captureLog(true);
    test::resetAll();  // capture off and emptied
    __android_log_print(ANDROID_LOG_ERROR, "TQX", "not kept either");
    EXPECT_TRUE(test::logLines().empty());
}

TEST_F(LogTest, ConcurrentWritersNeverInterleave) {
    const std::string path = mFiles.path("threads.log");
    korvo::platform::setLogTarget(path, 'D');
    test::captureLog(true);
    constexpr int kThreads = 6, kLines = 400;
    // Some lines are longer than the stack buffer, to take the other path too.
    auto pad = [](int t) { return std::string(t % 2 ? 1500 : 20, static_cast<char>('a' + t)); };
    std::vector<std::thread> threads;
    std::set<std::string> expected;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([t, p = pad(t)] {
            for (int i = 0; i < kLines; ++i) {
                __android_log_print(ANDROID_LOG_DEBUG, "W", "thread %d line %d %s\n", t, i, p.c_str());
            }
        });
        for (int i = 0; i < kLines; ++i) {
            expected.insert("D/W: thread " + std::to_string(t) + " line " + std::to_string(i) + " " + pad(t));
        }
    }
    for (auto& th : threads) th.join();
    std::istringstream in(readFile(path));
    std::set<std::string> seen;
    int count = 0;
    for (std::string line; std::getline(in, line); ++count) {
        EXPECT_EQ(expected.count(line), 1u) << line.substr(0, 80);
        seen.insert(line);
    }
    EXPECT_EQ(count, kThreads * kLines);
    EXPECT_EQ(seen.size(), expected.size());
    EXPECT_EQ(test::logLines().size(), static_cast<size_t>(kThreads * kLines));
}

TEST_F(LogTest, ReadsTheEnvironmentAtTheFirstCall) {
    const std::string path = mFiles.path("child.log");
    Child child({{"KORVO_LOG", path}, {"KORVO_LOG_LEVEL", "I"}, {"KORVO_LOG_CHILD", "1"}});
    ASSERT_TRUE(child.started());
    EXPECT_EQ(child.waitExit(), 0);
    EXPECT_EQ(readFile(path), "I/C: first 1\nI/C: second\n");
}

}  // namespace
