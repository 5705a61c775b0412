#include "host/output/Output.h"

#include "host/base/Interrupt.h"
#include "host/output/JsonEvent.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>

namespace korvo {
namespace host {
namespace {

FILE* gOut = nullptr;

FILE* hostOut() { return gOut ? gOut : stdout; }

// The first failed write of the host's own output (0: none): results that did not reach
// their reader make the command fail.
int gOutError = 0;

void flushHostOut() {
    FILE* out = hostOut();
    if ((fflush(out) != 0 || ferror(out)) && gOutError == 0) gOutError = errno != 0 ? errno : EIO;
    clearerr(out);
}

void writeErrLine(const std::string& line) {
    fprintf(stderr, "soundmeter: %s\n", line.c_str());
    fflush(stderr);
}

}  // namespace

void initHostOutput() {
    // Library printf goes through the same stdio stream as everything else in the
    // process; line buffering makes its lines reach the pipe as they are printed.
    setvbuf(stdout, nullptr, _IOLBF, 0);
    int fd = fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 3);
    if (fd < 0) return;  // no standard output at all: write to stdout, which fails quietly
    gOut = fdopen(fd, "w");
    if (gOut == nullptr) {
        close(fd);
        return;
    }
    setvbuf(gOut, nullptr, _IOLBF, 0);
}

void outf(const char* fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    errno = 0;
    vfprintf(hostOut(), fmt, ap);
    va_end(ap);
    flushHostOut();
}

namespace {
OutputMode gMode = OutputMode::Normal;

void vprint(const char* fmt, va_list ap) {
    errno = 0;
    vfprintf(hostOut(), fmt, ap);
    flushHostOut();
}
}  // namespace

void setOutputMode(OutputMode mode) { gMode = mode; }

OutputMode outputMode() { return gMode; }

void infof(const char* fmt, ...) {
    if (gMode != OutputMode::Normal) return;
    va_list ap;
    va_start(ap, fmt);
    vprint(fmt, ap);
    va_end(ap);
}

namespace {
// An event as JSON with --json; else its line, in quiet mode only when it is a result.
void emit(const JsonEvent& event, bool result, const char* fmt, va_list ap) {
    if (gMode == OutputMode::Json) {
        outf("%s\n", event.text().c_str());
    } else if (result || gMode == OutputMode::Normal) {
        vprint(fmt, ap);
    }
}
}  // namespace

void resultf(const JsonEvent& event, const char* fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    emit(event, true, fmt, ap);
    va_end(ap);
}

void progressf(const JsonEvent& event, const char* fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    emit(event, false, fmt, ap);
    va_end(ap);
}

std::string plural(long long n, const char* one, const char* many) {
    return std::to_string(n) + " " + (n == 1 ? one : many ? many : std::string(one) + "s");
}

void moveHostOutputToStderr() {
    if (gOut != nullptr && gOut != stderr) fclose(gOut);
    gOut = stderr;
}

bool hostOutputIsTerminal() { return isatty(fileno(hostOut())) != 0; }

std::string shown(const std::string& text) {
    std::string out;
    for (const char c : text) {
        const auto u = static_cast<unsigned char>(c);
        if (c == '\n' || c == '\r') {
            out += ' ';  // one line, whatever the text carried
        } else if (u < 0x20 || u == 0x7f) {
            char escaped[8];
            snprintf(escaped, sizeof escaped, "\\x%02x", u);
            out += escaped;
        } else {
            out += c;
        }
    }
    return out;
}

void errf(const char* fmt, ...) {
    // After Ctrl-C the failures it causes are not news: "interrupted" is the one line.
    if (interrupted()) return;
    char line[1024];
    va_list ap;
    va_start(ap, fmt);
    vsnprintf(line, sizeof line, fmt, ap);
    va_end(ap);
    writeErrLine(shown(line));
}

void interruptionLine(const char* what) { writeErrLine(what); }

int hostOutputError() {
    flushHostOut();
    return gOutError;
}

LibraryStdout::~LibraryStdout() { stop(); }

bool LibraryStdout::start(LineHandler handler, std::string* error) {
    if (mActive) return true;
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        if (error) *error = std::string("cannot make a pipe: ") + strerror(errno);
        return false;
    }
    fflush(stdout);
    mSavedFd = fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 3);
    if (mSavedFd < 0 || dup2(fds[1], STDOUT_FILENO) < 0) {
        if (error) *error = std::string("cannot redirect standard output: ") + strerror(errno);
        if (mSavedFd >= 0) close(mSavedFd);
        mSavedFd = -1;
        close(fds[0]);
        close(fds[1]);
        return false;
    }
    close(fds[1]);  // descriptor 1 is now the only write end: restoring it ends the reader
    mHandler = std::move(handler);
    mActive = true;
    mReader = std::thread([this, fd = fds[0]] { readLoop(fd); });
    return true;
}

void LibraryStdout::stop() {
    if (!mActive) return;
    mActive = false;
    fflush(stdout);
    dup2(mSavedFd, STDOUT_FILENO);
    close(mSavedFd);
    mSavedFd = -1;
    if (mReader.joinable()) mReader.join();
}

void LibraryStdout::readLoop(int fd) {
    std::string pending;
    char buf[4096];
    for (;;) {
        ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        pending.append(buf, static_cast<size_t>(n));
        size_t start = 0;
        for (size_t nl; (nl = pending.find('\n', start)) != std::string::npos; start = nl + 1) {
            deliver(pending.substr(start, nl - start));
        }
        pending.erase(0, start);
    }
    // "deleted" comes without a line end: deliver the unterminated rest too.
    if (!pending.empty()) deliver(pending);
    close(fd);
}

void LibraryStdout::deliver(const std::string& line) {
    if (!mHandler) return;
    // The library's "Created" has no line end and sticks to the next line it prints.
    static const std::string kCreated = "Created";
    if (line.size() > kCreated.size() && line.compare(0, kCreated.size(), kCreated) == 0) {
        mHandler(kCreated);
        mHandler(line.substr(kCreated.size()));
        return;
    }
    mHandler(line);
}

LibraryStdout::LineHandler libraryLinesToStderr(bool verbose) {
    if (!verbose) return [](const std::string&) {};
    return [](const std::string& line) { fprintf(stderr, "plug-in stdout: %s\n", line.c_str()); };
}

}  // namespace host
}  // namespace korvo
