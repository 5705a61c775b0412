#include "host/ChildProcess.h"

#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "host/Clock.h"

extern char** environ;

namespace korvo {
namespace host {

std::string selfExecutable() {
    char exe[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    return n > 0 ? std::string(exe, static_cast<size_t>(n)) : std::string("/proc/self/exe");
}

ChildProcess::~ChildProcess() {
    if (mPid > 0) {
        sendSignal(SIGKILL);
        int status = 0;
        wait(5000, &status);
    }
    if (mFd >= 0) close(mFd);
}

bool ChildProcess::start(const std::string& path, const std::vector<std::string>& args,
                         const std::vector<std::pair<std::string, std::string>>& env, std::string* error) {
    // Everything the child needs is built before fork: after it, only
    // async-signal-safe calls are allowed.
    std::vector<std::string> envText;
    for (char** e = environ; *e != nullptr; ++e) {
        std::string entry(*e);
        bool replaced = false;
        for (const auto& kv : env) {
            if (entry.compare(0, kv.first.size() + 1, kv.first + "=") == 0) replaced = true;
        }
        if (!replaced) envText.push_back(entry);
    }
    for (const auto& kv : env) envText.push_back(kv.first + "=" + kv.second);
    std::vector<char*> envp;
    for (std::string& s : envText) envp.push_back(&s[0]);
    envp.push_back(nullptr);
    std::vector<std::string> argText(args);
    std::vector<char*> argv;
    for (std::string& s : argText) argv.push_back(&s[0]);
    argv.push_back(nullptr);

    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        if (error) *error = std::string("cannot make a pipe: ") + strerror(errno);
        return false;
    }
    pid_t parent = getpid();
    pid_t pid = fork();
    if (pid < 0) {
        if (error) *error = std::string("cannot fork: ") + strerror(errno);
        close(fds[0]);
        close(fds[1]);
        return false;
    }
    if (pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        if (getppid() != parent) _exit(127);  // the parent is already gone
        dup2(fds[1], STDOUT_FILENO);          // dup2 clears close-on-exec on descriptor 1
        execve(path.c_str(), argv.data(), envp.data());
        _exit(127);
    }
    close(fds[1]);
    mPid = pid;
    mFd = fds[0];
    mPending.clear();
    return true;
}

bool ChildProcess::readLines(std::vector<std::string>* lines) {
    if (mFd < 0) return false;
    char buf[4096];
    ssize_t n = read(mFd, buf, sizeof buf);
    if (n < 0 && (errno == EINTR || errno == EAGAIN)) return true;
    if (n <= 0) {
        if (!mPending.empty()) lines->push_back(mPending);
        mPending.clear();
        close(mFd);
        mFd = -1;
        return false;
    }
    mPending.append(buf, static_cast<size_t>(n));
    size_t start = 0;
    for (size_t nl; (nl = mPending.find('\n', start)) != std::string::npos; start = nl + 1) {
        lines->push_back(mPending.substr(start, nl - start));
    }
    mPending.erase(0, start);
    return true;
}

void ChildProcess::sendSignal(int sig) {
    if (mPid > 0) kill(mPid, sig);
}

bool ChildProcess::wait(int timeoutMs, int* status) {
    if (mPid <= 0) return false;
    int64_t deadline = monotonicMs() + timeoutMs;
    for (;;) {
        int raw = 0;
        pid_t r = waitpid(mPid, &raw, WNOHANG);
        if (r == mPid) {
            *status = WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw);
            mPid = -1;
            return true;
        }
        if (r < 0 && errno != EINTR) {
            mPid = -1;
            *status = 127;
            return true;
        }
        if (monotonicMs() >= deadline) return false;
        poll(nullptr, 0, 10);  // a child has no descriptor to wait on; look again shortly
    }
}

}  // namespace host
}  // namespace korvo
