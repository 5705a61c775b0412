// A recording decoded and converted to 16-bit samples at a stream's rate: the wav
// route's microphone paces it, offline readers take it as it comes.
#pragma once
#include <korvo/platform/Recording.h>

#include <vector>

#include "routes/wav/ResampledInput.h"
#include "routes/wav/SoundFileInput.h"

namespace korvo {
namespace platform {

class RecordingReader : public Recording {
public:
    explicit RecordingReader(std::unique_ptr<SoundFileInput> input);

    // Delivers at `rate` from now on; false with the cause.
    bool setRate(uint32_t rate, std::string* cause) { return mConverted.setRate(rate, cause); }
    long read(int16_t* out, long count, std::string* cause) override;
    double totalSeconds() const override { return mTotalSeconds; }

private:
    std::unique_ptr<SoundFileInput> mInput;
    ResampledInput mConverted;
    std::vector<float> mBlock;
    double mTotalSeconds;
};

}  // namespace platform
}  // namespace korvo
