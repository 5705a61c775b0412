#include "routes/SoundFileInput.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <mutex>

namespace korvo {
namespace platform {

std::string sndfileReason(SNDFILE* file) {
    std::string s = sf_strerror(file);
    for (const char* prefix : {"System error : ", "Error : "}) {
        if (s.compare(0, std::strlen(prefix), prefix) == 0) s.erase(0, std::strlen(prefix));
    }
    while (!s.empty() && (s.back() == '.' || s.back() == ' ' || s.back() == '\n')) s.pop_back();
    return s;
}

namespace {

// Standard input is a pipe that cannot seek, and FLAC or Ogg need to seek: it is read
// whole into memory, once per process, and every route or check decodes that copy.
std::shared_ptr<const std::string> standardInput(std::string* cause) {
    static std::mutex lock;
    static std::shared_ptr<const std::string> bytes;
    static std::string failure;
    std::lock_guard<std::mutex> guard(lock);
    if (!bytes && failure.empty()) {
        auto text = std::make_shared<std::string>();
        char buf[65536];
        for (;;) {
            const ssize_t n = ::read(STDIN_FILENO, buf, sizeof buf);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) {
                failure = std::string("cannot open: ") + std::strerror(errno);
                break;
            }
            if (n == 0) {
                bytes = std::move(text);
                break;
            }
            text->append(buf, static_cast<size_t>(n));
        }
    }
    if (!bytes) *cause = failure;
    return bytes;
}

}  // namespace

// libsndfile's virtual I/O over the bytes of standard input.
struct MemoryIo {
    static SoundFileInput& self(void* user) { return *static_cast<SoundFileInput*>(user); }
    static sf_count_t length(void* user) { return static_cast<sf_count_t>(self(user).mBytes->size()); }
    static sf_count_t seek(sf_count_t offset, int whence, void* user) {
        SoundFileInput& in = self(user);
        const sf_count_t base = whence == SEEK_CUR ? in.mOffset : whence == SEEK_END ? length(user) : 0;
        in.mOffset = std::clamp<sf_count_t>(base + offset, 0, length(user));
        return in.mOffset;
    }
    static sf_count_t read(void* ptr, sf_count_t count, void* user) {
        SoundFileInput& in = self(user);
        const sf_count_t n = std::min(count, length(user) - in.mOffset);
        if (n <= 0) return 0;
        std::memcpy(ptr, in.mBytes->data() + in.mOffset, static_cast<size_t>(n));
        in.mOffset += n;
        return n;
    }
    static sf_count_t write(const void*, sf_count_t, void*) { return 0; }
    static sf_count_t tell(void* user) { return self(user).mOffset; }
};

SoundFileInput::~SoundFileInput() {
    if (mFile) sf_close(mFile);
}

bool SoundFileInput::open(const std::string& path, std::string* cause) {
    if (path == "-") {
        mBytes = standardInput(cause);
        if (!mBytes) return false;
        if (mBytes->empty()) {
            *cause = "cannot decode: standard input is empty";
            return false;
        }
        static SF_VIRTUAL_IO io = {MemoryIo::length, MemoryIo::seek, MemoryIo::read, MemoryIo::write,
                                   MemoryIo::tell};
        mFile = sf_open_virtual(&io, SFM_READ, &mInfo, this);
    } else {
        // Opened here rather than by libsndfile, so that the cause is the system's own words.
        const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
        struct stat st {};
        if (fd < 0 || fstat(fd, &st) != 0 || S_ISDIR(st.st_mode)) {
            *cause = std::string("cannot open: ") + std::strerror(fd < 0 ? errno : EISDIR);
            if (fd >= 0) ::close(fd);
            return false;
        }
        if (st.st_size == 0) {
            *cause = "cannot decode: the file is empty";
            ::close(fd);
            return false;
        }
        mFile = sf_open_fd(fd, SFM_READ, &mInfo, SF_TRUE);  // closes fd when it fails
    }
    if (!mFile) {
        *cause = "cannot decode: " + sndfileReason(nullptr);
        return false;
    }
    if (mInfo.channels < 1 || mInfo.samplerate < 1) {
        *cause = "cannot decode: no channel or no rate";
        return false;
    }
    if (mInfo.frames <= 0) {
        *cause = "has no samples";
        return false;
    }
    return true;
}

sf_count_t SoundFileInput::readMono(float* out, sf_count_t count, std::string* cause) {
    const auto channels = static_cast<size_t>(mInfo.channels);
    mInterleaved.resize(static_cast<size_t>(count) * channels);
    // Integer samples come scaled to [-1, 1]; float and double ones are read as they are.
    const sf_count_t got = sf_readf_float(mFile, mInterleaved.data(), count);
    if (got <= 0) {
        // A decoder that stops before the length its header promised met a broken file.
        if (sf_error(mFile) != SF_ERR_NO_ERROR) {
            *cause = "cannot decode: " + sndfileReason(mFile);
            return -1;
        }
        if (mDelivered < mInfo.frames && mInfo.frames != SF_COUNT_MAX) {
            *cause = "cannot decode: the file ends after " + std::to_string(mDelivered) + " of " +
                     std::to_string(mInfo.frames) + " samples";
            return -1;
        }
        return 0;
    }
    mDelivered += got;
    for (size_t i = 0; i < static_cast<size_t>(got); ++i) {
        const float* frame = &mInterleaved[i * channels];
        float sum = 0.0f;
        for (size_t c = 0; c < channels; ++c) sum += frame[c];
        out[i] = channels == 1 ? sum : sum / static_cast<float>(channels);
    }
    return got;
}

}  // namespace platform
}  // namespace korvo
