#include "support/PlatformTestSupport.h"

#include <sndfile.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <thread>

#include <korvo/platform/Log.h>

namespace korvo {
namespace platformtest {

std::string readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

std::vector<int16_t> readWav(const std::string& path, int* rate) {
    SF_INFO info{};
    SNDFILE* f = sf_open(path.c_str(), SFM_READ, &info);
    std::vector<int16_t> samples(f && info.channels == 1 ? size_t(info.frames) : 0);
    if (f && sf_readf_short(f, samples.data(), sf_count_t(samples.size())) != info.frames) samples.clear();
    if (f) sf_close(f);
    *rate = info.samplerate;
    return samples;
}

std::string emulator() { return KORVO_TEST_EMULATOR; }

Child::Child(const host::EnvList& env, bool captureStderr) {
    std::string error;
    host::ChildProcess::Options options;
    options.captureStderr = captureStderr;
    options.nullStdin = true;
    const std::string through = emulator();
    if (through.empty()) {
        EXPECT_TRUE(start(host::selfExecutable(), {"child"}, env, options, &error)) << error;
    } else {
        // qemu-user's -0 sets the program's argv[0].
        EXPECT_TRUE(start(through, {through, "-0", "child", host::selfExecutable()}, env, options, &error)) << error;
    }
}

bool Child::waitReady(int timeoutMs) {
    const auto ready = [&] { return out().find("ready\n") != std::string::npos; };
    return waitFor([&] { return !pump(10) || ready(); }, timeoutMs) && ready();
}

int Child::waitExit(int timeoutMs) {
    waitFor([&] { return !pump(10); }, timeoutMs);
    int status = -1;
    return wait(timeoutMs, &status) ? status : -1;
}

const char* const kVariables[] = {"KORVO_MIC",      "KORVO_SPEAKER",   "KORVO_LOG",     "KORVO_LOG_LEVEL",
                                  "KORVO_SIM_GAIN", "KORVO_SIM_NOISE", "KORVO_SIM_SEED"};

void Platform::SetUp() {
    test::resetAll();
    for (const char* name : kVariables) {
        if (const char* value = std::getenv(name)) mSavedEnv.emplace_back(name, value);
        unsetenv(name);
    }
}

void Platform::TearDown() {
    test::resetAll();
    for (const char* name : kVariables) unsetenv(name);
    for (const auto& [name, value] : mSavedEnv) setenv(name.c_str(), value.c_str(), 1);
    korvo::platform::reloadLogConfig();
    for (const auto& path : mPaths) unlink(path.c_str());
}

std::string Platform::tempPath(const std::string& name) {
    mPaths.push_back("/tmp/korvo-platform-test-" + std::to_string(getpid()) + "-" + name);
    unlink(mPaths.back().c_str());
    return mPaths.back();
}

}  // namespace platformtest
}  // namespace korvo
