// The soundmeter command as a child process, with bounded waits, for the tests that
// use it as a user would.
#pragma once
#include <string>
#include <vector>

#include "host/core/ChildProcess.h"

namespace korvo {
namespace testing {

using host::EnvList;

struct ProcessResult {
    int status = -1;        // exit status, 128 + signal when a signal ended it
    bool timedOut = false;  // killed because it ran past its time
    std::string out;
    std::string err;
};

class HostProcess {
public:
    explicit HostProcess(std::string program) : mProgram(std::move(program)) {}
    // Runs the program with the arguments (without argv[0]); stdin is /dev/null, or the
    // file stdinFile when given; as another user when userId is set.
    bool start(const std::vector<std::string>& args, const EnvList& env = {}, const std::string& stdinFile = "",
               int userId = -1);
    // Collects output until stdout holds `text` or the time is up.
    bool waitForOutput(const std::string& text, int timeoutMs);
    void sendSignal(int sig) { mChild.sendSignal(sig); }
    pid_t pid() const { return mChild.pid(); }
    // Collects output until the child ends; kills it after timeoutMs.
    ProcessResult finish(int timeoutMs);

private:
    std::string mProgram;
    host::ChildProcess mChild;
};

// Runs the program to its end, killing it after timeoutMs.
ProcessResult runHost(const std::string& program, const std::vector<std::string>& args, int timeoutMs,
                      const EnvList& env = {}, const std::string& stdinFile = "", int userId = -1);

// Lines of a text (without their line ends).
std::vector<std::string> linesOf(const std::string& text);
// A room name of its own for every test and process.
std::string uniqueRoom(const std::string& tag);
// Whether a shared-memory object naming the room exists.
bool roomExists(const std::string& room);

}  // namespace testing
}  // namespace korvo
