#include "host/commands/demo/DemoDevices.h"

#include <poll.h>
#include <signal.h>

#include "host/base/Clock.h"
#include "host/base/Interrupt.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

bool DemoDevices::start(Who who, const std::vector<std::string>& args, const EnvList& env, int64_t quietMs) {
    std::string error;
    ChildProcess::Options options;
    options.ownGroup = true;   // Ctrl-C reaches the demo, which stops its devices
    options.stdinPipe = true;  // the start line
    if (!mChild[who].start(selfExecutable(), args, env, options, &error)) {
        errf("cannot start the %s: %s", kWhoName[who], error.c_str());
        return false;
    }
    mOpen[who] = true;
    mQuietUntil[who] = monotonicMs() + quietMs;
    return true;
}

void DemoDevices::heardFrom(Who who, int64_t quietMs) { mQuietUntil[who] = monotonicMs() + quietMs; }

void DemoDevices::begin(int64_t quietMs) {
    for (int w = 0; w < 2; ++w) {
        mChild[w].writeLine("go");
        mQuietUntil[w] = monotonicMs() + quietMs;
    }
}

void DemoDevices::pump(const std::function<void(Who, const std::string&)>& onLine, int64_t silenceAllowedMs) {
    while (mOpen[kListener] || mOpen[kSpeaker]) {
        if (interrupted()) {
            stop();
            break;
        }
        for (int w = 0; w < 2 && mStuck.empty(); ++w) {
            if (mOpen[w] && monotonicMs() >= mQuietUntil[w]) {
                mStuck = kWhoName[w];
                errf("the %s stopped responding (no word for %lld ms)", kWhoName[w],
                     static_cast<long long>(monotonicMs() - mQuietUntil[w] + silenceAllowedMs));
            }
        }
        if (!mStuck.empty()) {
            stop();
            break;
        }
        pollfd fds[2];
        int who[2];
        nfds_t n = 0;
        for (int w = 0; w < 2; ++w) {
            if (!mOpen[w]) continue;
            fds[n] = {mChild[w].stdoutFd(), POLLIN, 0};
            who[n++] = w;
        }
        if (poll(fds, n, 100) <= 0) continue;
        for (nfds_t i = 0; i < n; ++i) {
            if (fds[i].revents == 0) continue;
            ChildProcess& child = mChild[who[i]];
            if (!child.pump(0)) mOpen[who[i]] = false;
            for (const std::string& line : child.takeLines()) onLine(static_cast<Who>(who[i]), line);
        }
        // A device whose output ended before its last line ("done") died or gave up:
        // the demo ends at once instead of waiting for its peer's rounds to time out.
        for (int w = 0; w < 2; ++w) {
            if (!mOpen[w] && !mDone[w]) stop();
        }
        if (mStopped) break;
    }
}

void DemoDevices::stop() {
    for (int w = 0; w < 2; ++w) {
        if (mChild[w].running() && mOpen[w]) mKilled[w] = true;
        mChild[w].sendSignal(interrupted() ? SIGTERM : SIGKILL);
    }
    mStopped = true;
}

void DemoDevices::finish() {
    for (int w = 0; w < 2; ++w) {
        if (!mChild[w].running()) continue;
        if (!mChild[w].wait(10000, &mStatus[w])) {
            mChild[w].sendSignal(SIGKILL);
            mChild[w].wait(5000, &mStatus[w]);
        }
        mSignal[w] = mChild[w].endSignal();
    }
}

std::vector<pid_t> DemoDevices::running() const {
    std::vector<pid_t> devices;
    for (const ChildProcess& child : mChild) {
        if (child.running()) devices.push_back(child.pid());
    }
    return devices;
}

std::string DemoDevices::failures() const {
    std::string failed;
    for (int w = 0; w < 2; ++w) {
        if (mStatus[w] <= 0 || mKilled[w]) continue;  // 0: finished well; -1: never started
        failed += std::string(failed.empty() ? "" : ", ") + "the " + kWhoName[w] +
                  (mSignal[w] ? " was killed by signal " + std::to_string(mSignal[w])
                              : " ended with status " + std::to_string(mStatus[w]));
    }
    return failed;
}

}  // namespace host
}  // namespace korvo
