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
    // Opens PATH ("-": standard input, read whole) for delivery at `rate`; null with the
    // cause in a few words ("cannot open: No such file or directory").
    static std::unique_ptr<Recording> open(const std::string& path, uint32_t rate, std::string* cause);
    virtual ~Recording();

    // Up to `count` samples into `out`: fewer only at the end, 0 after the last sample,
    // -1 with the cause when the file cannot be decoded further.
    virtual long read(int16_t* out, long count, std::string* cause) = 0;
    // Length of the whole recording at its own rate.
    virtual double totalSeconds() const = 0;
};

}  // namespace platform
}  // namespace korvo
