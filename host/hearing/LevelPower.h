// Read-out levels: their range, and a level as power: one level unit is 1.2 dB, so power goes as 10^(0.12 L)
// (up to a constant factor, which every ratio the decoders take cancels).
#pragma once
#include <cmath>

namespace korvo {
namespace host {

// Detection levels, the same range in every command and in calibration (level 100 = full
// scale, 1 unit = 1.2 dB).
constexpr int kMinLevel = -100;
constexpr int kMaxLevel = 200;

inline double levelPower(double level) { return std::pow(10.0, 0.12 * level); }

}  // namespace host
}  // namespace korvo
