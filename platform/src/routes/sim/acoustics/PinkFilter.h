// Pink noise from white: a sum of first-order filters whose corners are spread over the
// band, a classic approximation of a 1/f power spectrum at 44.1 kHz (within 0.05 dB from
// 10 Hz up). Feed it white samples one at a time.
#pragma once
#include <array>

namespace korvo {
namespace platform {
namespace acoustics {

class PinkFilter {
public:
    double next(double w) {
        b[0] = 0.99886 * b[0] + w * 0.0555179;
        b[1] = 0.99332 * b[1] + w * 0.0750759;
        b[2] = 0.96900 * b[2] + w * 0.1538520;
        b[3] = 0.86650 * b[3] + w * 0.3104856;
        b[4] = 0.55000 * b[4] + w * 0.5329522;
        b[5] = -0.7616 * b[5] - w * 0.0168980;
        const double out = b[0] + b[1] + b[2] + b[3] + b[4] + b[5] + b[6] + w * 0.5362;
        b[6] = w * 0.115926;
        return out;
    }

private:
    std::array<double, 7> b{};
};

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
