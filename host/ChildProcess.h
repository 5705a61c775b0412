// A child process whose standard output the parent reads line by line.
#pragma once
#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace korvo {
namespace host {

class ChildProcess {
public:
    ChildProcess() = default;
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;
    ~ChildProcess();  // a child still running is killed and reaped

    // Runs `path` with `args` (args[0] included) and the parent's environment plus
    // `env`; stdin and stderr are shared, stdout is a pipe. The child gets SIGTERM
    // if the parent dies first.
    bool start(const std::string& path, const std::vector<std::string>& args,
               const std::vector<std::pair<std::string, std::string>>& env, std::string* error);

    int stdoutFd() const { return mFd; }
    // Reads what the pipe holds now and appends the complete lines; false once the
    // child has closed its end (the rest, if unterminated, is appended too).
    bool readLines(std::vector<std::string>* lines);

    void sendSignal(int sig);
    // Reaps the child within timeoutMs; true with its exit status (128 + signal
    // when a signal ended it).
    bool wait(int timeoutMs, int* status);
    bool running() const { return mPid > 0; }

private:
    pid_t mPid = -1;
    int mFd = -1;
    std::string mPending;
};

// The path of this executable, for re-executing itself.
std::string selfExecutable();

}  // namespace host
}  // namespace korvo
