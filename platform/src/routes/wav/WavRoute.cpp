// The wav route as a microphone: a recording's samples, mixed down to mono and converted
// to the stream's rate, at the real-time pace of a microphone; after the file, silence.
#include <algorithm>
#include <mutex>
#include <vector>

#include <utils/Errors.h>

#include "routes/common/Pacer.h"
#include "routes/wav/RecordingReader.h"
#include "routes/wav/ResampledInput.h"
#include "routes/wav/WavRoutes.h"
#include "routes/wav/SoundFileInput.h"

namespace korvo {
namespace platform {

namespace {

constexpr long kDecodeBlock = 1024;
// Every capture stream of the platform runs at it.
constexpr uint32_t kMicrophoneRate = 44100;

class WavCaptureRoute : public CaptureRoute {
public:
    explicit WavCaptureRoute(std::unique_ptr<SoundFileInput> input) : mReader(std::move(input)), mBlock(kDecodeBlock) {
        mProgress.finite = true;
        mProgress.totalSeconds = mReader.totalSeconds();
    }

    int open(uint32_t sampleRate) override {
        std::string cause;
        if (sampleRate == 0) {
            cause = "cannot open: no sample rate";
        } else if (mReader.setRate(sampleRate, &cause)) {
            mRate = sampleRate;
            mPacing.start(sampleRate);
            return 0;
        }
        fail(cause);
        return android::BAD_VALUE;
    }

    ssize_t read(int16_t* out, size_t count) override {
        if (mRate == 0) return android::NO_INIT;
        if (mFailed) return android::UNKNOWN_ERROR;
        // Decoded before the wait, so that a broken file fails at once.
        while (mPending.size() - mHead < count && !mEnded) {
            std::string cause;
            const long got = mReader.read(mBlock.data(), kDecodeBlock, &cause);
            if (got < 0) {
                fail(cause);
                return android::UNKNOWN_ERROR;
            }
            mEnded = got == 0;
            mPending.insert(mPending.end(), mBlock.begin(), mBlock.begin() + got);
        }
        const size_t n = mPacing.next(count);
        const size_t fromFile = std::min(n, mPending.size() - mHead);
        std::copy_n(mPending.begin() + static_cast<std::ptrdiff_t>(mHead), fromFile, out);
        std::fill(out + fromFile, out + n, int16_t{0});
        mHead += fromFile;
        mDelivered += fromFile;
        if (mHead >= static_cast<size_t>(kDecodeBlock)) {
            mPending.erase(mPending.begin(), mPending.begin() + static_cast<std::ptrdiff_t>(mHead));
            mHead = 0;
        }
        std::lock_guard<std::mutex> lock(mStatusLock);
        mProgress.ended = mEnded && mHead == mPending.size();
        // Conversion may end a sample or two away from the exact length: the end is the total.
        const double played = static_cast<double>(mDelivered) / mRate;
        const double total = mProgress.totalSeconds;  // 0: a stream of unknown length
        mProgress.seconds = total <= 0 ? played : mProgress.ended ? total : std::min(played, total);
        return static_cast<ssize_t>(n);
    }

    void stop() override { mPacing.stop(); }

    std::string failure() const override {
        std::lock_guard<std::mutex> lock(mStatusLock);
        return mFailure;
    }

    SourceProgress progress() const override {
        std::lock_guard<std::mutex> lock(mStatusLock);
        return mProgress;
    }

private:
    void fail(const std::string& cause) {
        mFailed = true;
        std::lock_guard<std::mutex> lock(mStatusLock);
        mFailure = cause;
    }

    RecordingReader mReader;
    std::vector<int16_t> mBlock;
    std::vector<int16_t> mPending;  // converted samples not delivered yet, from mHead on
    size_t mHead = 0;
    bool mEnded = false;
    uint64_t mDelivered = 0;
    uint32_t mRate = 0;  // 0 until opened
    bool mFailed = false;
    CapturePacing mPacing;
    mutable std::mutex mStatusLock;
    std::string mFailure;
    SourceProgress mProgress;
};

}  // namespace

bool checkRecording(const std::string& path, uint32_t rate, std::string* reason) {
    SoundFileInput input;
    std::vector<float> block(kDecodeBlock);
    std::string cause;
    if (!input.open(path, &cause)) {
        if (reason) *reason = cause;
        return false;
    }
    if (!ResampledInput::convertible(input.rate(), rate, &cause)) {
        if (reason) *reason = cause;
        return false;
    }
    const sf_count_t got = input.readMono(block.data(), kDecodeBlock, &cause);
    if (got <= 0 && reason) *reason = got < 0 ? cause : "has no samples";
    return got > 0;
}

bool checkWavCapture(const std::string& path, std::string* reason) { return checkRecording(path, kMicrophoneRate, reason); }

std::unique_ptr<CaptureRoute> makeWavCaptureRoute(const std::string& path, std::string* error) {
    auto input = std::make_unique<SoundFileInput>();
    std::string cause;
    if (!input->open(path, &cause)) {
        if (error) *error = cause;
        return nullptr;
    }
    return std::make_unique<WavCaptureRoute>(std::move(input));
}

}  // namespace platform
}  // namespace korvo
