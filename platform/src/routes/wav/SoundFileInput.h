// A recording read through libsndfile, whatever format it reads (WAV of any sample
// type, FLAC, Ogg Vorbis, AIFF, ...), as mono float samples at the file's own rate.
#pragma once
#include <sndfile.h>

#include <memory>
#include <string>
#include <vector>

#include "routes/wav/StreamSource.h"

namespace korvo {
namespace platform {

class SoundFileInput {
public:
    SoundFileInput() = default;
    ~SoundFileInput();
    SoundFileInput(const SoundFileInput&) = delete;
    SoundFileInput& operator=(const SoundFileInput&) = delete;

    // Opens PATH, or standard input for "-" (a FIFO or device as a stream); false with the cause in a few words
    // ("cannot open: No such file or directory", "cannot decode: ...", "has no samples").
    bool open(const std::string& path, std::string* cause);
    int rate() const { return mInfo.samplerate; }
    // The length in frames; 0 when unknown (a stream's header may hold a placeholder).
    sf_count_t frames() const { return mLengthKnown ? mInfo.frames : 0; }

    // Reads up to `count` frames, every channel mixed into one, to `out` in [-1, 1]:
    // the number read, 0 after the last sample, or -1 with the cause when the file
    // cannot be decoded further.
    sf_count_t readMono(float* out, sf_count_t count, std::string* cause);

private:
    // Standard input, a FIFO or a device: read as it comes (see StreamSource).
    bool openStream(const std::string& path, std::string* cause);

    SNDFILE* mFile = nullptr;
    SF_INFO mInfo{};
    bool mLengthKnown = true;
    std::unique_ptr<StreamPump> mPump;  // feeds the pipe libsndfile reads a stream from
    std::string mBytes;                 // a FLAC stream's bytes, read by virtual I/O
    sf_count_t mOffset = 0;                     // position of the virtual I/O in mBytes
    sf_count_t mDelivered = 0;                  // frames read so far
    std::vector<float> mInterleaved;

    friend struct MemoryIo;
};

// libsndfile's reason for the last error of `file` (null: of the last failed open),
// without its "System error : " or "Error : " prefix and final full stop.
std::string sndfileReason(SNDFILE* file);

}  // namespace platform
}  // namespace korvo
