// The host's own output, kept apart from what the plug-in prints.
//
// The plug-in writes "Created", "deleted" and a few diagnostic lines to the
// process's standard output by itself. The host keeps the user's view clean: it
// writes its own lines to a private duplicate of the original standard output,
// and while the plug-in is loaded descriptor 1 is a pipe whose lines go to a
// handler (shown on stderr with -v, dropped otherwise, or read by a command that
// needs them, as the sweep does).
#pragma once
#include <cstdio>
#include <functional>
#include <string>
#include <thread>

namespace korvo {
namespace host {

// Takes the private duplicate of standard output; call once, first thing in main.
void initHostOutput();
// printf to the host's own standard output, flushed at once.
void outf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// Whether the host's own standard output is a terminal (descriptor 1 may be a pipe
// to the plug-in's line handler meanwhile).
bool hostOutputIsTerminal();
// One line on stderr, "soundmeter: " in front and a line end added.
void errf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));

// Routes the process's standard output through a pipe to a line handler for as
// long as it is started. The handler runs on a reader thread of its own.
class LibraryStdout {
public:
    using LineHandler = std::function<void(const std::string& line)>;

    LibraryStdout() = default;
    LibraryStdout(const LibraryStdout&) = delete;
    LibraryStdout& operator=(const LibraryStdout&) = delete;
    ~LibraryStdout();

    bool start(LineHandler handler, std::string* error);
    // Flushes stdio, puts the original descriptor 1 back and delivers what is left.
    void stop();

private:
    void readLoop(int fd);
    void deliver(const std::string& line);

    LineHandler mHandler;
    std::thread mReader;
    int mSavedFd = -1;
    bool mActive = false;
};

// The handler used unless a command needs the lines: shown on stderr with -v.
LibraryStdout::LineHandler libraryLinesToStderr(bool verbose);

}  // namespace host
}  // namespace korvo
