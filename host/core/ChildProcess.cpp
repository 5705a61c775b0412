#include "host/core/ChildProcess.h"

#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "host/base/Clock.h"

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
    for (int fd : mFd) {
        if (fd >= 0) close(fd);
    }
    if (mStdin >= 0) close(mStdin);
}

bool ChildProcess::start(const std::string& path, const std::vector<std::string>& args, const EnvList& env,
                         const Options& options, std::string* error) {
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
    for (const auto& kv : env) {
        if (!kv.second.empty()) envText.push_back(kv.first + "=" + kv.second);
    }
    std::vector<char*> envp;
    for (std::string& s : envText) envp.push_back(&s[0]);
    envp.push_back(nullptr);
    std::vector<std::string> argText(args);
    std::vector<char*> argv;
    for (std::string& s : argText) argv.push_back(&s[0]);
    argv.push_back(nullptr);

    int input = -1;
    if (!options.stdinFile.empty()) {
        input = open(options.stdinFile.c_str(), O_RDONLY | O_CLOEXEC);
        if (input < 0) {
            if (error) *error = "cannot open " + options.stdinFile + ": " + strerror(errno);
            return false;
        }
    }
    int pipes[2][2] = {{-1, -1}, {-1, -1}};
    const int count = options.captureStderr ? 2 : 1;
    int feed[2] = {-1, -1};
    if (options.stdinPipe && input < 0) {
        if (pipe2(feed, O_CLOEXEC) != 0) {
            if (error) *error = std::string("cannot make a pipe: ") + strerror(errno);
            return false;
        }
        input = feed[0];
    }
    for (int i = 0; i < count; ++i) {
        if (pipe2(pipes[i], O_CLOEXEC) != 0) {
            if (error) *error = std::string("cannot make a pipe: ") + strerror(errno);
            for (auto& p : pipes) {
                for (int fd : p) {
                    if (fd >= 0) close(fd);
                }
            }
            if (input >= 0) close(input);
            if (feed[1] >= 0) close(feed[1]);
            return false;
        }
    }
    pid_t parent = getpid();
    pid_t pid = fork();
    if (pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        if (getppid() != parent) _exit(127);  // the parent is already gone
        if (options.ownGroup) setpgid(0, 0);
        if (options.userId >= 0 && (setgid(gid_t(options.userId)) != 0 || setuid(uid_t(options.userId)) != 0)) _exit(126);
        dup2(pipes[0][1], STDOUT_FILENO);     // dup2 clears close-on-exec on the copy
        if (count == 2) dup2(pipes[1][1], STDERR_FILENO);
        if (input >= 0) {
            dup2(input, STDIN_FILENO);
        } else if (options.nullStdin) {
            int devnull = open("/dev/null", O_RDONLY);
            if (devnull >= 0) dup2(devnull, STDIN_FILENO);
        }
        execve(path.c_str(), argv.data(), envp.data());
        _exit(127);
    }
    for (int i = 0; i < count; ++i) close(pipes[i][1]);
    if (input >= 0) close(input);
    if (pid < 0) {
        if (error) *error = std::string("cannot fork: ") + strerror(errno);
        for (int i = 0; i < count; ++i) close(pipes[i][0]);
        if (feed[1] >= 0) close(feed[1]);
        return false;
    }
    if (mStdin >= 0) close(mStdin);
    mStdin = feed[1];
    mPid = pid;
    mFd[0] = pipes[0][0];
    mFd[1] = pipes[1][0];
    mText[0].clear();
    mText[1].clear();
    mTaken = 0;
    return true;
}

bool ChildProcess::pump(int timeoutMs) {
    pollfd fds[2];
    int which[2];
    nfds_t n = 0;
    for (int i = 0; i < 2; ++i) {
        if (mFd[i] < 0) continue;
        fds[n] = {mFd[i], POLLIN, 0};
        which[n++] = i;
    }
    if (n == 0) return false;
    if (poll(fds, n, timeoutMs) <= 0) return true;
    for (nfds_t k = 0; k < n; ++k) {
        if (fds[k].revents == 0) continue;
        const int i = which[k];
        char buf[4096];
        ssize_t got = read(mFd[i], buf, sizeof buf);
        if (got < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (got <= 0) {
            close(mFd[i]);
            mFd[i] = -1;
            continue;
        }
        mText[i].append(buf, static_cast<size_t>(got));
    }
    return outputOpen();
}

std::vector<std::string> ChildProcess::takeLines() {
    std::vector<std::string> lines;
    const std::string& text = mText[0];
    for (size_t nl; (nl = text.find('\n', mTaken)) != std::string::npos; mTaken = nl + 1) {
        lines.push_back(text.substr(mTaken, nl - mTaken));
    }
    if (mFd[0] < 0 && mTaken < text.size()) {
        lines.push_back(text.substr(mTaken));
        mTaken = text.size();
    }
    return lines;
}

bool ChildProcess::writeLine(const std::string& line) {
    if (mStdin < 0) return false;
    const std::string text = line + "\n";
    // A short line into an empty pipe is written whole; a child that is gone gives EPIPE,
    // as SIGPIPE is ignored.
    const ssize_t n = write(mStdin, text.data(), text.size());
    return n == static_cast<ssize_t>(text.size());
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
            mEndSignal = WIFSIGNALED(raw) ? WTERMSIG(raw) : 0;
            mPid = -1;
            return true;
        }
        if (r < 0 && errno != EINTR) {
            mPid = -1;
            mEndSignal = 0;
            *status = 127;
            return true;
        }
        if (monotonicMs() >= deadline) return false;
        poll(nullptr, 0, 10);  // a child has no descriptor to wait on; look again shortly
    }
}

}  // namespace host
}  // namespace korvo
