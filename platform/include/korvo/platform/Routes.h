// Audio routes of the platform stand-in: where a capture stream's samples come
// from and where an output track's samples go. A route is chosen per process
// by a ROUTE text:
//   null        silence in, or paced discard out
//   wav:PATH    a 16-bit WAV file (its samples, then silence / every sample written)
//   sim:ROOM    a simulated room in shared memory, shared by processes
//   card[:DEV]  a real sound card
// The microphone's ROUTE comes from KORVO_MIC, the speaker's from KORVO_SPEAKER
// (both default to null); a host may set them with setenv before it opens streams.
//
// A route's open, read and write come from one thread at a time; stop() may come from
// any thread. A stop lasts until the next open(), which resumes the route (a file goes
// on where it was).
#pragma once
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include <korvo/platform/Export.h>

namespace korvo {
namespace platform {

// Source of microphone samples. Every route delivers at the real-time pace of a
// microphone (never faster than its sample rate).
class KORVO_PLATFORM_API CaptureRoute {
public:
    virtual ~CaptureRoute();
    // Prepares delivery at the given rate; 0 or a negative status.
    virtual int open(uint32_t sampleRate) = 0;
    // Blocks until `count` samples are there or stop() is called; writes them to
    // `out` and returns the number written (short after stop) or a negative status.
    virtual ssize_t read(int16_t* out, size_t count) = 0;
    // May be called from another thread; makes a blocked read return at once.
    virtual void stop() = 0;
};

// Sink of loudspeaker samples. write() paces the caller at the real-time rate.
class KORVO_PLATFORM_API OutputRoute {
public:
    virtual ~OutputRoute();
    virtual int open(uint32_t sampleRate) = 0;
    // Takes `count` samples; returns when the route is ready for the next buffer.
    virtual void write(const int16_t* samples, size_t count) = 0;
    // May be called from another thread; makes a blocked write return at once.
    virtual void stop() = 0;
};

// Builds a route from a ROUTE text; null with a one-line reason in *error on a bad text.
KORVO_PLATFORM_API std::unique_ptr<CaptureRoute> makeCaptureRoute(const std::string& route,
                                                                  std::string* error);
KORVO_PLATFORM_API std::unique_ptr<OutputRoute> makeOutputRoute(const std::string& route,
                                                                std::string* error);
// Checks a ROUTE text without opening anything; false with a reason when it is not valid.
KORVO_PLATFORM_API bool validateRoute(const std::string& route, std::string* error);

// The ROUTE texts in force for this process (environment, else "null").
KORVO_PLATFORM_API std::string micRoute();
KORVO_PLATFORM_API std::string speakerRoute();

// Output sampling rate of a speaker route (44100 unless the route says otherwise).
KORVO_PLATFORM_API uint32_t outputRateOf(const std::string& route);

}  // namespace platform
}  // namespace korvo
