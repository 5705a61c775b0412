// The card[:DEVICE] routes: a real sound card through PortAudio's blocking
// streams, 44100 Hz mono 16-bit. DEVICE chooses the device (CardDevices.h).
#include <log/log.h>
#include <portaudio.h>
#include <utils/Errors.h>

#include <algorithm>
#include <atomic>
#include <mutex>

#include "routes/CardDevices.h"
#include "routes/CardSession.h"
#include "routes/RouteFactories.h"

namespace korvo {
namespace platform {

namespace {

constexpr const char* kTag = "SoundCard";
// Blocking calls move this many frames at a time, so stop() is seen within ~6 ms.
constexpr unsigned long kPieceFrames = 256;

// An open blocking stream on one device, mono 16-bit.
class CardStream {
public:
    CardStream(PaDeviceIndex device, bool input) : mDevice(device), mInput(input) {}
    ~CardStream() { close(); }

    bool open(double rate) {
        close();
        std::lock_guard<std::mutex> lock(card::paLock());
        const PaStreamParameters p = card::streamParameters(mDevice, mInput);
        PaError err = Pa_OpenStream(&mStream, mInput ? &p : nullptr, mInput ? nullptr : &p, rate,
                                    paFramesPerBufferUnspecified, paClipOff, nullptr, nullptr);
        if (err == paNoError) {
            err = Pa_StartStream(mStream);
            if (err != paNoError) {
                Pa_CloseStream(mStream);
                mStream = nullptr;
            }
        } else {
            mStream = nullptr;
        }
        if (err != paNoError) {
            __android_log_print(ANDROID_LOG_ERROR, kTag, "cannot open sound card %s %d at %.0f Hz: %s",
                                mInput ? "input" : "output", mDevice, rate, Pa_GetErrorText(err));
            return false;
        }
        return true;
    }

    void close() {
        if (!mStream) return;
        std::lock_guard<std::mutex> lock(card::paLock());
        Pa_StopStream(mStream);
        Pa_CloseStream(mStream);
        mStream = nullptr;
    }

    PaStream* stream() const { return mStream; }

private:
    PaDeviceIndex mDevice;
    bool mInput;
    PaStream* mStream = nullptr;
};

class CardCaptureRoute : public CaptureRoute {
public:
    CardCaptureRoute(std::unique_ptr<card::Session> session, PaDeviceIndex device)
        : mSession(std::move(session)), mStream(device, true) {}

    int open(uint32_t sampleRate) override {
        mStopped.store(false, std::memory_order_relaxed);
        return mStream.open(double(sampleRate)) ? android::OK : android::NO_INIT;
    }

    ssize_t read(int16_t* out, size_t count) override {
        if (!mStream.stream()) return android::NO_INIT;
        size_t done = 0;
        while (done < count && !mStopped.load(std::memory_order_relaxed)) {
            const unsigned long n = std::min<unsigned long>(count - done, kPieceFrames);
            const PaError err = Pa_ReadStream(mStream.stream(), out + done, n);
            if (err != paNoError && err != paInputOverflowed) {  // a lost block is no failure
                __android_log_print(ANDROID_LOG_ERROR, kTag, "sound card read failed: %s",
                                    Pa_GetErrorText(err));
                setFailure(std::string("the sound card failed: ") + Pa_GetErrorText(err));
                return ssize_t(android::UNKNOWN_ERROR);
            }
            done += n;
        }
        return ssize_t(done);
    }

    void stop() override { mStopped.store(true, std::memory_order_relaxed); }
    std::string failure() const override {
        std::lock_guard<std::mutex> lock(mFailureLock);
        return mFailure;
    }

private:
    void setFailure(const std::string& why) {
        std::lock_guard<std::mutex> lock(mFailureLock);
        mFailure = why;
    }
    std::unique_ptr<card::Session> mSession;  // outlives the stream
    CardStream mStream;
    std::atomic<bool> mStopped{false};
    mutable std::mutex mFailureLock;
    std::string mFailure;
};

class CardOutputRoute : public OutputRoute {
public:
    CardOutputRoute(std::unique_ptr<card::Session> session, PaDeviceIndex device)
        : mSession(std::move(session)), mStream(device, false) {}

    int open(uint32_t sampleRate) override {
        mStopped.store(false, std::memory_order_relaxed);
        return mStream.open(double(sampleRate)) ? android::OK : android::NO_INIT;
    }

    int write(const int16_t* samples, size_t count) override {
        if (!mStream.stream()) return android::NO_INIT;
        size_t done = 0;
        while (done < count && !mStopped.load(std::memory_order_relaxed)) {
            const unsigned long n = std::min<unsigned long>(count - done, kPieceFrames);
            const PaError err = Pa_WriteStream(mStream.stream(), samples + done, n);
            if (err != paNoError && err != paOutputUnderflowed) {  // a late block is no failure
                __android_log_print(ANDROID_LOG_ERROR, kTag, "sound card write failed: %s",
                                    Pa_GetErrorText(err));
                std::lock_guard<std::mutex> lock(mFailureLock);
                mFailure = std::string("the sound card failed: ") + Pa_GetErrorText(err);
                return android::UNKNOWN_ERROR;
            }
            done += n;
        }
        return android::OK;
    }

    void stop() override { mStopped.store(true, std::memory_order_relaxed); }
    std::string failure() const override {
        std::lock_guard<std::mutex> lock(mFailureLock);
        return mFailure;
    }

private:
    std::unique_ptr<card::Session> mSession;
    CardStream mStream;
    std::atomic<bool> mStopped{false};
    mutable std::mutex mFailureLock;
    std::string mFailure;
};

// Starts PortAudio and finds the device; null with a one-line reason on failure.
std::unique_ptr<card::Session> prepare(const std::string& device, bool input, PaDeviceIndex* index,
                                   std::string* error) {
    auto session = std::make_unique<card::Session>();
    if (!session->ok()) {
        if (error) *error = "no sound card: " + session->error();
        return nullptr;
    }
    *index = card::chooseDevice(device, input, error);
    if (*index == paNoDevice || !card::supportsCardFormat(*index, input, error)) return nullptr;
    return session;
}

}  // namespace

bool checkCardRoute(const std::string& device, bool input, std::string* reason) {
    PaDeviceIndex index = paNoDevice;
    return prepare(device, input, &index, reason) != nullptr;
}

std::unique_ptr<CaptureRoute> makeCardCaptureRoute(const std::string& device, std::string* error) {
    PaDeviceIndex index = paNoDevice;
    auto session = prepare(device, true, &index, error);
    if (!session) return nullptr;
    return std::make_unique<CardCaptureRoute>(std::move(session), index);
}

std::unique_ptr<OutputRoute> makeCardOutputRoute(const std::string& device, std::string* error) {
    PaDeviceIndex index = paNoDevice;
    auto session = prepare(device, false, &index, error);
    if (!session) return nullptr;
    return std::make_unique<CardOutputRoute>(std::move(session), index);
}

}  // namespace platform
}  // namespace korvo
