// A recording's mono samples at the rate a stream asks for, converted by libsamplerate.
#pragma once
#include <samplerate.h>

#include <cstdint>
#include <string>
#include <vector>

#include "routes/wav/SoundFileInput.h"

namespace korvo {
namespace platform {

class ResampledInput {
public:
    explicit ResampledInput(SoundFileInput& input) : mInput(input) {}
    ~ResampledInput();
    ResampledInput(const ResampledInput&) = delete;
    ResampledInput& operator=(const ResampledInput&) = delete;

    // Whether a recording at `fileRate` can be delivered at `rate`; false with the cause.
    static bool convertible(int fileRate, uint32_t rate, std::string* cause);
    // Delivers at `rate` from now on, going on where the samples were; false with the cause.
    bool setRate(uint32_t rate, std::string* cause);
    // Up to `count` samples at the rate set: the number written to `out`, 0 after the
    // last sample, or -1 with the cause.
    long read(float* out, long count, std::string* cause);

private:
    static long pull(void* self, float** data);

    SoundFileInput& mInput;
    SRC_STATE* mState = nullptr;  // none while the rates are equal: samples pass unchanged
    double mRatio = 1.0;
    std::vector<float> mBlock;  // input handed to the converter
    std::string mPullFailure;   // why the converter's input ended early
};

}  // namespace platform
}  // namespace korvo
