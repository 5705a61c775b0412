#include "routes/sim/acoustics/ClockDrift.h"

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

constexpr int kConverter = SRC_SINC_MEDIUM_QUALITY;

}  // namespace

// A fast device clock plays its samples in less room time: fewer room samples per device
// sample.
std::unique_ptr<ClockDrift> ClockDrift::forSpeaker(double ppm, std::string* error) {
    std::unique_ptr<ClockDrift> d(new ClockDrift(1.0 / (1.0 + ppm * 1e-6)));
    int e = 0;
    d->mState = src_new(kConverter, 1, &e);
    if (!d->mState) {
        if (error) *error = std::string("sample-rate converter: ") + src_strerror(e);
        return nullptr;
    }
    return d;
}

// A fast device clock takes more samples of the same room time.
std::unique_ptr<ClockDrift> ClockDrift::forMicrophone(double ppm, Source* source, std::string* error) {
    std::unique_ptr<ClockDrift> d(new ClockDrift(1.0 + ppm * 1e-6));
    d->mSource = source;
    int e = 0;
    d->mState = src_callback_new(callback, kConverter, 1, &e, d.get());
    if (!d->mState) {
        if (error) *error = std::string("sample-rate converter: ") + src_strerror(e);
        return nullptr;
    }
    return d;
}

ClockDrift::~ClockDrift() {
    if (mState) src_delete(mState);
}

long ClockDrift::callback(void* self, float** data) { return static_cast<ClockDrift*>(self)->mSource->fetch(data); }

long ClockDrift::push(const float* in, long count, float* out, long maxOut) {
    long made = 0;
    while (count > 0 && made < maxOut) {
        SRC_DATA d{};
        d.data_in = in;
        d.input_frames = count;
        d.data_out = out + made;
        d.output_frames = maxOut - made;
        d.src_ratio = mRatio;
        if (src_process(mState, &d) != 0) break;
        in += d.input_frames_used;
        count -= d.input_frames_used;
        made += d.output_frames_gen;
        if (d.input_frames_used == 0 && d.output_frames_gen == 0) break;
    }
    return made;
}

long ClockDrift::pull(float* out, long count) { return src_callback_read(mState, mRatio, count, out); }

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
