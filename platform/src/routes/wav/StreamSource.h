// A stream that cannot seek (standard input, a FIFO, a character device), read as its
// bytes come, in bounded memory. Its first bytes are kept, so that a check and then a
// route may each decode it from the start. Every wait for bytes ends when
// interruptRecordings() is called (Ctrl-C), as if the writer had closed the stream.
#pragma once
#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace korvo {
namespace platform {

class StreamSource {
public:
    // The bytes kept from the start of a stream; past them, a stream is read once.
    static constexpr size_t kKept = 1 << 20;

    // Whether `path` names such a stream ("-" is standard input).
    static bool isStream(const std::string& path);
    // The process's one source for `path`, opened (without waiting for a writer) at the
    // first call; null with the cause.
    static std::shared_ptr<StreamSource> of(const std::string& path, std::string* cause);
    ~StreamSource();

    // Up to `n` bytes from position `at`: the count, 0 at the end, on an interruption or
    // once `stop` is set, -1 with errno set (EINVAL: an earlier reader took those bytes,
    // past the ones kept).
    ssize_t readAt(uint64_t at, char* out, size_t n, const std::atomic<bool>* stop = nullptr);

private:
    explicit StreamSource(int fd, bool owned) : mFd(fd), mOwned(owned) {}
    // Waits for bytes (or the end) on the descriptor; false when interrupted or stopped.
    bool waitReadable(const std::atomic<bool>* stop);

    std::mutex mLock;  // one reader at a time
    int mFd;
    bool mOwned;
    std::vector<char> mKept;  // the first bytes of the stream
    uint64_t mRead = 0;       // bytes taken from the descriptor
    bool mEnded = false;
};

// Hands a stream's bytes from `from` on to a pipe of its own, on a thread, so that a
// decoder reading that pipe sees an ordinary pipe that ends when the stream ends.
class StreamPump {
public:
    StreamPump(std::shared_ptr<StreamSource> source, int writeFd);
    // Stops at once; call after the pipe's read end is closed.
    ~StreamPump();

private:
    void run();

    std::shared_ptr<StreamSource> mSource;
    int mFd;
    std::atomic<bool> mStop{false};
    std::thread mThread;
};

// Set by interruptRecordings(); read by every wait for a stream's bytes.
bool recordingsInterrupted();

}  // namespace platform
}  // namespace korvo
