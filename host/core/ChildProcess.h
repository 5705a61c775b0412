// A child process with its standard output (and optionally its standard error) on
// pipes that the parent reads, with bounded waits. Used by the demo for its devices
// and by the tests for the soundmeter command.
#pragma once
#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace korvo {
namespace host {

// Variables added to the child's environment; an empty value removes the variable.
using EnvList = std::vector<std::pair<std::string, std::string>>;

class ChildProcess {
public:
    struct Options {
        bool captureStderr = false;  // else stderr is shared with the parent
        bool nullStdin = false;      // else stdin is shared with the parent
        bool ownGroup = false;       // a process group of its own: the terminal's Ctrl-C reaches only the parent
        int userId = -1;             // run as this user (and its group), when the parent may
        std::string stdinFile;       // when set, stdin reads this file instead
        bool stdinPipe = false;      // else stdin is a pipe the parent writes (writeLine)
    };

    ChildProcess() = default;
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;
    ~ChildProcess();  // a child still running is killed and reaped

    // Runs `path` with `args` (args[0] included) and the parent's environment changed
    // by `env`. The child gets SIGTERM if the parent dies first.
    bool start(const std::string& path, const std::vector<std::string>& args, const EnvList& env,
               const Options& options, std::string* error);

    int stdoutFd() const { return mFd[0]; }
    // Waits up to timeoutMs for output and appends what the pipes hold to out() and
    // err(); false once every pipe is closed.
    bool pump(int timeoutMs);
    const std::string& out() const { return mText[0]; }
    const std::string& err() const { return mText[1]; }
    // Takes the complete lines of stdout collected so far (and the unterminated rest
    // once the pipe is closed).
    std::vector<std::string> takeLines();
    bool outputOpen() const { return mFd[0] >= 0 || mFd[1] >= 0; }
    // Writes one line to the child's stdin pipe; false when there is none or it is closed.
    bool writeLine(const std::string& line);

    void sendSignal(int sig);
    // Reaps the child within timeoutMs; true with its exit status (128 + signal when a
    // signal ended it).
    bool wait(int timeoutMs, int* status);
    // The signal that ended the child reaped last, 0 when it exited.
    int endSignal() const { return mEndSignal; }
    bool running() const { return mPid > 0; }
    pid_t pid() const { return mPid; }

private:
    pid_t mPid = -1;
    int mFd[2] = {-1, -1};  // stdout, stderr
    int mStdin = -1;        // the write end of the child's stdin, when piped
    std::string mText[2];
    size_t mTaken = 0;  // stdout text already handed out as lines
    int mEndSignal = 0;
};

// The path of this executable, for re-executing itself.
std::string selfExecutable();

}  // namespace host
}  // namespace korvo
