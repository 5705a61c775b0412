// One open PortAudio stream on a card device, mono 16-bit, in one direction.
//
// Reads and writes move only what the device has ready and otherwise wait on their
// own: PortAudio's blocking calls poll without pause while a device delivers or takes
// nothing (a sound server whose clock has not come round yet, or one that is gone),
// which spins a core for as long as that lasts.
#pragma once
#include <portaudio.h>

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>

namespace korvo {
namespace platform {
namespace card {

class CardStream {
public:
    CardStream(PaDeviceIndex device, bool input) : mDevice(device), mInput(input) {}
    ~CardStream() { close(); }
    CardStream(const CardStream&) = delete;
    CardStream& operator=(const CardStream&) = delete;

    // Opens and starts the stream (a capture stream waits for its first sound); false
    // with failure() set.
    bool open(uint32_t rate);
    // Moves `count` samples from or to the device, as it gets ready: false with
    // failure() set, or true with *moved short of `count` only after stop().
    bool read(int16_t* out, size_t count, size_t* moved);
    bool write(const int16_t* samples, size_t count);
    // From any thread: ends the current wait, and later ones, until the next open().
    void stop();
    std::string failure() const;

private:
    void close();
    template <typename Step>
    bool move(size_t count, size_t* moved, Step step);
    // Frames the device has ready now; negative when it failed.
    long ready();
    // Waits about the time `frames` take; false once stopped.
    bool pause(size_t frames);
    bool waitForFirstSound();
    bool fail(const std::string& why);
    bool failed() const;

    const PaDeviceIndex mDevice;
    const bool mInput;
    PaStream* mStream = nullptr;
    double mRate = 0.0;

    std::mutex mWaitLock;
    std::condition_variable mWake;
    std::atomic<bool> mStopped{false};

    mutable std::mutex mFailureLock;
    std::string mFailure;
};

}  // namespace card
}  // namespace platform
}  // namespace korvo
