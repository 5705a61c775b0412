// White Gaussian noise from a seed, the same sequence on every build and
// machine (the standard library's distributions are not specified that far).
#pragma once
#include <cmath>
#include <cstdint>

namespace korvo {
namespace platform {
namespace sim {

class NoiseSource {
public:
    explicit NoiseSource(uint64_t seed) : mState(seed) {}

    // Next sample of a zero-mean, unit-variance normal distribution.
    double next() {
        if (mHaveSpare) {
            mHaveSpare = false;
            return mSpare;
        }
        // Box-Muller; u1 in (0, 1] keeps log() finite.
        const double u1 = (double(nextBits() >> 11) + 1.0) * 0x1.0p-53;
        const double u2 = double(nextBits() >> 11) * 0x1.0p-53;
        const double r = std::sqrt(-2.0 * std::log(u1));
        const double a = 6.283185307179586 * u2;
        mSpare = r * std::sin(a);
        mHaveSpare = true;
        return r * std::cos(a);
    }

private:
    uint64_t nextBits() {  // splitmix64
        uint64_t z = (mState += 0x9e3779b97f4a7c15ULL);
        z = (z ^ (z >> 30)) * 0xbf58476d1ce4e5b9ULL;
        z = (z ^ (z >> 27)) * 0x94d049bb133111ebULL;
        return z ^ (z >> 31);
    }

    uint64_t mState;
    double mSpare = 0.0;
    bool mHaveSpare = false;
};

}  // namespace sim
}  // namespace platform
}  // namespace korvo
