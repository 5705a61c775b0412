// Shared by the platform tests: one fixture, bounded waits, files, and this test binary
// run again as a child process.
#pragma once
#include <signal.h>

#include <cstdint>
#include <functional>
#include <utility>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "host/core/ChildProcess.h"
#include "support/LibraryTestSupport.h"

namespace korvo {
namespace platformtest {

namespace test = korvo::platform::test;

using korvo::testing::waitFor;
std::string readFile(const std::string& path);
// A 16-bit mono WAV file's samples as an independent reader sees them (empty when unreadable).
std::vector<int16_t> readWav(const std::string& path, int* rate);

// The emulator a cross build's tests run under; empty on the build machine's own processor.
std::string emulator();

// This test binary run again with `env` changed (an empty value removes a variable); it
// takes its role from a static initialiser and exits before any test runs.
class Child : public host::ChildProcess {
public:
    explicit Child(const host::EnvList& env, bool captureStderr = false);
    bool waitReady(int timeoutMs = 15000);  // a "ready" line on its stdout
    int waitExit(int timeoutMs = 20000);     // reads its output to the end; exit status, -1 on timeout
    void kill() {
        sendSignal(SIGKILL);
        waitExit();
    }
};

// Every test starts with the test controls at their defaults and no route, log or room
// variable set; after it they, the log configuration and the files it named are put back.
class Platform : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;
    std::string tempPath(const std::string& name);  // under /tmp, removed after the test

private:
    std::vector<std::pair<std::string, std::string>> mSavedEnv;  // the variables that were set
    std::vector<std::string> mPaths;
};

}  // namespace platformtest
}  // namespace korvo
