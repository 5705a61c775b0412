// The demo's two devices, each a child process running "soundmeter handshake": started
// together, their protocol lines read as they come, and stopped at once when one ends
// before its last line, stops responding, or Ctrl-C comes.
#pragma once
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "host/commands/demo/DemoRounds.h"
#include "host/core/ChildProcess.h"

namespace korvo {
namespace host {

class DemoDevices {
public:
    // Starts a device; false after saying why. It must speak within `quietMs`.
    bool start(Who who, const std::vector<std::string>& args, const EnvList& env, int64_t quietMs);
    // Reads both devices' lines, each to `onLine`, until both have closed their output or the
    // devices were stopped. A device silent past its time is named as stuck, one that ended
    // before its last line stops both.
    void pump(const std::function<void(Who, const std::string&)>& onLine, int64_t silenceAllowedMs);
    // A device spoke: it may stay silent for `quietMs` from now.
    void heardFrom(Who who, int64_t quietMs);
    // The device said its last line: its end is no failure.
    void done(Who who) { mDone[who] = true; }
    // Both devices begin their rounds ("go" on their standard input).
    void begin(int64_t quietMs);
    // SIGTERM after Ctrl-C (they end in order); else SIGKILL, as a stopped device ignores SIGTERM.
    void stop();
    bool stopped() const { return mStopped; }
    bool stuck() const { return !mStuck.empty(); }
    // Waits for both to end.
    void finish();
    // The devices running now.
    std::vector<pid_t> running() const;
    // Devices that ended on their own before their last line, in a few words ("the listener was
    // killed by signal 9"); empty when none did.
    std::string failures() const;

private:
    ChildProcess mChild[2];
    bool mOpen[2] = {false, false};   // its output not closed yet
    bool mDone[2] = {false, false};   // said its last line
    bool mKilled[2] = {false, false};  // stopped by the demo, its status not its own
    int64_t mQuietUntil[2] = {0, 0};  // a device silent past this has stopped responding
    int mStatus[2] = {-1, -1};
    int mSignal[2] = {0, 0};  // the signal that ended it, 0 when it exited
    std::string mStuck;       // the device that stopped responding
    bool mStopped = false;
};

}  // namespace host
}  // namespace korvo
