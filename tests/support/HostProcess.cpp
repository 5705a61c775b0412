#include "support/HostProcess.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <sstream>

extern char** environ;

namespace korvo {
namespace testing {
namespace {

int64_t nowMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

}  // namespace

HostProcess::~HostProcess() {
    if (mPid > 0) finish(0);
}

bool HostProcess::start(const std::vector<std::string>& args, const EnvList& env) {
    const std::string& path = mProgram;
    std::vector<std::string> envText;
    for (char** e = environ; *e != nullptr; ++e) {
        std::string entry(*e);
        bool replaced = false;
        for (const auto& kv : env) {
            if (entry.compare(0, kv.first.size() + 1, kv.first + "=") == 0) replaced = true;
        }
        if (!replaced) envText.push_back(entry);
    }
    for (const auto& kv : env) {
        if (!kv.second.empty()) envText.push_back(kv.first + "=" + kv.second);
    }
    std::vector<std::string> argText = {path};
    argText.insert(argText.end(), args.begin(), args.end());
    std::vector<char*> argv;
    std::vector<char*> envp;
    for (std::string& s : argText) argv.push_back(&s[0]);
    for (std::string& s : envText) envp.push_back(&s[0]);
    argv.push_back(nullptr);
    envp.push_back(nullptr);

    int out[2];
    int err[2];
    if (pipe2(out, O_CLOEXEC) != 0) return false;
    if (pipe2(err, O_CLOEXEC) != 0) {
        close(out[0]);
        close(out[1]);
        return false;
    }
    mResult = ProcessResult{};
    mPid = fork();
    if (mPid == 0) {
        dup2(out[1], STDOUT_FILENO);
        dup2(err[1], STDERR_FILENO);
        int devnull = open("/dev/null", O_RDONLY);
        if (devnull >= 0) dup2(devnull, STDIN_FILENO);
        execve(path.c_str(), argv.data(), envp.data());
        _exit(127);
    }
    close(out[1]);
    close(err[1]);
    if (mPid < 0) {
        close(out[0]);
        close(err[0]);
        return false;
    }
    mOut = out[0];
    mErr = err[0];
    return true;
}

bool HostProcess::pump(int timeoutMs) {
    pollfd fds[2];
    int* owners[2];
    nfds_t n = 0;
    if (mOut >= 0) {
        fds[n] = {mOut, POLLIN, 0};
        owners[n++] = &mOut;
    }
    if (mErr >= 0) {
        fds[n] = {mErr, POLLIN, 0};
        owners[n++] = &mErr;
    }
    if (n == 0) return false;
    if (poll(fds, n, timeoutMs) <= 0) return true;
    for (nfds_t i = 0; i < n; ++i) {
        if (fds[i].revents == 0) continue;
        char buf[4096];
        ssize_t got = read(fds[i].fd, buf, sizeof buf);
        if (got < 0 && errno == EINTR) continue;
        if (got <= 0) {
            close(*owners[i]);
            *owners[i] = -1;
            continue;
        }
        (owners[i] == &mOut ? mResult.out : mResult.err).append(buf, static_cast<size_t>(got));
    }
    return true;
}

bool HostProcess::waitForOutput(const std::string& text, int timeoutMs) {
    int64_t deadline = nowMs() + timeoutMs;
    while (mResult.out.find(text) == std::string::npos) {
        int64_t left = deadline - nowMs();
        if (left <= 0 || !pump(static_cast<int>(left))) return mResult.out.find(text) != std::string::npos;
    }
    return true;
}

void HostProcess::sendSignal(int sig) {
    if (mPid > 0) kill(mPid, sig);
}

ProcessResult HostProcess::finish(int timeoutMs) {
    int64_t deadline = nowMs() + timeoutMs;
    int64_t giveUp = INT64_MAX;  // after a kill, descendants holding a pipe get a little while
    while ((mOut >= 0 || mErr >= 0) && nowMs() < giveUp) {
        if (giveUp == INT64_MAX && nowMs() >= deadline) {
            mResult.timedOut = true;
            kill(mPid, SIGKILL);
            giveUp = nowMs() + 5000;
        }
        pump(200);
    }
    for (int* fd : {&mOut, &mErr}) {
        if (*fd >= 0) close(*fd);
        *fd = -1;
    }
    int raw = 0;
    if (mPid > 0 && waitpid(mPid, &raw, 0) == mPid) {
        mResult.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw);
    }
    mPid = -1;
    return mResult;
}

ProcessResult runHost(const std::string& program, const std::vector<std::string>& args, int timeoutMs,
                      const EnvList& env) {
    HostProcess p(program);
    if (!p.start(args, env)) return ProcessResult{};
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
    DIR* dir = opendir("/dev/shm");
    if (dir == nullptr) return false;
    bool found = false;
    const std::string suffix = "-" + room;
    while (dirent* e = readdir(dir)) {
        std::string name = e->d_name;
        if (name.size() >= suffix.size() && name.compare(name.size() - suffix.size(), suffix.size(), suffix) == 0)
            found = true;
    }
    closedir(dir);
    return found;
}

}  // namespace testing
}  // namespace korvo
