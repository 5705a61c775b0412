#include "routes/sim/acoustics/Response.h"

#include <cmath>

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

constexpr double kPi = 3.14159265358979323846;

// Q of the sections of a Butterworth filter of order 2 and 4.
std::vector<double> butterworthQs(int order) {
    if (order == 4) return {0.54119610014619698, 1.3065629648763766};
    return {0.70710678118654752};
}

}  // namespace

Biquad::Biquad(double b0, double b1, double b2, double a0, double a1, double a2)
    : mB{b0 / a0, b1 / a0, b2 / a0}, mA{1.0, a1 / a0, a2 / a0} {}

Biquad Biquad::lowPass(double hz, double q, double rate) {
    const double w = 2.0 * kPi * hz / rate, c = std::cos(w), alpha = std::sin(w) / (2.0 * q);
    return Biquad((1.0 - c) / 2.0, 1.0 - c, (1.0 - c) / 2.0, 1.0 + alpha, -2.0 * c, 1.0 - alpha);
}

Biquad Biquad::highPass(double hz, double q, double rate) {
    const double w = 2.0 * kPi * hz / rate, c = std::cos(w), alpha = std::sin(w) / (2.0 * q);
    return Biquad((1.0 + c) / 2.0, -(1.0 + c), (1.0 + c) / 2.0, 1.0 + alpha, -2.0 * c, 1.0 - alpha);
}

Biquad Biquad::peak(double hz, double db, double q, double rate) {
    const double w = 2.0 * kPi * hz / rate, c = std::cos(w), alpha = std::sin(w) / (2.0 * q);
    const double a = std::pow(10.0, db / 40.0);
    return Biquad(1.0 + alpha * a, -2.0 * c, 1.0 - alpha * a, 1.0 + alpha / a, -2.0 * c, 1.0 - alpha / a);
}

Response::Response(const ResponseSpec& spec, double rate) {
    if (spec.highPassHz > 0.0) {
        for (double q : butterworthQs(spec.highPassOrder)) mSections.push_back(Biquad::highPass(spec.highPassHz, q, rate));
    }
    if (spec.lowPassHz > 0.0) {
        for (double q : butterworthQs(spec.lowPassOrder)) mSections.push_back(Biquad::lowPass(spec.lowPassHz, q, rate));
    }
    if (spec.peakHz > 0.0 && spec.peakDb != 0.0) mSections.push_back(Biquad::peak(spec.peakHz, spec.peakDb, spec.peakQ, rate));
}

void Response::process(float* samples, int count) {
    if (mSections.empty()) return;
    for (int i = 0; i < count; ++i) {
        double v = samples[i];
        for (Biquad& s : mSections) v = s.process(v);
        samples[i] = static_cast<float>(v);
    }
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
