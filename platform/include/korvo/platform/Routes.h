// Audio routes of the platform stand-in: where a capture stream's samples come
// from and where an output track's samples go. A route is chosen per process
// by a ROUTE text:
//   null        silence in, or paced discard out
//   wav:PATH    a sound file: its samples, then silence / a recording of the loudspeaker
//   sim:ROOM    a simulated room in shared memory, shared by processes
//   card[:DEV]  a real sound card
// The microphone's ROUTE comes from KORVO_MIC, the speaker's from KORVO_SPEAKER
// (both default to null); a host may set them with setenv before it opens streams.
//
// A route's open, read and write come from one thread at a time; stop(), failure()
// and progress() may come from any thread. A stop lasts until the next open(), which
// resumes the route (a file goes on where it was).
//
// A route that fails says why through failure(), in a few words ("cannot open: No such
// file or directory"); the streams and the checks put the route's text in front, so a
// reason reads "wav:/x.wav: cannot open: No such file or directory". The streams built
// on the routes (AudioRecord, AudioTrack) keep a real-time pace when their route fails,
// like a broken microphone or loudspeaker, and publish the failure to the process's
// route status below.
#pragma once
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include <korvo/platform/Export.h>

namespace korvo {
namespace platform {

// Where a finite source (a file) stands. Endless sources are not finite.
struct SourceProgress {
    bool finite = false;
    bool ended = false;         // every sample of the source has been delivered
    double seconds = 0.0;       // of the source delivered so far
    double totalSeconds = 0.0;  // of the whole source (0 when unknown)
};

// Source of microphone samples. Every route delivers at the real-time pace of a
// microphone (never faster than its sample rate).
class KORVO_PLATFORM_API CaptureRoute {
public:
    virtual ~CaptureRoute();
    // Prepares delivery at the given rate; 0, or a negative status with failure() set.
    virtual int open(uint32_t sampleRate) = 0;
    // Blocks until `count` samples are there or stop() is called; writes them to `out`
    // and returns the number written (short only after stop) or a negative status
    // with failure() set. A failing read may return at once: the stream paces it.
    virtual ssize_t read(int16_t* out, size_t count) = 0;
    // May be called from another thread; makes a blocked read return at once.
    virtual void stop() = 0;
    // Why the route failed, in a few words; empty while it works.
    virtual std::string failure() const = 0;
    virtual SourceProgress progress() const { return SourceProgress{}; }
};

// Sink of loudspeaker samples. write() paces the caller at the real-time rate.
class KORVO_PLATFORM_API OutputRoute {
public:
    virtual ~OutputRoute();
    // 0, or a negative status with failure() set.
    virtual int open(uint32_t sampleRate) = 0;
    // Takes `count` samples and returns when the route is ready for the next buffer:
    // 0, or a negative status with failure() set (the stream then keeps the pace).
    virtual int write(const int16_t* samples, size_t count) = 0;
    // May be called from another thread; makes a blocked write return at once.
    virtual void stop() = 0;
    virtual std::string failure() const = 0;
};

// Builds a route from a ROUTE text; null with a one-line reason in *error.
KORVO_PLATFORM_API std::unique_ptr<CaptureRoute> makeCaptureRoute(const std::string& route,
                                                                  std::string* error);
KORVO_PLATFORM_API std::unique_ptr<OutputRoute> makeOutputRoute(const std::string& route,
                                                                std::string* error);
// Checks a ROUTE text without opening anything; false with a reason when it is not valid.
KORVO_PLATFORM_API bool validateRoute(const std::string& route, std::string* error);

// Checks that a route can be used now, as a microphone or as a speaker, and leaves
// nothing behind: the file opens and decodes, the folder is writable, the room can be
// joined, the card exists and offers the channels and the rate. False with one
// sentence naming the route and the cause.
KORVO_PLATFORM_API bool checkCaptureRoute(const std::string& route, std::string* reason);
KORVO_PLATFORM_API bool checkOutputRoute(const std::string& route, std::string* reason);
// The loudspeakers that processes other than `ours` hold now in the simulated room a
// ROUTE names: 0 for a room nobody is in, and for routes that are not rooms. -1 with a
// reason naming the route when the room cannot be read.
KORVO_PLATFORM_API int routeRoomSpeakers(const std::string& route, const std::vector<pid_t>& ours,
                                         std::string* reason);

// The state of this process's microphone or speaker stream: the route it uses and
// whether that route has failed (one sentence naming the route and the cause).
struct RouteStatus {
    std::string route;  // empty before a stream has chosen its route
    bool failed = false;
    std::string reason;
    SourceProgress progress;  // the microphone's source
};
KORVO_PLATFORM_API RouteStatus microphoneStatus();
KORVO_PLATFORM_API RouteStatus speakerStatus();

// The ROUTE texts in force for this process (environment, else "null").
KORVO_PLATFORM_API std::string micRoute();
KORVO_PLATFORM_API std::string speakerRoute();

// Output sampling rate of a speaker route (44100 unless the route says otherwise).
KORVO_PLATFORM_API uint32_t outputRateOf(const std::string& route);

// What the card route can open.
struct CardDevice {
    int index = -1;
    std::string name;
    int inputChannels = 0;
    int outputChannels = 0;
    double defaultRate = 0.0;
    bool defaultInput = false;
    bool defaultOutput = false;
};
// False with a reason when the sound system cannot be asked.
KORVO_PLATFORM_API bool listCardDevices(std::vector<CardDevice>* devices, std::string* error);

}  // namespace platform
}  // namespace korvo
