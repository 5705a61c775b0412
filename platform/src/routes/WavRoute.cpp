// The wav route: a WAV file's samples as the microphone, or a WAV file that keeps every
// sample written to the loudspeaker. Both at real-time pace.
#include <sndfile.h>

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <vector>

#include <log/log.h>
#include <utils/Errors.h>

#include "routes/Pacer.h"
#include "routes/RouteFactories.h"

namespace korvo {
namespace platform {

namespace {

constexpr const char* kTag = "WavRoute";
constexpr uint32_t kDefaultRate = 44100;
constexpr sf_count_t kChunkFrames = 1024;

class WavCaptureRoute : public CaptureRoute {
public:
    WavCaptureRoute(std::string path, SNDFILE* file, const SF_INFO& info)
        : mPath(std::move(path)), mFile(file), mInfo(info),
          mScratch(static_cast<size_t>(kChunkFrames * info.channels)) {
        if (mInfo.channels > 1) {
            __android_log_print(ANDROID_LOG_ERROR, kTag, "wav:%s has %d channels: only the first is heard",
                                mPath.c_str(), mInfo.channels);
        }
    }
    ~WavCaptureRoute() override { sf_close(mFile); }

    int open(uint32_t sampleRate) override {
        if (sampleRate == 0) return android::BAD_VALUE;
        if (static_cast<uint32_t>(mInfo.samplerate) != sampleRate) {
            // No resampling: the samples are heard as they are, at the stream's rate.
            __android_log_print(ANDROID_LOG_ERROR, kTag,
                                "wav:%s is at %d Hz, the stream at %u Hz: the rate differs",
                                mPath.c_str(), mInfo.samplerate, sampleRate);
        }
        mPacing.start(sampleRate);
        mOpened = true;
        return 0;
    }

    ssize_t read(int16_t* out, size_t count) override {
        if (!mOpened) return android::NO_INIT;
        const size_t n = mPacing.next(count);
        size_t done = 0;
        while (done < n && !mAtEnd) {
            const sf_count_t want = std::min<sf_count_t>(kChunkFrames, static_cast<sf_count_t>(n - done));
            const sf_count_t got = sf_readf_short(mFile, mScratch.data(), want);
            if (got <= 0) {
                mAtEnd = true;  // after the file: silence
                break;
            }
            for (sf_count_t i = 0; i < got; ++i) out[done + static_cast<size_t>(i)] = mScratch[static_cast<size_t>(i * mInfo.channels)];
            done += static_cast<size_t>(got);
        }
        std::fill(out + done, out + n, int16_t{0});
        return static_cast<ssize_t>(n);
    }

    void stop() override { mPacing.stop(); }
    std::string failure() const override { return {}; }

private:
    const std::string mPath;
    SNDFILE* const mFile;
    const SF_INFO mInfo;
    std::vector<int16_t> mScratch;  // one chunk of interleaved frames
    CapturePacing mPacing;
    bool mOpened = false;
    bool mAtEnd = false;
};

SNDFILE* createWav(const std::string& path, uint32_t rate) {
    SF_INFO info{};
    info.samplerate = static_cast<int>(rate);
    info.channels = 1;
    info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
    SNDFILE* file = sf_open(path.c_str(), SFM_WRITE, &info);
    // The header follows every write, so the file stays valid if the process dies.
    if (file) sf_command(file, SFC_SET_UPDATE_HEADER_AUTO, nullptr, SF_TRUE);
    return file;
}

class WavOutputRoute : public OutputRoute {
public:
    WavOutputRoute(std::string path, SNDFILE* file)
        : mPath(std::move(path)), mFile(file), mRate(kDefaultRate) {}
    ~WavOutputRoute() override {
        if (mFile) sf_close(mFile);
    }

    int open(uint32_t sampleRate) override {
        if (sampleRate == 0) return android::BAD_VALUE;
        if (sampleRate != mRate) {
            if (mWritten == 0) {
                // Nothing kept yet: start the file again at the output's rate.
                if (mFile) sf_close(mFile);
                mFile = createWav(mPath, sampleRate);
                if (!mFile) {
                    __android_log_print(ANDROID_LOG_ERROR, kTag, "wav:%s: %s", mPath.c_str(),
                                        sf_strerror(nullptr));
                    return android::UNKNOWN_ERROR;
                }
                mRate = sampleRate;
            } else {
                // One file has one rate: later samples are kept at the first rate.
                __android_log_print(ANDROID_LOG_ERROR, kTag,
                                    "wav:%s is kept at %u Hz, the output now runs at %u Hz",
                                    mPath.c_str(), mRate, sampleRate);
            }
        }
        mPacing.start(sampleRate);
        return 0;
    }

    int write(const int16_t* samples, size_t count) override {
        int rc = 0;
        if (mFile && count > 0) {
            if (sf_writef_short(mFile, samples, static_cast<sf_count_t>(count)) != static_cast<sf_count_t>(count)) {
                std::lock_guard<std::mutex> lock(mFailureLock);
                mFailure = std::string("cannot write: ") + sf_strerror(mFile);
                rc = android::UNKNOWN_ERROR;
            }
            mWritten += count;
        }
        mPacing.next(count);
        return rc;
    }

    void stop() override { mPacing.stop(); }
    std::string failure() const override {
        std::lock_guard<std::mutex> lock(mFailureLock);
        return mFailure;
    }

private:
    const std::string mPath;
    SNDFILE* mFile;
    uint32_t mRate;
    uint64_t mWritten = 0;
    OutputPacing mPacing;
    mutable std::mutex mFailureLock;
    std::string mFailure;
};

}  // namespace

bool checkWavCapture(const std::string& path, std::string* reason) {
    std::string error;
    auto route = makeWavCaptureRoute(path, &error);
    if (!route && reason) *reason = error;
    return route != nullptr;
}

bool checkWavOutput(const std::string& path, std::string* reason) {
    struct stat st{};
    const bool existed = stat(path.c_str(), &st) == 0;
    if (existed && S_ISDIR(st.st_mode)) {
        if (reason) *reason = "cannot write: Is a directory";
        return false;
    }
    SNDFILE* file = createWav(path, kDefaultRate);
    if (!file) {
        if (reason) *reason = std::string("cannot write: ") + std::strerror(errno);
        return false;
    }
    const int16_t probe[1] = {0};
    const bool ok = sf_writef_short(file, probe, 1) == 1 && sf_error(file) == SF_ERR_NO_ERROR;
    const std::string why = sf_strerror(file);
    sf_close(file);
    if (!existed) unlink(path.c_str());
    if (!ok && reason) *reason = "cannot write: " + why;
    return ok;
}

std::unique_ptr<CaptureRoute> makeWavCaptureRoute(const std::string& path, std::string* error) {
    SF_INFO info{};
    SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
    if (!file) {
        if (error) *error = "cannot read WAV file '" + path + "': " + sf_strerror(nullptr);
        return nullptr;
    }
    if (info.channels < 1) {
        sf_close(file);
        if (error) *error = "WAV file '" + path + "' has no channel";
        return nullptr;
    }
    return std::make_unique<WavCaptureRoute>(path, file, info);
}

std::unique_ptr<OutputRoute> makeWavOutputRoute(const std::string& path, std::string* error) {
    SNDFILE* file = createWav(path, kDefaultRate);
    if (!file) {
        if (error) *error = "cannot write WAV file '" + path + "': " + sf_strerror(nullptr);
        return nullptr;
    }
    return std::make_unique<WavOutputRoute>(path, file);
}

}  // namespace platform
}  // namespace korvo
