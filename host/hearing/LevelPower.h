// A read-out level as power: one level unit is 1.2 dB, so power goes as 10^(0.12 L)
// (up to a constant factor, which every ratio the decisions take cancels).
#pragma once
#include <cmath>

namespace korvo {
namespace host {

inline double levelPower(double level) { return std::pow(10.0, 0.12 * level); }

}  // namespace host
}  // namespace korvo
