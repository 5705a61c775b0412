#include "routes/wav/StreamSource.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>

#include <korvo/platform/Recording.h>

namespace korvo {
namespace platform {

namespace {

std::atomic<bool> gInterrupted{false};
static_assert(std::atomic<bool>::is_always_lock_free, "set from a signal handler");

// How often a wait looks at the interruption flag.
constexpr int kPollMs = 50;

}  // namespace

bool recordingsInterrupted() { return gInterrupted.load(std::memory_order_relaxed); }

bool StreamSource::isStream(const std::string& path) {
    if (path == "-") return true;
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && (S_ISFIFO(st.st_mode) || S_ISCHR(st.st_mode) || S_ISSOCK(st.st_mode));
}

std::shared_ptr<StreamSource> StreamSource::of(const std::string& path, std::string* cause) {
    static std::mutex lock;
    static std::map<std::string, std::shared_ptr<StreamSource>> sources;
    std::lock_guard<std::mutex> guard(lock);
    auto found = sources.find(path);
    if (found != sources.end()) return found->second;
    int fd = STDIN_FILENO;
    if (path != "-") {
        // O_NONBLOCK: a FIFO opens without a writer; its bytes are then waited for in poll.
        fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        if (fd < 0) {
            *cause = std::string("cannot open: ") + std::strerror(errno);
            return nullptr;
        }
    }
    std::shared_ptr<StreamSource> source(new StreamSource(fd, path != "-"));
    sources.emplace(path, source);
    return source;
}

StreamSource::~StreamSource() {
    if (mOwned) ::close(mFd);
}

bool StreamSource::waitReadable(const std::atomic<bool>* stop) {
    pollfd p{mFd, POLLIN, 0};
    while (!recordingsInterrupted() && !(stop && stop->load(std::memory_order_relaxed))) {
        const int n = poll(&p, 1, kPollMs);
        if (n > 0) return true;
        if (n < 0 && errno != EINTR) return true;  // the read reports it
    }
    return false;
}

ssize_t StreamSource::readAt(uint64_t at, char* out, size_t n, const std::atomic<bool>* stop) {
    std::lock_guard<std::mutex> guard(mLock);
    if (at < mKept.size()) {
        const size_t k = std::min(n, static_cast<size_t>(mKept.size() - at));
        std::memcpy(out, mKept.data() + at, k);
        return static_cast<ssize_t>(k);
    }
    if (at != mRead) {
        errno = EINVAL;
        return -1;
    }
    for (;;) {
        if (mEnded || !waitReadable(stop)) return 0;
        const ssize_t got = ::read(mFd, out, n);
        if (got < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        // A FIFO whose writer has not come yet reads as ended: wait on for one.
        if (got == 0 && mRead == 0 && mOwned) {
            struct stat st {};
            if (fstat(mFd, &st) == 0 && S_ISFIFO(st.st_mode)) {
                usleep(kPollMs * 1000);
                continue;
            }
        }
        if (got < 0) return -1;
        mEnded = got == 0;
        if (mRead == mKept.size() && mKept.size() + static_cast<size_t>(got) <= kKept) {
            mKept.insert(mKept.end(), out, out + got);
        }
        mRead += static_cast<uint64_t>(got);
        return got;
    }
}

StreamPump::StreamPump(std::shared_ptr<StreamSource> source, int writeFd) : mSource(std::move(source)), mFd(writeFd) {
    // The pump takes no signal: Ctrl-C reaches the threads that act on it, and a reader
    // that went away shows as EPIPE.
    sigset_t all, old;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, &old);
    mThread = std::thread([this] { run(); });
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
}

StreamPump::~StreamPump() {
    mStop.store(true, std::memory_order_relaxed);
    if (mThread.joinable()) mThread.join();
    if (mFd >= 0) ::close(mFd);
}

void StreamPump::run() {
    std::vector<char> block(65536);
    uint64_t at = 0;
    while (!mStop.load(std::memory_order_relaxed)) {
        const ssize_t got = mSource->readAt(at, block.data(), block.size(), &mStop);
        if (got <= 0) break;
        at += static_cast<uint64_t>(got);
        for (ssize_t done = 0; done < got && !mStop.load(std::memory_order_relaxed);) {
            pollfd p{mFd, POLLOUT, 0};
            if (poll(&p, 1, kPollMs) <= 0) continue;
            const ssize_t n = ::write(mFd, block.data() + done, static_cast<size_t>(got - done));
            if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
            if (n < 0) return;  // the reader closed its end
            done += n;
        }
    }
    // The end of the stream, or an interruption: the reader sees the pipe end.
    ::close(mFd);
    mFd = -1;
}

void interruptRecordings() { gInterrupted.store(true, std::memory_order_relaxed); }

}  // namespace platform
}  // namespace korvo
