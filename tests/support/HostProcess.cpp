#include "support/HostProcess.h"

#include <signal.h>
#include <unistd.h>

#include <sstream>

#include "host/base/Clock.h"

namespace korvo {
namespace testing {

using host::monotonicMs;

bool HostProcess::start(const std::vector<std::string>& args, const EnvList& env, const std::string& stdinFile,
                        int userId) {
    std::vector<std::string> argv = {mProgram};
    argv.insert(argv.end(), args.begin(), args.end());
    host::ChildProcess::Options options;
    options.captureStderr = true;
    options.nullStdin = true;
    options.userId = userId;
    options.stdinFile = stdinFile;
    return mChild.start(mProgram, argv, env, options, nullptr);
}

bool HostProcess::waitForOutput(const std::string& text, int timeoutMs) {
    const int64_t deadline = monotonicMs() + timeoutMs;
    while (mChild.out().find(text) == std::string::npos) {
        const int64_t left = deadline - monotonicMs();
        if (left <= 0 || !mChild.pump(static_cast<int>(left))) break;
    }
    return mChild.out().find(text) != std::string::npos;
}

ProcessResult HostProcess::finish(int timeoutMs) {
    ProcessResult r;
    const int64_t deadline = monotonicMs() + timeoutMs;
    while (mChild.outputOpen() && monotonicMs() < deadline) mChild.pump(200);
    if (mChild.outputOpen()) {
        r.timedOut = true;
        mChild.sendSignal(SIGKILL);
        const int64_t giveUp = monotonicMs() + 5000;  // descendants may still hold a pipe
        while (mChild.outputOpen() && monotonicMs() < giveUp) mChild.pump(200);
    }
    if (!mChild.wait(r.timedOut ? 5000 : timeoutMs, &r.status)) {
        r.timedOut = true;
        mChild.sendSignal(SIGKILL);
        mChild.wait(5000, &r.status);
    }
    r.out = mChild.out();
    r.err = mChild.err();
    return r;
}

ProcessResult runHost(const std::string& program, const std::vector<std::string>& args, int timeoutMs,
                      const EnvList& env, const std::string& stdinFile, int userId) {
    HostProcess p(program);
    if (!p.start(args, env, stdinFile, userId)) return ProcessResult{};
    return p.finish(timeoutMs);
}

std::vector<std::string> linesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

std::string uniqueRoom(const std::string& tag) {
    static int serial = 0;
    return "t-" + tag + "-" + std::to_string(getpid()) + "-" + std::to_string(++serial);
}

bool roomExists(const std::string& room) {
    return access(("/dev/shm/korvo-" + std::to_string(geteuid()) + "/" + room).c_str(), F_OK) == 0;
}

}  // namespace testing
}  // namespace korvo
