#include "routes/card/CardStream.h"

#include <log/log.h>

#include <algorithm>
#include <chrono>

#include "routes/card/CardDevices.h"
#include "routes/card/CardSession.h"

namespace korvo {
namespace platform {
namespace card {

namespace {

using Clock = std::chrono::steady_clock;

constexpr const char* kTag = "SoundCard";
// A device that moves nothing for this long has failed. Above the longest start-up
// pause seen from a sound server (its first render can lie two seconds ahead).
constexpr auto kStallLimit = std::chrono::seconds(5);
// How long a capture stream's opening waits for its first sound.
constexpr auto kFirstSoundLimit = std::chrono::seconds(3);

}  // namespace

bool CardStream::open(uint32_t rate) {
    close();
    {
        std::lock_guard<std::mutex> lock(mFailureLock);
        mFailure.clear();
    }
    {
        std::lock_guard<std::mutex> lock(mWaitLock);
        mStopped.store(false);
    }
    mRate = double(rate);
    PaError err;
    {
        std::lock_guard<std::mutex> lock(paLock());
        const PaStreamParameters p = streamParameters(mDevice, mInput);
        err = Pa_OpenStream(&mStream, mInput ? &p : nullptr, mInput ? nullptr : &p, mRate,
                            paFramesPerBufferUnspecified, paClipOff, nullptr, nullptr);
        if (err != paNoError) {
            mStream = nullptr;
        } else if ((err = Pa_StartStream(mStream)) != paNoError) {
            Pa_CloseStream(mStream);
            mStream = nullptr;
        }
    }
    if (err != paNoError) return fail("the sound card cannot open: " + errorText(err));
    // An idle sound server may have rendered up to two seconds ahead before this stream
    // came, and delivers to it only once that render has run out (meanwhile it plays
    // nothing new either). A capture that delivers nothing yet is not listening yet, so
    // opening waits for the first sound: a peer told "listening" is then heard at once.
    return !mInput || waitForFirstSound();
}

void CardStream::close() {
    if (!mStream) return;
    std::lock_guard<std::mutex> lock(paLock());
    // A failed device has nothing to drain.
    if (failed()) {
        Pa_AbortStream(mStream);
    } else {
        Pa_StopStream(mStream);
    }
    Pa_CloseStream(mStream);
    mStream = nullptr;
}

bool CardStream::read(int16_t* out, size_t count, size_t* moved) {
    *moved = 0;
    return move(count, moved, [&](unsigned long n) { return Pa_ReadStream(mStream, out + *moved, n); });
}

bool CardStream::write(const int16_t* samples, size_t count) {
    size_t moved = 0;
    return move(count, &moved, [&](unsigned long n) { return Pa_WriteStream(mStream, samples + moved, n); });
}

template <typename Step>
bool CardStream::move(size_t count, size_t* moved, Step step) {
    if (failed()) return false;  // once is enough: no more calls into a broken device
    if (!mStream) return fail("the sound card is not open");
    Clock::time_point lastMoved = Clock::now();
    while (*moved < count && !mStopped.load()) {
        const long n = ready();
        if (n < 0) return fail("the sound card failed: " + errorText(PaError(n)));
        if (n == 0) {
            if (Clock::now() - lastMoved > kStallLimit) {
                return fail("the sound card failed: nothing moved for " +
                            std::to_string(std::chrono::duration_cast<std::chrono::seconds>(kStallLimit).count()) +
                            " s");
            }
            pause(count - *moved);
            continue;
        }
        const unsigned long frames = std::min<unsigned long>(static_cast<unsigned long>(n), count - *moved);
        const PaError err = step(frames);
        // A lost or late block is no failure.
        if (err != paNoError && err != paInputOverflowed && err != paOutputUnderflowed) {
            return fail("the sound card failed: " + errorText(err));
        }
        *moved += frames;
        lastMoved = Clock::now();
    }
    return true;
}

long CardStream::ready() {
    const long n = mInput ? Pa_GetStreamReadAvailable(mStream) : Pa_GetStreamWriteAvailable(mStream);
    // PortAudio restarts a device after an overrun or underrun; it is ready again later.
    return n == paInputOverflowed || n == paOutputUnderflowed ? 0 : n;
}

bool CardStream::pause(size_t frames) {
    // About the time the wanted frames take, within 1..10 ms: no busy loop, and stop()
    // or a device that gets ready is seen soon.
    const auto wanted = std::chrono::microseconds(static_cast<int64_t>(double(frames) * 1e6 / mRate));
    const auto step = std::clamp<std::chrono::microseconds>(wanted, std::chrono::milliseconds(1),
                                                            std::chrono::milliseconds(10));
    std::unique_lock<std::mutex> lock(mWaitLock);
    return !mWake.wait_for(lock, step, [&] { return mStopped.load(); });
}

bool CardStream::waitForFirstSound() {
    const Clock::time_point deadline = Clock::now() + kFirstSoundLimit;
    for (;;) {
        const long n = ready();
        if (n < 0) return fail("the sound card failed: " + errorText(PaError(n)));
        if (n > 0) return true;
        if (Clock::now() >= deadline) {
            // Reads will tell whether it ever comes.
            __android_log_print(ANDROID_LOG_WARN, kTag, "the sound card sent no sound within %lld s",
                                static_cast<long long>(
                                    std::chrono::duration_cast<std::chrono::seconds>(kFirstSoundLimit).count()));
            return true;
        }
        if (!pause(256)) return true;  // stopped: the next read returns at once
    }
}

void CardStream::stop() {
    {
        std::lock_guard<std::mutex> lock(mWaitLock);
        mStopped.store(true);
    }
    mWake.notify_all();
}

std::string CardStream::failure() const {
    std::lock_guard<std::mutex> lock(mFailureLock);
    return mFailure;
}

bool CardStream::fail(const std::string& why) {
    __android_log_print(ANDROID_LOG_ERROR, kTag, "sound card %s: %s", mInput ? "input" : "output", why.c_str());
    std::lock_guard<std::mutex> lock(mFailureLock);
    mFailure = why;
    return false;
}

bool CardStream::failed() const {
    std::lock_guard<std::mutex> lock(mFailureLock);
    return !mFailure.empty();
}

}  // namespace card
}  // namespace platform
}  // namespace korvo
