// A device's clock, off the room's by some parts per million: its loudspeaker plays and its
// microphone samples at (1 + ppm / 1e6) times the room's rate. Done by libsamplerate's
// medium-quality converter, whose pass band (90 % of half the rate: 19.8 kHz) is about that
// of a device's own converters. Real-time: push() and pull() neither allocate nor block
// (beyond what the pull source does).
#pragma once
#include <samplerate.h>

#include <memory>
#include <string>

namespace korvo {
namespace platform {
namespace acoustics {

class ClockDrift {
public:
    // Where a microphone's converter takes the room's samples from: sets *data to the next
    // samples and returns how many (0 when there are no more).
    class Source {
    public:
        virtual ~Source() = default;
        virtual long fetch(float** data) = 0;
    };

    // A loudspeaker's clock: push() turns device samples into room samples.
    static std::unique_ptr<ClockDrift> forSpeaker(double ppm, std::string* error);
    // A microphone's clock: pull() turns the source's room samples into device samples.
    static std::unique_ptr<ClockDrift> forMicrophone(double ppm, Source* source, std::string* error);
    ~ClockDrift();
    ClockDrift(const ClockDrift&) = delete;
    ClockDrift& operator=(const ClockDrift&) = delete;

    // Consumes all `count` samples; returns how many were written to out (at most maxOut,
    // which must exceed count * ratio + 16).
    long push(const float* in, long count, float* out, long maxOut);
    // Up to `count` device samples; fewer when the source ran dry.
    long pull(float* out, long count);

    double ratio() const { return mRatio; }

private:
    explicit ClockDrift(double ratio) : mRatio(ratio) {}
    static long callback(void* self, float** data);

    double mRatio;  // output samples per input sample
    SRC_STATE* mState = nullptr;
    Source* mSource = nullptr;
};

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
