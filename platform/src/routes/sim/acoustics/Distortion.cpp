#include "routes/sim/acoustics/Distortion.h"

#include <cmath>

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

double amplitudeOf(double db) { return db <= -200.0 ? 0.0 : std::pow(10.0, db / 20.0); }

}  // namespace

// For x = cos(wt): x^2 = (1 + cos 2wt) / 2 and x^3 = (3 cos wt + cos 3wt) / 4, so the output's
// fundamental is 1 + 3 a3 / 4, its second harmonic a2 / 2 and its third a3 / 4. Solving for
// harmonics r2 and r3 relative to that fundamental: a3 = 4 r3 / (1 - 3 r3) and
// a2 = 2 r2 (1 + 3 a3 / 4).
Distortion::Distortion(double secondDb, double thirdDb) {
    const double r2 = amplitudeOf(secondDb), r3 = amplitudeOf(thirdDb);
    mA3 = 4.0 * r3 / (1.0 - 3.0 * r3);
    mA2 = 2.0 * r2 * (1.0 + 0.75 * mA3);
}

void Distortion::process(float* samples, int count) const {
    if (none()) return;
    for (int i = 0; i < count; ++i) {
        const double x = samples[i];
        samples[i] = static_cast<float>(x + mA2 * x * x + mA3 * x * x * x);
    }
}

double distortionPercent(double secondDb, double thirdDb) {
    const double h2 = amplitudeOf(secondDb), h3 = amplitudeOf(thirdDb);
    return 100.0 * std::sqrt(h2 * h2 + h3 * h3);
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
