// PortAudio's lifetime for the card routes: one Pa_Initialize per user, under the lock
// that every set-up, tear-down, device query and stream opening takes, since none of
// those is thread-safe in PortAudio.
#pragma once
#include <portaudio.h>

#include <mutex>
#include <string>

namespace korvo {
namespace platform {
namespace card {

std::mutex& paLock();

// Holds one Pa_Initialize; PortAudio is terminated when the last holder goes.
class Session {
public:
    Session();
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    bool ok() const { return mStatus == paNoError; }
    // Why PortAudio did not start, in a few words.
    std::string error() const;

private:
    PaError mStatus;
};

// A PortAudio error in a few words; a host error carries the sound system's own text.
std::string errorText(PaError err);

}  // namespace card
}  // namespace platform
}  // namespace korvo
