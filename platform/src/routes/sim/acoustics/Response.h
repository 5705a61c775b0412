// A loudspeaker's or a microphone's frequency response: Butterworth high- and low-pass
// corners and one resonance, as second-order sections (biquads, bilinear transform).
// Real-time: process() neither allocates nor blocks.
#pragma once
#include <array>
#include <vector>

namespace korvo {
namespace platform {
namespace acoustics {

struct ResponseSpec {
    double highPassHz = 0.0;  // 0: none
    int highPassOrder = 2;    // 2 or 4
    double lowPassHz = 0.0;   // 0: none
    int lowPassOrder = 2;     // 2 or 4
    double peakHz = 0.0;      // 0: no resonance
    double peakDb = 0.0;
    double peakQ = 1.0;
    bool flat() const { return highPassHz <= 0.0 && lowPassHz <= 0.0 && (peakHz <= 0.0 || peakDb == 0.0); }
};

class Biquad {
public:
    static Biquad lowPass(double hz, double q, double rate);
    static Biquad highPass(double hz, double q, double rate);
    static Biquad peak(double hz, double db, double q, double rate);

    double process(double x) {
        // Transposed direct form II: good numerical behaviour at low corners.
        const double y = mB[0] * x + mZ1;
        mZ1 = mB[1] * x - mA[1] * y + mZ2;
        mZ2 = mB[2] * x - mA[2] * y;
        return y;
    }

private:
    Biquad(double b0, double b1, double b2, double a0, double a1, double a2);
    std::array<double, 3> mB{};
    std::array<double, 3> mA{};
    double mZ1 = 0.0, mZ2 = 0.0;
};

class Response {
public:
    Response(const ResponseSpec& spec, double rate);
    // In place; a flat response leaves the samples untouched.
    void process(float* samples, int count);

private:
    std::vector<Biquad> mSections;
};

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
