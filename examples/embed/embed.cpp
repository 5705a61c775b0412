// A product embedding the korvo_soundmeter plug-in: two devices in a simulated room
// exchange one code. The speaker says code 3, the listener hears it and answers 4, the
// speaker hears the answer. Exit status 0 when the exchange completed, 1 otherwise.
//
// KORVO_SOUNDMETER_PLUGIN is the installed plug-in's path: find_package(korvo_soundmeter)
// defines it, or pkg-config --variable=plugin korvo_soundmeter gives it (see the Makefile).
#include <dlfcn.h>
#include <poll.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include <SoundMeterConstants.h>
#include <SoundMeter_vir.h>

#ifndef KORVO_SOUNDMETER_PLUGIN
#error "define KORVO_SOUNDMETER_PLUGIN as the plug-in's path (find_package or pkg-config give it)"
#endif

namespace {

constexpr int kCode = 3;                  // the speaker's code; the answer is kCode + 1
constexpr int kToneMs = 300;
constexpr long kReadyDeadlineMs = 10000;  // the listener's start-up
constexpr long kHearDeadlineMs = 5000;    // from the moment the code can be said
constexpr unsigned kDeviceLimitS = 60;    // a device stuck in the plug-in ends here

const char* gWho = "embed";  // this process, as its lines name it

long nowMs() {
    timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec * 1000L + ts.tv_nsec / 1000000L;
}

// One line: progress on standard output, errors on standard error.
__attribute__((format(printf, 2, 3))) void report(FILE* to, const char* format, ...) {
    std::fprintf(to, "%s: ", gWho);
    va_list args;
    va_start(args, format);
    std::vfprintf(to, format, args);
    va_end(args);
    std::fputc('\n', to);
}

// One capture step per HearFreqIdx call, until the code is heard or the deadline passes.
bool hear(SoundMeter_vir* meter, int code, long deadlineMs) {
    while (nowMs() < deadlineMs) {
        if (meter->HearFreqIdx(code) == code) return true;
    }
    report(stderr, "code %d not heard within %ld ms", code, kHearDeadlineMs);
    return false;
}

// On its own the state machine lets a device say once per exchange: opening the saying
// gate first means a say is never refused.
void say(SoundMeter_vir* meter, int code) {
    meter->setSpeakerState(0);
    meter->SayFreqIdx(code, kToneMs);
    report(stdout, "said code %d", code);
}

bool runListener(SoundMeter_vir* meter, int readyFd) {
    // Only now may the speaker say: a code said earlier could fall into our warm-up.
    if (write(readyFd, "r", 1) != 1) {
        report(stderr, "cannot tell the speaker it is ready: %s", std::strerror(errno));
        return false;
    }
    report(stdout, "ready");
    const long start = nowMs();
    if (!hear(meter, kCode, start + kHearDeadlineMs)) return false;
    report(stdout, "heard code %d after %ld ms", kCode, nowMs() - start);
    const long said = nowMs();
    say(meter, kCode + 1);
    // Keep capturing while the answer sounds: tearing down now would cut it off.
    while (nowMs() < said + kToneMs + korvo::kToneTailMs) meter->processAudio();
    return true;
}

bool runSpeaker(SoundMeter_vir* meter, int readyFd) {
    // Capture while waiting: a microphone that is not read falls behind the room.
    for (const long deadline = nowMs() + kReadyDeadlineMs;;) {
        pollfd ready = {readyFd, POLLIN, 0};
        char c;
        if (poll(&ready, 1, 0) > 0) {
            if (read(readyFd, &c, 1) == 1) break;
            report(stderr, "the listener ended before it was ready");
            return false;
        }
        if (nowMs() >= deadline) {
            report(stderr, "the listener was not ready within %ld ms", kReadyDeadlineMs);
            return false;
        }
        meter->processAudio();
    }
    const long said = nowMs();
    say(meter, kCode);
    if (!hear(meter, kCode + 1, said + kHearDeadlineMs)) return false;
    report(stdout, "heard code %d after %ld ms", kCode + 1, nowMs() - said);
    return true;
}

// One device, in a process of its own: the plug-in's frame record and analysis thread
// are one per process. Returns the process's exit status.
int runDevice(bool speaker, const std::string& room, int readyFd) {
    gWho = speaker ? "speaker" : "listener";
    alarm(kDeviceLimitS);
    // The plug-in takes its audio routes from the environment: set them before loading it.
    const std::string route = "sim:" + room;
    setenv("KORVO_MIC", route.c_str(), 1);
    setenv("KORVO_SPEAKER", route.c_str(), 1);

    void* lib = dlopen(KORVO_SOUNDMETER_PLUGIN, RTLD_NOW | RTLD_LOCAL);
    if (lib == nullptr) {
        report(stderr, "cannot load the plug-in: %s", dlerror());
        return 1;
    }
    auto maker = reinterpret_cast<soundMeter_maker_t>(dlsym(lib, "soundMeter_maker"));
    auto destroy = reinterpret_cast<soundMeter_destroy_t>(dlsym(lib, "soundMeter_destroy"));
    if (maker == nullptr || destroy == nullptr) {
        report(stderr, "the plug-in %s exports no soundMeter_maker/soundMeter_destroy", KORVO_SOUNDMETER_PLUGIN);
        dlclose(lib);
        return 1;
    }
    report(stdout, "plug-in loaded");

    // Bring-up in the order the plug-in requires: the tone generator before anything
    // plays, the process's analysis thread before anything hears, then the microphone.
    SoundMeter_vir* meter = maker();
    std::fputc('\n', stdout);  // the plug-in writes "Created" without a line end
    meter->makeToneGenerator(AUDIO_STREAM_MUSIC);
    meter->start_wf_thread();
    meter->startRecord();
    meter->setRole(speaker ? 2 : 3);  // 2 speaker; the listener answers, so 1 + 2
    meter->setNeedAck(true);
    // The capture ring starts with stale memory: until it holds captured sound, a
    // read-out can show a code nobody said.
    for (int i = 0; i < korvo::kWarmUpSteps; ++i) meter->processAudio();
    report(stdout, "meter up in room %s", room.c_str());

    const bool done = speaker ? runSpeaker(meter, readyFd) : runListener(meter, readyFd);

    // Tear-down in the reverse order; the last device to leave the room removes it.
    meter->stopRecord();
    meter->end_wf_thread();
    meter->releaseToneGenerator();
    destroy(meter);
    std::fputc('\n', stdout);  // after "deleted"
    dlclose(lib);
    report(stdout, "down");
    return done ? 0 : 1;
}

}  // namespace

int main() {
    setvbuf(stdout, nullptr, _IOLBF, 0);  // two processes share the output: whole lines
    const std::string room = "embed-" + std::to_string(getpid());  // fresh: nobody else's
    report(stdout, "room %s, plug-in %s", room.c_str(), KORVO_SOUNDMETER_PLUGIN);

    int ready[2];  // the listener tells the speaker when it hears
    if (pipe(ready) != 0) {
        report(stderr, "cannot make a pipe: %s", std::strerror(errno));
        return 1;
    }
    // Fork before anything loads the plug-in: each process gets its own.
    const char* names[2] = {"listener", "speaker"};
    pid_t pids[2];
    for (int d = 0; d < 2; ++d) {
        pids[d] = fork();
        if (pids[d] == 0) {
            close(ready[d == 0 ? 0 : 1]);
            std::exit(runDevice(d == 1, room, ready[d == 0 ? 1 : 0]));
        }
        if (pids[d] < 0) report(stderr, "cannot start the %s: %s", names[d], std::strerror(errno));
    }
    close(ready[0]);
    close(ready[1]);

    std::string failed;
    for (int d = 0; d < 2; ++d) {
        int status = 0;
        if (pids[d] > 0 && waitpid(pids[d], &status, 0) == pids[d] && WIFEXITED(status) && WEXITSTATUS(status) == 0) continue;
        const std::string why = pids[d] < 0            ? std::string("not started")
                                : WIFSIGNALED(status) ? std::string("killed: ") + strsignal(WTERMSIG(status))
                                                      : "exit status " + std::to_string(WEXITSTATUS(status));
        failed += (failed.empty() ? "the " : ", the ") + std::string(names[d]) + " failed (" + why + ")";
    }
    if (!failed.empty()) {
        report(stderr, "exchange incomplete: %s", failed.c_str());
        return 1;
    }
    report(stdout, "exchange complete: code %d said and heard, answer %d said and heard", kCode, kCode + 1);
    return 0;
}
