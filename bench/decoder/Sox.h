// Sound made by sox and espeak-ng, read back as 16-bit mono samples at the capture rate.
#pragma once
#include <cstdint>
#include <string>
#include <vector>

namespace korvo {
namespace decoderbench {

using Samples = std::vector<int16_t>;

// Runs a shell command that writes raw signed 16-bit mono samples to its standard output.
Samples readCommand(const std::string& command);
// sox INPUTS -> raw at 44100 Hz, through EFFECTS.
Samples sox(const std::string& inputs, const std::string& effects);
// Passes `in` through sox's EFFECTS (a temporary raw file in `dir`).
Samples soxEffect(const Samples& in, const std::string& effects, const std::string& dir);
// The RMS of `s` as a fraction of full scale.
double rms(const Samples& s);
std::string quote(const std::string& s);

}  // namespace decoderbench
}  // namespace korvo
