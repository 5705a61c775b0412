#include "routes/card/CardSession.h"

#include <dlfcn.h>
#include <log/log.h>

#include <cstdarg>
#include <cstdio>

#include "routes/card/CardRuntimeDir.h"
#include "routes/card/JackLeftovers.h"

#if defined(__SANITIZE_ADDRESS__)
#define KORVO_LEAK_CHECKER 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(leak_sanitizer)
#define KORVO_LEAK_CHECKER 1
#endif
#endif
#ifdef KORVO_LEAK_CHECKER
#include <sanitizer/lsan_interface.h>
#endif

namespace korvo {
namespace platform {
namespace card {

namespace {

constexpr const char* kTag = "SoundCard";

// The audio back-ends under PortAudio print pages of probing chatter to stderr
// (every missing card, every absent server); send it to the log instead. Looked
// up at run time: they are PortAudio's dependencies, not ours.
void backendChatter(const char* /*file*/, int /*line*/, const char* /*function*/, int /*err*/,
                    const char* fmt, ...) {
    char text[512];
    va_list args;
    va_start(args, fmt);
    std::vsnprintf(text, sizeof text, fmt, args);
    va_end(args);
    __android_log_print(ANDROID_LOG_VERBOSE, kTag, "alsa: %s", text);
}

void serverChatter(const char* text) { __android_log_print(ANDROID_LOG_VERBOSE, kTag, "jack: %s", text); }

void quietBackends() {
    using AlsaHandler = void (*)(const char*, int, const char*, int, const char*, ...);
    using AlsaSetter = int (*)(AlsaHandler);
    using JackSetter = void (*)(void (*)(const char*));
    if (void* f = dlsym(RTLD_DEFAULT, "snd_lib_error_set_handler")) {
        reinterpret_cast<AlsaSetter>(f)(&backendChatter);
    }
    for (const char* name : {"jack_set_error_function", "jack_set_info_function"}) {
        if (void* f = dlsym(RTLD_DEFAULT, name)) reinterpret_cast<JackSetter>(f)(&serverChatter);
    }
}

}  // namespace

std::mutex& paLock() {
    static std::mutex m;
    return m;
}

Session::Session() {
    std::lock_guard<std::mutex> lock(paLock());
    static const bool quiet = (quietBackends(), true);
    (void)quiet;
    acquireRuntimeDir();
    JackLeftovers leftovers;
    {
#ifdef KORVO_LEAK_CHECKER
        // The start-up opens every device that ALSA's configuration defines, and ALSA
        // loads and unloads a plug-in library for each. One of them (the a52 encoder,
        // through its video codecs) keeps heap blocks from its static start-up, which
        // the leak checker reports once that library is unloaded. Not ours to fix.
        __lsan::ScopedDisabler notOurs;
#endif
        mStatus = Pa_Initialize();
    }
    leftovers.tidy(mStatus == paNoError && Pa_HostApiTypeIdToHostApiIndex(paJACK) >= 0);
}

Session::~Session() {
    std::lock_guard<std::mutex> lock(paLock());
    if (mStatus == paNoError) Pa_Terminate();
    releaseRuntimeDir();
}

std::string Session::error() const { return "the sound system cannot start: " + errorText(mStatus); }

std::string errorText(PaError err) {
    std::string text = Pa_GetErrorText(err);
    if (err == paUnanticipatedHostError) {
        const PaHostErrorInfo* host = Pa_GetLastHostErrorInfo();
        if (host && host->errorText && host->errorText[0]) text += std::string(" (") + host->errorText + ")";
    }
    return text;
}

}  // namespace card
}  // namespace platform
}  // namespace korvo
