// One meter object of the plug-in, brought up and down in the order the interface
// requires, with the polling loops every command uses.
#pragma once
#include <cstdint>
#include <string>

#include "host/Plugin.h"
#include "host/RouteGuard.h"
#include "interface/SoundMeter_vir.h"

namespace korvo {
namespace host {

// Time a tone needs after its duration to be out of the room: the fade-out block
// (20 ms), the route's latency and some slack for a loaded machine.
constexpr int kToneTailMs = 250;
// Capture before a device listens: five frames of 11.6 ms fill the ring, and the analysis
// thread, one frame per 20 ms turn, takes frames that were captured.
constexpr int kWarmUpMs = 150;

struct DeviceSettings {
    int role = 0;           // 1 listener, 2 speaker, 3 both
    bool needAck = false;
    bool setLevel = false;  // leave the detection level alone unless asked
    int level = 0;
    RouteUse routes;        // the routes the command uses: checked first, then watched
};

// How a wait ended: its goal (heard, or the time reached), time up, Ctrl-C, or a route
// that failed (its line already printed).
enum class Outcome { Done, TimedOut, Interrupted, RouteFailed };

class Device {
public:
    Device(const Plugin& plugin, RouteWatch& watch) : mPlugin(plugin), mWatch(watch) {}
    Device(const Device&) = delete;
    Device& operator=(const Device&) = delete;
    ~Device() { close(); }

    // maker -> makeToneGenerator -> start_wf_thread -> startRecord -> configuration.
    bool open(const DeviceSettings& settings, std::string* error);
    // stopRecord -> end_wf_thread -> releaseToneGenerator -> soundMeter_destroy.
    void close();

    SoundMeter_vir& meter() { return *mMeter; }

    // HearFreqIdx(code), one capture step per call, until heard (Done), the deadline
    // (monotonic ms), Ctrl-C or a failed route.
    Outcome hearUntil(int code, int64_t deadlineMs);
    // Says one code. The saying gate is re-armed first (speaker state 0): on its own
    // the state machine lets a device say once per exchange, and a device running
    // several rounds has to open it again each time.
    void sayCode(int code, int durationMs);
    // Capture steps until the deadline (Done), so the microphone stays drained while the
    // device waits.
    Outcome stepUntil(int64_t deadlineMs);
    // Ctrl-C or a failed route, if either happened.
    Outcome interruption();

private:
    const Plugin& mPlugin;
    RouteWatch& mWatch;
    SoundMeter_vir* mMeter = nullptr;
};

// The exit status that goes with an outcome: 0 done, 1 time up or a failed route, 130 Ctrl-C.
int exitStatusOf(Outcome outcome);

}  // namespace host
}  // namespace korvo
