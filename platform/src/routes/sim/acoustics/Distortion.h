// A loudspeaker's distortion, growing with level as a driver's does: y = x + a2 x^2 + a3 x^3
// on samples scaled to full scale 1. A full-scale sine comes out with its second and third
// harmonics at the given levels below its fundamental; at amplitude A the second falls as A^2 and the
// third as A^3, so a quiet tone is nearly clean. Real-time: no allocation.
#pragma once

namespace korvo {
namespace platform {
namespace acoustics {

class Distortion {
public:
    // Harmonic levels in dB relative to the fundamental for a full-scale sine; a level at or
    // below -200 dB counts as none.
    Distortion(double secondDb, double thirdDb);
    bool none() const { return mA2 == 0.0 && mA3 == 0.0; }
    void process(float* samples, int count) const;

private:
    double mA2;
    double mA3;
};

// Total harmonic distortion (second and third) of a full-scale sine, in per cent.
double distortionPercent(double secondDb, double thirdDb);

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
