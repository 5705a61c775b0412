#include "routes/wav/ResampledInput.h"

namespace korvo {
namespace platform {

namespace {

constexpr long kBlockFrames = 1024;
// The fastest of libsamplerate's band-limited converters: tones stay clean of the images
// a linear one leaves, and a listener on a 48 kHz stereo file stays under 2 % of a core.
constexpr int kConverter = SRC_SINC_FASTEST;

}  // namespace

ResampledInput::~ResampledInput() {
    if (mState) src_delete(mState);
}

bool ResampledInput::convertible(int fileRate, uint32_t rate, std::string* cause) {
    // The converter takes ratios from 1/256 to 256.
    const double ratio = static_cast<double>(rate) / fileRate;
    if (ratio >= 1.0 / 256 && ratio <= 256.0) return true;
    *cause = "cannot convert the rate: " + std::to_string(fileRate) + " Hz is outside " +
             std::to_string((rate + 255) / 256) + ".." + std::to_string(uint64_t{rate} * 256) + " Hz";
    return false;
}

bool ResampledInput::setRate(uint32_t rate, std::string* cause) {
    if (!convertible(mInput.rate(), rate, cause)) return false;
    const double ratio = static_cast<double>(rate) / mInput.rate();
    if (!mState && ratio == 1.0) return true;
    if (!mState) {
        int error = 0;
        mState = src_callback_new(pull, kConverter, 1, &error, this);
        if (!mState) {
            *cause = std::string("cannot convert the rate: ") + src_strerror(error);
            return false;
        }
    } else if (ratio != mRatio) {
        src_set_ratio(mState, ratio);  // a step, not a glide from the old ratio
    }
    mRatio = ratio;
    return true;
}

long ResampledInput::read(float* out, long count, std::string* cause) {
    if (!mState) return static_cast<long>(mInput.readMono(out, count, cause));
    const long got = src_callback_read(mState, mRatio, count, out);
    if (!mPullFailure.empty()) {
        *cause = mPullFailure;
        return -1;
    }
    if (got == 0 && src_error(mState) != 0) {
        *cause = std::string("cannot convert the rate: ") + src_strerror(src_error(mState));
        return -1;
    }
    return got;
}

long ResampledInput::pull(void* self, float** data) {
    auto& me = *static_cast<ResampledInput*>(self);
    me.mBlock.resize(kBlockFrames);
    const sf_count_t got = me.mInput.readMono(me.mBlock.data(), kBlockFrames, &me.mPullFailure);
    *data = me.mBlock.data();
    return got > 0 ? static_cast<long>(got) : 0;  // 0 ends the input; a failure is kept aside
}

}  // namespace platform
}  // namespace korvo
