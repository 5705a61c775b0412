// The card[:DEVICE] routes: a real sound card through PortAudio's blocking
// streams, 44100 Hz (capture) mono 16-bit. DEVICE is empty for the default
// device, a number for a device index, else a case-insensitive part of the name.
#include <log/log.h>
#include <portaudio.h>
#include <utils/Errors.h>

#include <algorithm>
#include <atomic>
#include <cctype>
#include <mutex>
#include <vector>

#include "routes/CardSession.h"
#include "routes/RouteFactories.h"

namespace korvo {
namespace platform {

namespace {

constexpr const char* kTag = "SoundCard";
constexpr double kCardRate = 44100.0;  // what every route is checked for up front
// Blocking calls move this many frames at a time, so stop() is seen within ~6 ms.
constexpr unsigned long kPieceFrames = 256;

// Error texts stay on one line whatever the user typed.
std::string printable(std::string s) {
    for (char& c : s) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
    }
    return s;
}

std::string lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(),
                   [](unsigned char c) { return char(std::tolower(c)); });
    return s;
}

int channelsOf(const PaDeviceInfo* info, bool input) {
    return info ? (input ? info->maxInputChannels : info->maxOutputChannels) : 0;
}

// Finds the device; paNoDevice with a one-line reason when there is none.
PaDeviceIndex findDevice(const std::string& device, bool input, std::string* error) {
    std::lock_guard<std::mutex> lock(card::paLock());
    const char* dir = input ? "input" : "output";
    auto fail = [&](const std::string& why) {
        if (error) *error = why;
        return paNoDevice;
    };
    const PaDeviceIndex count = Pa_GetDeviceCount();
    if (count < 0) return fail(std::string("PortAudio cannot list devices: ") + Pa_GetErrorText(count));
    if (device.empty()) {
        const PaDeviceIndex d = input ? Pa_GetDefaultInputDevice() : Pa_GetDefaultOutputDevice();
        if (d == paNoDevice) return fail(std::string("no default sound card ") + dir + " device");
        return d;
    }
    if (std::all_of(device.begin(), device.end(), [](unsigned char c) { return std::isdigit(c); })) {
        const long index = device.size() > 9 ? -1 : std::stol(device);
        if (index < 0 || index >= count) {
            return fail("no sound card device number " + device + " (" + std::to_string(count) +
                        " devices)");
        }
        const PaDeviceInfo* info = Pa_GetDeviceInfo(PaDeviceIndex(index));
        if (channelsOf(info, input) < 1) {
            return fail("sound card device number " + device + " has no " + dir + " channels");
        }
        return PaDeviceIndex(index);
    }
    const std::string wanted = lower(device);
    for (PaDeviceIndex i = 0; i < count; ++i) {
        const PaDeviceInfo* info = Pa_GetDeviceInfo(i);
        if (channelsOf(info, input) >= 1 && info->name &&
            lower(info->name).find(wanted) != std::string::npos) {
            return i;
        }
    }
    return fail("no sound card " + std::string(dir) + " device matches '" + printable(device) + "'");
}

// An open blocking stream on one device, mono 16-bit.
class CardStream {
public:
    CardStream(PaDeviceIndex device, bool input) : mDevice(device), mInput(input) {}
    ~CardStream() { close(); }

    bool open(double rate) {
        close();
        std::lock_guard<std::mutex> lock(card::paLock());
        const PaDeviceInfo* info = Pa_GetDeviceInfo(mDevice);
        PaStreamParameters p{};
        p.device = mDevice;
        p.channelCount = 1;
        p.sampleFormat = paInt16;
        p.suggestedLatency = info ? (mInput ? info->defaultLowInputLatency
                                            : info->defaultLowOutputLatency)
                                  : 0.05;
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
            __android_log_print(ANDROID_LOG_ERROR, kTag, "cannot open sound card %s '%s' at %.0f Hz: %s",
                                mInput ? "input" : "output", info && info->name ? info->name : "?",
                                rate, Pa_GetErrorText(err));
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
    *index = findDevice(device, input, error);
    if (*index == paNoDevice) return nullptr;
    std::lock_guard<std::mutex> lock(card::paLock());
    const PaDeviceInfo* info = Pa_GetDeviceInfo(*index);
    PaStreamParameters p{};
    p.device = *index;
    p.channelCount = 1;
    p.sampleFormat = paInt16;
    p.suggestedLatency = input ? info->defaultLowInputLatency : info->defaultLowOutputLatency;
    const PaError err = Pa_IsFormatSupported(input ? &p : nullptr, input ? nullptr : &p, kCardRate);
    if (err != paFormatIsSupported) {
        if (error) {
            *error = std::string("sound card ") + (input ? "input" : "output") + " '" +
                     printable(info->name ? info->name : "?") + "' cannot run 44100 Hz mono 16-bit: " +
                     Pa_GetErrorText(err);
        }
        return nullptr;
    }
    return session;
}

}  // namespace

bool checkCardRoute(const std::string& device, bool input, std::string* reason) {
    PaDeviceIndex index = paNoDevice;
    return prepare(device, input, &index, reason) != nullptr;
}

bool listCardDevices(std::vector<CardDevice>* devices, std::string* error) {
    card::Session session;
    if (!session.ok()) {
        if (error) *error = session.error();
        return false;
    }
    std::lock_guard<std::mutex> lock(card::paLock());
    const PaDeviceIndex count = Pa_GetDeviceCount();
    if (count < 0) {
        if (error) *error = std::string("PortAudio cannot list devices: ") + Pa_GetErrorText(count);
        return false;
    }
    devices->clear();
    for (PaDeviceIndex i = 0; i < count; ++i) {
        const PaDeviceInfo* info = Pa_GetDeviceInfo(i);
        if (!info) continue;
        CardDevice d;
        d.index = i;
        d.name = info->name ? info->name : "";
        d.inputChannels = info->maxInputChannels;
        d.outputChannels = info->maxOutputChannels;
        d.defaultRate = info->defaultSampleRate;
        d.defaultInput = i == Pa_GetDefaultInputDevice();
        d.defaultOutput = i == Pa_GetDefaultOutputDevice();
        devices->push_back(d);
    }
    return true;
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
