// The wav route as a loudspeaker: a recording of everything it played, from the moment
// the route opens until it closes, at the first open's rate; silence wherever no
// samples were written (the track is stopped between tones and writes nothing then).
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <mutex>

#include <log/log.h>
#include <utils/Errors.h>

#include "routes/common/Pacer.h"
#include "routes/common/SampleClock.h"
#include "routes/wav/WavRoutes.h"
#include "routes/wav/SoundFileInput.h"

namespace korvo {
namespace platform {

namespace {

constexpr const char* kTag = "WavRoute";
constexpr uint32_t kDefaultRate = 44100;

int64_t monotonicNs() {
    timespec t{};
    clock_gettime(CLOCK_MONOTONIC, &t);
    return static_cast<int64_t>(t.tv_sec) * 1000000000LL + t.tv_nsec;
}

std::string systemCause(int error) { return std::string("cannot write: ") + std::strerror(error); }

// The standard output the process started with, taken when the platform is loaded: a host
// may point descriptor 1 elsewhere later (at a pipe of its own) and "wav:-" still goes
// where the user sent the process's output.
const int kStartupStdout = fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 3);

class WavOutputRoute : public OutputRoute {
public:
    explicit WavOutputRoute(int fd) : mFd(fd) {}

    ~WavOutputRoute() override {
        // A route closed before it opened still leaves a valid, empty recording.
        if (!mFile && mFd >= 0) create(kDefaultRate);
        if (mFile && !mFailed) fillUntil(clockPosition());
        if (mFile) sf_close(mFile);
        if (mFd >= 0) ::close(mFd);
    }

    int open(uint32_t sampleRate) override {
        if (sampleRate == 0) return android::BAD_VALUE;
        if (!mFile) {
            if (!create(sampleRate)) return android::UNKNOWN_ERROR;
        } else if (sampleRate != mRate && !mRateNoted) {
            mRateNoted = true;
            __android_log_print(ANDROID_LOG_ERROR, kTag, "the recording is kept at %u Hz, the output now runs at %u Hz",
                                mRate, sampleRate);
        }
        mPacing.start(sampleRate);
        return 0;
    }

    int write(const int16_t* samples, size_t count) override {
        if (!mFile) return android::NO_INIT;
        if (mFailed) return android::UNKNOWN_ERROR;
        // What the loudspeaker played since the last write: silence, when it was a pause.
        if (!fillUntil(clockPosition()) || !append(samples, count)) return android::UNKNOWN_ERROR;
        mPacing.next(count);
        return 0;
    }

    void stop() override { mPacing.stop(); }

    std::string failure() const override {
        std::lock_guard<std::mutex> lock(mFailureLock);
        return mFailure;
    }

private:
    bool create(uint32_t rate) {
        struct stat st {};
        const bool regular = fstat(mFd, &st) == 0 && S_ISREG(st.st_mode);
        SF_INFO info{};
        info.samplerate = static_cast<int>(rate);
        info.channels = 1;
        // A WAV header needs a seek back to its lengths; a pipe (wav:- on standard output)
        // gets AU instead, whose header may leave the length open.
        info.format = (regular ? SF_FORMAT_WAV : SF_FORMAT_AU) | SF_FORMAT_PCM_16;
        errno = 0;
        mFile = sf_open_fd(mFd, SFM_WRITE, &info, SF_TRUE);  // owns the descriptor, even on failure
        const int error = errno;
        mFd = -1;
        if (!mFile) return fail(error != 0 ? systemCause(error) : "cannot write: " + sndfileReason(nullptr));
        // The header follows every write, so that the file stays valid if the process dies.
        if (regular) sf_command(mFile, SFC_SET_UPDATE_HEADER_AUTO, nullptr, SF_TRUE);
        mRate = rate;
        mOpenedNs = monotonicNs();
        return true;
    }

    // Samples the loudspeaker has played since the first open, by the clock.
    uint64_t clockPosition() const {
        return samplesIn(static_cast<uint64_t>(std::max<int64_t>(monotonicNs() - mOpenedNs, 0)), mRate);
    }

    // Silence up to `position`. A writer keeping the pace is one buffer ahead of the clock;
    // lags under 10 ms are its scheduling, not a pause, and are not recorded as one.
    bool fillUntil(uint64_t position) {
        if (position <= mWritten + mRate / 100) return true;
        static const int16_t kSilence[4096] = {};
        while (mWritten < position) {
            const size_t n = static_cast<size_t>(std::min<uint64_t>(position - mWritten, 4096));
            if (!append(kSilence, n)) return false;
        }
        return true;
    }

    bool append(const int16_t* samples, size_t count) {
        if (count == 0) return true;
        errno = 0;
        const sf_count_t done = sf_writef_short(mFile, samples, static_cast<sf_count_t>(count));
        const int error = errno;
        mWritten += static_cast<uint64_t>(std::max<sf_count_t>(done, 0));
        if (done == static_cast<sf_count_t>(count)) return true;
        return fail(error != 0 ? systemCause(error) : "cannot write: " + sndfileReason(mFile));
    }

    bool fail(const std::string& cause) {
        mFailed = true;
        std::lock_guard<std::mutex> lock(mFailureLock);
        mFailure = cause;
        return false;
    }

    int mFd;                   // until the first open hands it to libsndfile
    SNDFILE* mFile = nullptr;  // from the first open on
    uint32_t mRate = 0;        // the recording's rate: the first open's
    bool mRateNoted = false;
    int64_t mOpenedNs = 0;  // the recording's time 0
    uint64_t mWritten = 0;  // samples in the recording
    bool mFailed = false;
    OutputPacing mPacing;
    mutable std::mutex mFailureLock;
    std::string mFailure;
};

}  // namespace

bool checkWavOutput(const std::string& path, std::string* reason) {
    std::string cause;
    if (path == "-") {
        const int flags = fcntl(kStartupStdout, F_GETFL);
        if (flags < 0 || (flags & O_ACCMODE) == O_RDONLY) cause = systemCause(flags < 0 ? errno : EBADF);
    } else {
        struct stat st {};
        const bool existed = stat(path.c_str(), &st) == 0;
        // O_NONBLOCK: a pipe without a reader is refused instead of waited for.
        const int fd = existed ? ::open(path.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC)
                               : ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
        if (fd < 0) {
            cause = systemCause(errno);
        } else {
            // A block written where it harms nothing: a new file, past the end of an existing
            // one (cut off again), or a character device such as /dev/full; never into a
            // pipe, whose reader would hear it, nor a disk.
            static const char kProbe[4096] = {};
            const bool regular = !existed || S_ISREG(st.st_mode);
            const off_t end = existed && regular ? st.st_size : 0;
            ssize_t wrote = sizeof kProbe;
            errno = 0;
            if (regular) {
                wrote = pwrite(fd, kProbe, sizeof kProbe, end);
            } else if (S_ISCHR(st.st_mode)) {
                wrote = ::write(fd, kProbe, sizeof kProbe);
            }
            if (wrote != static_cast<ssize_t>(sizeof kProbe)) cause = systemCause(errno != 0 ? errno : ENOSPC);
            if (existed && regular && ftruncate(fd, end) != 0 && cause.empty()) cause = systemCause(errno);
            ::close(fd);
            if (!existed) unlink(path.c_str());
        }
    }
    if (!cause.empty() && reason) *reason = cause;
    return cause.empty();
}

std::unique_ptr<OutputRoute> makeWavOutputRoute(const std::string& path, std::string* error) {
    // The descriptor is taken now, so that a path that cannot be written fails up front.
    const int fd = path == "-" ? fcntl(kStartupStdout, F_DUPFD_CLOEXEC, 3)
                               : ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    if (fd < 0) {
        if (error) *error = systemCause(errno);
        return nullptr;
    }
    return std::make_unique<WavOutputRoute>(fd);
}

}  // namespace platform
}  // namespace korvo
