// One meter object of the plug-in, brought up and down in the order the interface
// requires, with the polling loops every command uses.
#pragma once
#include <array>
#include <cstdint>
#include <memory>
#include <string>

#include "host/core/FrameTap.h"
#include "host/core/Plugin.h"
#include "host/core/RouteGuard.h"
#include "host/base/Clock.h"
#include "interface/SoundMeterConstants.h"
#include "interface/SoundMeter_vir.h"

namespace korvo {
namespace host {


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

    // One capture step (processAudio), and the frame it completed, if any, kept for taking.
    void step();
    // Capture steps made since the microphone started: each reads one frame.
    int64_t steps() const { return mSteps; }
    // The frames captured since the last call, oldest first, into `out` (up to
    // kKeptFrames; older ones are gone); their count. Valid until the next step.
    static constexpr int kKeptFrames = 32;
    int takeFrames(const int16_t** out);
    // Frames captured since the microphone started, taken or not.
    int64_t framesCaptured() const { return mFramesCaptured; }
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
    int64_t mSteps = 0;
    std::unique_ptr<FrameTap> mTap;
    std::array<std::array<int16_t, korvo::kFrameSamples>, kKeptFrames> mKept{};
    int64_t mFramesCaptured = 0;
    int64_t mFramesTaken = 0;  // frames up to this count were taken or dropped
};

// The exit status that goes with an outcome: 0 done, 1 time up or a failed route, 130 Ctrl-C.
int exitStatusOf(Outcome outcome);

}  // namespace host
}  // namespace korvo
