#include "support/PlatformTestSupport.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sndfile.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <thread>

extern char** environ;

namespace korvo {
namespace platformtest {

using Clock = std::chrono::steady_clock;

bool waitUntil(const std::function<bool()>& pred, int timeoutMs) {
    const auto end = Clock::now() + std::chrono::milliseconds(timeoutMs);
    while (!pred()) {
        if (Clock::now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

std::string readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

TempFiles::~TempFiles() {
    for (const auto& p : mPaths) unlink(p.c_str());
}

std::string TempFiles::path(const std::string& name) {
    mPaths.push_back("/tmp/" + mPrefix + "-" + std::to_string(getpid()) + "-" + name);
    unlink(mPaths.back().c_str());
    return mPaths.back();
}

void EnvGuard::set(const char* name, const char* value) {
    if (!mSaved.count(name)) {
        const char* old = std::getenv(name);
        mSaved[name] = old ? std::make_unique<std::string>(old) : nullptr;
    }
    if (value) {
        setenv(name, value, 1);
    } else {
        unsetenv(name);
    }
}

void EnvGuard::restore() {
    for (auto& kv : mSaved) {
        if (kv.second) {
            setenv(kv.first.c_str(), kv.second->c_str(), 1);
        } else {
            unsetenv(kv.first.c_str());
        }
    }
    mSaved.clear();
}

Wav readWav(const std::string& path) {
    Wav w;
    SF_INFO info{};
    SNDFILE* f = sf_open(path.c_str(), SFM_READ, &info);
    if (!f) return w;
    w.rate = info.samplerate;
    w.channels = info.channels;
    w.format = info.format;
    w.frames = info.frames;
    w.samples.resize(static_cast<size_t>(info.frames * info.channels));
    w.ok = sf_readf_short(f, w.samples.data(), info.frames) == info.frames;
    sf_close(f);
    return w;
}

bool writeWav(const std::string& path, int rate, int channels, const std::vector<int16_t>& samples) {
    SF_INFO info{};
    info.samplerate = rate;
    info.channels = channels;
    info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
    SNDFILE* f = sf_open(path.c_str(), SFM_WRITE, &info);
    if (!f) return false;
    const sf_count_t frames = static_cast<sf_count_t>(samples.size()) / channels;
    const bool whole = sf_writef_short(f, samples.data(), frames) == frames;
    return sf_close(f) == 0 && whole;
}

Child::Child(const std::map<std::string, std::string>& vars) {
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) return;
    std::vector<std::string> env;
    for (char** e = environ; *e; ++e) {
        if (std::strncmp(*e, "KORVO_SIM", 9) && std::strncmp(*e, "KORVO_LOG", 9) && std::strncmp(*e, "GTEST_", 6)) {
            env.emplace_back(*e);
        }
    }
    for (const auto& kv : vars) env.push_back(kv.first + "=" + kv.second);
    std::vector<char*> envp;
    for (auto& s : env) envp.push_back(s.data());
    envp.push_back(nullptr);
    char self[4096] = {};
    if (readlink("/proc/self/exe", self, sizeof self - 1) > 0) {
        char* argv[] = {self, nullptr};
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
        if (posix_spawn(&mPid, self, &actions, nullptr, argv, envp.data()) != 0) mPid = -1;
        posix_spawn_file_actions_destroy(&actions);
    }
    close(fds[1]);
    mOut = fds[0];
}

Child::~Child() {
    if (mPid > 0) killNow();
    if (mOut >= 0) close(mOut);
}

bool Child::waitReady(int timeoutMs) {
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

int Child::waitExit(int timeoutMs) {
    if (mPid <= 0) return -2;
    const auto deadline = Clock::now() + std::chrono::milliseconds(timeoutMs);
    int status = 0;
    while (waitpid(mPid, &status, WNOHANG) == 0) {
        if (Clock::now() > deadline) return -1;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    mPid = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -2;
}

void Child::killNow() {
    if (mPid <= 0) return;
    kill(mPid, SIGKILL);
    waitpid(mPid, nullptr, 0);
    mPid = -1;
}

}  // namespace platformtest
}  // namespace korvo
