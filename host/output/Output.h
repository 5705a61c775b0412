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

class JsonEvent;

// Takes the private duplicate of standard output; call once, first thing in main.
void initHostOutput();
// printf to the host's own standard output, flushed at once, whatever the mode.
void outf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));

// What the host prints: everything; only results and errors (-q); or one JSON object
// per event instead of the result lines (--json). Errors go to stderr in every mode.
enum class OutputMode { Normal, Quiet, Json };
void setOutputMode(OutputMode mode);
OutputMode outputMode();
// A line of progress or context, shown in normal mode only.
void infof(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// A result: its line in normal and quiet mode, the event's JSON object with --json.
void resultf(const JsonEvent& event, const char* fmt, ...) __attribute__((format(printf, 2, 3)));
// A step on the way: its line in normal mode, the event's JSON object with --json.
void progressf(const JsonEvent& event, const char* fmt, ...) __attribute__((format(printf, 2, 3)));
// "1 code", "2 codes".
std::string plural(long long n, const char* one, const char* many = nullptr);
// Sends the host's own lines to stderr: standard output carries the speaker's sound.
void moveHostOutputToStderr();
// Whether the host's own standard output is a terminal (descriptor 1 may be a pipe
// to the plug-in's line handler meanwhile).
bool hostOutputIsTerminal();
// One line on stderr, "soundmeter: " in front and a line end added; control characters
// (of a file or route name the user gave) are shown escaped. Silent once Ctrl-C or
// SIGTERM has come: interruptionLine() is then the one line.
void errf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
void interruptionLine(const char* what);
// A text the user gave, fit to print: control characters escaped (\x1b), line ends as spaces.
std::string shown(const std::string& text);
// The first error of a write to the host's own standard output (0: every write went out).
int hostOutputError();

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
