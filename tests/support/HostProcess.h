// Running a program (the soundmeter host) as a child process, with bounded waits, for the
// tests that treat it as a user would.
#pragma once
#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace korvo {
namespace testing {

struct ProcessResult {
    int status = -1;        // exit status, 128 + signal when a signal ended it
    bool timedOut = false;  // killed because it ran past its time
    std::string out;
    std::string err;
};

using EnvList = std::vector<std::pair<std::string, std::string>>;

// A child started in the background; its output is collected while the test waits.
class HostProcess {
public:
    explicit HostProcess(std::string program) : mProgram(std::move(program)) {}
    HostProcess(const HostProcess&) = delete;
    HostProcess& operator=(const HostProcess&) = delete;
    ~HostProcess();  // kills and reaps a child still running

    // Runs the program with the arguments (without argv[0]) and the environment
    // plus `env`; an empty value removes the variable.
    bool start(const std::vector<std::string>& args, const EnvList& env = {});
    // Collects output until stdout holds `text` or the time is up.
    bool waitForOutput(const std::string& text, int timeoutMs);
    void sendSignal(int sig);
    // Collects output until the child ends; kills it after timeoutMs.
    ProcessResult finish(int timeoutMs);

private:
    bool pump(int timeoutMs);  // false when both pipes are closed

    std::string mProgram;
    pid_t mPid = -1;
    int mOut = -1;
    int mErr = -1;
    ProcessResult mResult;
};

// Runs the program to its end, killing it after timeoutMs.
ProcessResult runHost(const std::string& program, const std::vector<std::string>& args, int timeoutMs,
                      const EnvList& env = {});

// Lines of a text (without their line ends).
std::vector<std::string> linesOf(const std::string& text);
// A room name of its own for every test and process.
std::string uniqueRoom(const std::string& tag);
// Whether a shared-memory object naming the room exists.
bool roomExists(const std::string& room);

}  // namespace testing
}  // namespace korvo
