// Helpers shared by the platform tests: a fixture, bounded waits, temporary files, scoped
// environment variables, WAV files and re-runs of the test binary as a child.
#pragma once
#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "host/ChildProcess.h"

namespace korvo {
namespace platformtest {

namespace test = korvo::platform::test;

// Polls `pred` until it holds; false when `timeoutMs` ran out first.
bool waitUntil(const std::function<bool()>& pred, int timeoutMs = 5000);

std::string readFile(const std::string& path);

// Paths under /tmp private to this process; each is removed when handed out and at the end.
class TempFiles {
public:
    explicit TempFiles(std::string prefix) : mPrefix(std::move(prefix)) {}
    ~TempFiles();
    std::string path(const std::string& name);

private:
    std::string mPrefix;
    std::vector<std::string> mPaths;
};

// Sets (or, with nullptr, unsets) variables; the old values come back on restore() or at the end.
class EnvGuard {
public:
    ~EnvGuard() { restore(); }
    void set(const char* name, const char* value);
    void restore();

private:
    std::map<std::string, std::unique_ptr<std::string>> mSaved;
};

struct Wav {
    bool ok = false;
    int rate = 0, channels = 0, format = 0;
    int64_t frames = 0;
    std::vector<int16_t> samples;  // interleaved
};
Wav readWav(const std::string& path);
// 16-bit WAV of interleaved samples; false when it could not be written whole.
bool writeWav(const std::string& path, int rate, int channels, const std::vector<int16_t>& samples);

// This test binary started again with `vars` added to the environment (the parent's
// room and log settings left out); its stdout is a pipe to us. The child is killed if
// still running when this goes.
class Child {
public:
    explicit Child(const std::map<std::string, std::string>& vars);
    bool started() const { return mProcess.running(); }
    // Waits (bounded) for a "ready\n" line on the child's stdout.
    bool waitReady(int timeoutMs = 15000);
    // Exit code; -1 when it did not end in time, -2 when it did not exit normally.
    int waitExit(int timeoutMs = 20000);
    void killNow();

private:
    host::ChildProcess mProcess;
};

// Every test starts and ends with the test-control settings at their defaults and starts
// with the null routes in force; the environment and the temporary files it changed are
// put back after it.
class PlatformFixture : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        mEnv.set("KORVO_MIC", nullptr);
        mEnv.set("KORVO_SPEAKER", nullptr);
    }
    void TearDown() override { test::resetAll(); }
    EnvGuard mEnv;
    TempFiles mFiles{"korvo-platform-test"};
};

}  // namespace platformtest
}  // namespace korvo
