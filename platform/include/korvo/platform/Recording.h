// A recording as the wav route's microphone delivers it: mono 16-bit samples at a chosen
// rate (libsndfile decodes, libsamplerate converts), but as fast as they can be read.
// Offline tools read a file through it and see the very samples a live listener would.
#pragma once
#include <cstdint>
#include <memory>
#include <string>

#include <korvo/platform/Export.h>

namespace korvo {
namespace platform {

class KORVO_PLATFORM_API Recording {
public:
    // Opens PATH ("-": standard input, read as it comes) for delivery at `rate`, after the
    // same checks as the wav route's; null with the cause in a few words ("cannot open:
    // No such file or directory", "has no samples").
    static std::unique_ptr<Recording> open(const std::string& path, uint32_t rate, std::string* cause);
    virtual ~Recording();

    // Up to `count` samples into `out`: fewer only at the end, 0 after the last sample,
    // -1 with the cause when the file cannot be decoded further.
    virtual long read(int16_t* out, long count, std::string* cause) = 0;
    // Length of the whole recording at its own rate; 0 when unknown (a stream).
    virtual double totalSeconds() const = 0;
};

// Ends every wait for the bytes of a stream (standard input, a FIFO): its recordings end
// as if the writer had closed it. For Ctrl-C: safe to call in a signal handler.
KORVO_PLATFORM_API void interruptRecordings();

}  // namespace platform
}  // namespace korvo
