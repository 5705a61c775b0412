// The platform log: one "P/TAG: message" line per call, to a destination chosen by the
// environment (KORVO_LOG, KORVO_LOG_LEVEL) at the first call.
#include <log/log.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <vector>

#include <korvo/platform/Log.h>

#include "TestHooks.h"

namespace korvo {
namespace platform {

namespace {

struct LogConfig {
    int fd = -1;  // -1: nothing is written
    bool ownsFd = false;
    int minPrio = ANDROID_LOG_DEBUG;
    bool loaded = false;
};

// Guards the configuration and every write, so lines of concurrent threads never mix.
std::mutex gLogLock;
LogConfig gConfig;

int priorityOfLevel(const char* level) {
    switch (level && level[0] ? level[0] : 'D') {
        case 'V': case 'v': return ANDROID_LOG_VERBOSE;
        case 'I': case 'i': return ANDROID_LOG_INFO;
        case 'W': case 'w': return ANDROID_LOG_WARN;
        case 'E': case 'e': return ANDROID_LOG_ERROR;
        case 'F': case 'f': return ANDROID_LOG_FATAL;
        default: return ANDROID_LOG_DEBUG;  // D, and any letter we do not know
    }
}

const char* nonEmpty(const char* s) { return s && s[0] ? s : nullptr; }

void applyLocked(const char* target, const char* level) {
    if (gConfig.ownsFd) close(gConfig.fd);
    gConfig = LogConfig{};
    gConfig.loaded = true;
    target = nonEmpty(target);
    level = nonEmpty(level);
    if (!target && !level) return;  // the default: a host's terminal stays clean
    gConfig.minPrio = priorityOfLevel(level);
    if (!target || std::strcmp(target, "stderr") == 0) {
        gConfig.fd = STDERR_FILENO;
    } else if (std::strcmp(target, "off") != 0) {
        const int fd = open(target, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
        if (fd < 0) {
            // Said once on stderr, then the log stays off rather than flooding the terminal.
            std::fprintf(stderr, "cannot open log file '%s': %s\n", target, std::strerror(errno));
            return;
        }
        gConfig.fd = fd;
        gConfig.ownsFd = true;
    }
}

// Priorities outside verbose..fatal count as the nearest of the two.
int clampPriority(int prio) {
    if (prio < ANDROID_LOG_VERBOSE) return ANDROID_LOG_VERBOSE;
    if (prio > ANDROID_LOG_FATAL) return ANDROID_LOG_FATAL;
    return prio;
}

char priorityLetter(int prio) { return "VDIWEF"[clampPriority(prio) - ANDROID_LOG_VERBOSE]; }

void writeAll(int fd, const char* p, size_t len) {
    while (len > 0) {
        const ssize_t n = ::write(fd, p, len);
        if (n < 0) {
            if (errno == EINTR) continue;
            return;
        }
        p += n;
        len -= static_cast<size_t>(n);
    }
}

}  // namespace

void reloadLogConfig() {
    std::lock_guard<std::mutex> lock(gLogLock);
    applyLocked(std::getenv("KORVO_LOG"), std::getenv("KORVO_LOG_LEVEL"));
}

void setLogTarget(const std::string& target, char level) {
    const char levelText[2] = {level, '\0'};
    std::lock_guard<std::mutex> lock(gLogLock);
    applyLocked(target.empty() ? "off" : target.c_str(), levelText);
}

}  // namespace platform
}  // namespace korvo

extern "C" int __android_log_print(int prio, const char* tag, const char* fmt, ...) {
    using namespace korvo::platform;
    if (!tag) tag = "";
    if (!fmt) fmt = "";

    const bool keep = detail::logCaptureOn();
    bool write;
    {
        std::lock_guard<std::mutex> lock(gLogLock);
        if (!gConfig.loaded) applyLocked(std::getenv("KORVO_LOG"), std::getenv("KORVO_LOG_LEVEL"));
        write = gConfig.fd >= 0 && clampPriority(prio) >= gConfig.minPrio;
    }
    if (!keep && !write) return 0;

    // "P/TAG: " + message + "\n", built in one buffer; ordinary lines stay on the stack.
    char stackBuf[1024];
    std::vector<char> heapBuf;
    char* line = stackBuf;
    const int prefixLen = std::snprintf(stackBuf, sizeof(stackBuf), "%c/%s: ", priorityLetter(prio), tag);
    va_list args;
    va_start(args, fmt);
    va_list args2;
    va_copy(args2, args);
    const int msgLen = std::vsnprintf(nullptr, 0, fmt, args);
    va_end(args);
    const size_t prefix = static_cast<size_t>(prefixLen > 0 ? prefixLen : 0);
    const size_t body = static_cast<size_t>(msgLen > 0 ? msgLen : 0);
    if (prefix + body + 2 > sizeof(stackBuf)) {
        heapBuf.resize(prefix + body + 2);
        line = heapBuf.data();
        std::snprintf(line, heapBuf.size(), "%c/%s: ", priorityLetter(prio), tag);
    }
    std::vsnprintf(line + prefix, body + 1, fmt, args2);
    va_end(args2);
    size_t len = prefix + body;
    while (len > prefix && line[len - 1] == '\n') --len;  // the line ends with exactly one '\n'

    if (keep) detail::keepLogLine(prio, tag, line + prefix, len - prefix);
    if (!write) return 0;
    line[len++] = '\n';
    std::lock_guard<std::mutex> lock(gLogLock);
    if (gConfig.fd < 0) return 0;  // switched off meanwhile
    writeAll(gConfig.fd, line, len);
    return static_cast<int>(len);
}
