#include "routes/wav/RecordingReader.h"
#include "routes/wav/WavRoutes.h"

#include <algorithm>
#include <cmath>

namespace korvo {
namespace platform {

namespace {

int16_t toPcm16(float v) {
    return static_cast<int16_t>(std::lrint(std::clamp(v * 32768.0f, -32768.0f, 32767.0f)));
}

}  // namespace

Recording::~Recording() = default;

RecordingReader::RecordingReader(std::unique_ptr<SoundFileInput> input)
    : mInput(std::move(input)),
      mConverted(*mInput),
      mTotalSeconds(static_cast<double>(mInput->frames()) / mInput->rate()) {}

long RecordingReader::read(int16_t* out, long count, std::string* cause) {
    long done = 0;
    while (done < count) {
        mBlock.resize(static_cast<size_t>(count - done));
        const long got = mConverted.read(mBlock.data(), count - done, cause);
        if (got < 0) return -1;
        if (got == 0) break;
        for (long i = 0; i < got; ++i) out[done + i] = toPcm16(mBlock[static_cast<size_t>(i)]);
        done += got;
    }
    return done;
}

std::unique_ptr<Recording> Recording::open(const std::string& path, uint32_t rate, std::string* cause) {
    auto input = std::make_unique<SoundFileInput>();
    std::string why;
    if (rate == 0) {
        why = "cannot open: no sample rate";
    } else if (checkRecording(path, rate, &why) && input->open(path, &why)) {
        auto reader = std::make_unique<RecordingReader>(std::move(input));
        if (reader->setRate(rate, &why)) return reader;
    }
    if (cause) *cause = why;
    return nullptr;
}

}  // namespace platform
}  // namespace korvo
