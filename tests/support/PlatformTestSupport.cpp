#include "support/PlatformTestSupport.h"

#include <signal.h>
#include <sndfile.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <thread>

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
    // The parent's room and log settings are left out (an empty value removes a variable).
    host::EnvList env = {{"KORVO_SIM_GAIN", ""}, {"KORVO_SIM_NOISE", ""}, {"KORVO_SIM_SEED", ""},
                         {"KORVO_LOG", ""},      {"KORVO_LOG_LEVEL", ""}};
    env.insert(env.end(), vars.begin(), vars.end());
    std::string error;
    if (!mProcess.start(host::selfExecutable(), {"child"}, env, {false, true}, &error)) ADD_FAILURE() << error;
}

bool Child::waitReady(int timeoutMs) {
    const auto ready = [&] { return mProcess.out().find("ready\n") != std::string::npos; };
    return waitUntil([&] { return !mProcess.pump(10) || ready(); }, timeoutMs) && ready();
}

int Child::waitExit(int timeoutMs) {
    int status = 0;
    if (!mProcess.wait(timeoutMs, &status)) return -1;
    return status >= 128 ? -2 : status;
}

void Child::killNow() {
    mProcess.sendSignal(SIGKILL);
    int status = 0;
    mProcess.wait(5000, &status);
}

}  // namespace platformtest
}  // namespace korvo
