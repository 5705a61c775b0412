#include "host/core/Plugin.h"

#include <dlfcn.h>
#include <limits.h>
#include <unistd.h>

#include <cstdlib>

namespace korvo {
namespace host {

Plugin::~Plugin() { unload(); }

std::string Plugin::defaultPath() {
    char exe[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    std::string dir = ".";
    if (n > 0) {
        std::string path(exe, static_cast<size_t>(n));
        size_t slash = path.rfind('/');
        if (slash != std::string::npos) dir = path.substr(0, slash);
    }
    return dir + "/../lib/libkorvo_soundmeter.so";
}

std::string Plugin::choosePath(const std::string& option) {
    if (!option.empty()) return option;
    const char* env = getenv("KORVO_PLUGIN");
    if (env != nullptr && *env != '\0') return env;
    return defaultPath();
}

bool Plugin::load(const std::string& path, std::string* error) {
    unload();
    // RTLD_LOCAL: nothing of the plug-in leaks into later lookups; it reaches the
    // platform stand-in through its own RUNPATH.
    mHandle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (mHandle == nullptr) {
        const char* why = dlerror();
        if (error) *error = "cannot load the plug-in " + path + ": " + (why ? why : "unknown error");
        return false;
    }
    mMaker = reinterpret_cast<soundMeter_maker_t>(dlsym(mHandle, "soundMeter_maker"));
    mDestroy = reinterpret_cast<soundMeter_destroy_t>(dlsym(mHandle, "soundMeter_destroy"));
    mReadRecord = reinterpret_cast<read_write_audio_t>(dlsym(mHandle, KORVO_READ_WRITE_AUDIO_SYMBOL));
    if (mMaker == nullptr || mDestroy == nullptr || mReadRecord == nullptr) {
        if (error) *error = "the plug-in " + path + " exports no soundMeter_maker/soundMeter_destroy/read_write_audio";
        unload();
        return false;
    }
    return true;
}

void Plugin::unload() {
    if (mHandle != nullptr) dlclose(mHandle);
    mHandle = nullptr;
    mMaker = nullptr;
    mDestroy = nullptr;
    mReadRecord = nullptr;
}

}  // namespace host
}  // namespace korvo
