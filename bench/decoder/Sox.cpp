#include "decoder/Sox.h"

#include <cmath>
#include <cstdio>
#include <stdexcept>

namespace korvo {
namespace decoderbench {

namespace {
const std::string kRaw = " -t raw -e signed-integer -b 16 -c 1 -r 44100 ";
}

std::string quote(const std::string& s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

Samples readCommand(const std::string& command) {
    FILE* pipe = popen(command.c_str(), "r");
    if (!pipe) throw std::runtime_error("cannot run: " + command);
    Samples out;
    int16_t buffer[8192];
    size_t got;
    while ((got = fread(buffer, sizeof(int16_t), 8192, pipe)) > 0) out.insert(out.end(), buffer, buffer + got);
    if (pclose(pipe) != 0) throw std::runtime_error("failed: " + command);
    return out;
}

Samples sox(const std::string& inputs, const std::string& effects) {
    return readCommand("sox -R -V1 " + inputs + kRaw + "- " + effects);
}

Samples soxEffect(const Samples& in, const std::string& effects, const std::string& dir) {
    const std::string path = dir + "/effect-in.raw";
    FILE* f = fopen(path.c_str(), "wb");
    if (!f) throw std::runtime_error("cannot write " + path);
    fwrite(in.data(), sizeof(int16_t), in.size(), f);
    fclose(f);
    return sox(kRaw + quote(path), effects);
}

double rms(const Samples& s) {
    double sum = 0.0;
    for (int16_t v : s) sum += static_cast<double>(v) * v;
    return s.empty() ? 0.0 : std::sqrt(sum / static_cast<double>(s.size())) / 32768.0;
}

}  // namespace decoderbench
}  // namespace korvo
