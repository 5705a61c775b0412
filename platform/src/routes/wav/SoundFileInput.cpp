#include "routes/wav/SoundFileInput.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "routes/wav/StreamSource.h"

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

// FLAC cannot be decoded from a pipe: such a stream is read whole into memory, up to this.
constexpr size_t kMaxWholeStream = size_t{256} << 20;

std::string streamName(const std::string& path) { return path == "-" ? "standard input" : "the stream"; }

}  // namespace

// libsndfile's virtual I/O over the bytes of standard input.
struct MemoryIo {
    static SoundFileInput& self(void* user) { return *static_cast<SoundFileInput*>(user); }
    static sf_count_t length(void* user) { return static_cast<sf_count_t>(self(user).mBytes.size()); }
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
        std::memcpy(ptr, in.mBytes.data() + in.mOffset, static_cast<size_t>(n));
        in.mOffset += n;
        return n;
    }
    static sf_count_t write(const void*, sf_count_t, void*) { return 0; }
    static sf_count_t tell(void* user) { return self(user).mOffset; }
};

SoundFileInput::~SoundFileInput() {
    if (mFile) sf_close(mFile);  // closes the pump's pipe first, so the pump ends
    mPump.reset();
}

bool SoundFileInput::openStream(const std::string& path, std::string* cause) {
    std::shared_ptr<StreamSource> source = StreamSource::of(path, cause);
    if (!source) return false;
    char magic[4];
    size_t have = 0;
    for (ssize_t n = 1; have < sizeof magic && n > 0; have += static_cast<size_t>(std::max<ssize_t>(n, 0))) {
        n = source->readAt(have, magic + have, sizeof magic - have);
        if (n < 0) {
            *cause = errno == EINVAL ? "cannot decode: " + streamName(path) + " was read once already"
                                     : std::string("cannot open: ") + std::strerror(errno);
            return false;
        }
    }
    if (recordingsInterrupted()) {
        *cause = "interrupted";
        return false;
    }
    if (have == 0) {
        *cause = "cannot decode: " + streamName(path) + " is empty";
        return false;
    }
    mLengthKnown = false;
    if (have == sizeof magic && std::memcmp(magic, "fLaC", sizeof magic) == 0) {
        char block[65536];
        for (ssize_t n; (n = source->readAt(mBytes.size(), block, sizeof block)) > 0;) {
            if (mBytes.size() + static_cast<size_t>(n) > kMaxWholeStream) {
                *cause = "cannot decode: a FLAC stream longer than 256 MiB must come from a file";
                return false;
            }
            mBytes.append(block, static_cast<size_t>(n));
        }
        if (recordingsInterrupted()) {
            *cause = "interrupted";
            return false;
        }
        mLengthKnown = true;
        static SF_VIRTUAL_IO io = {MemoryIo::length, MemoryIo::seek, MemoryIo::read, MemoryIo::write,
                                   MemoryIo::tell};
        mFile = sf_open_virtual(&io, SFM_READ, &mInfo, this);
        return true;
    }
    // Everything else decodes from a pipe as it comes, in bounded memory.
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        *cause = std::string("cannot open: ") + std::strerror(errno);
        return false;
    }
    mPump = std::make_unique<StreamPump>(std::move(source), fds[1]);
    mFile = sf_open_fd(fds[0], SFM_READ, &mInfo, SF_TRUE);  // closes fds[0] when it fails
    return true;
}

bool SoundFileInput::open(const std::string& path, std::string* cause) {
    if (StreamSource::isStream(path)) {
        if (!openStream(path, cause)) return false;
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
        if (mLengthKnown && mDelivered < mInfo.frames && mInfo.frames != SF_COUNT_MAX) {
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
