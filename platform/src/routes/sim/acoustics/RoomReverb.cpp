#include "routes/sim/acoustics/RoomReverb.h"

#include <algorithm>
#include <cmath>
#include <random>

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

constexpr double kEarlyFromMs = 3.0;
constexpr double kEarlyShare = 0.25;
constexpr int kHistory = 1024;  // a power of two above the latest early tap

}  // namespace

RoomReverb::RoomReverb(double decaySeconds, double criticalDistanceM, uint64_t seed, double rate) {
    if (decaySeconds <= 0.0) return;
    // The tail starts where the convolver's block delay ends; the early taps lie before it.
    const int tailFrom = Convolver::kBlock;
    const int length = std::max(tailFrom + Convolver::kBlock, static_cast<int>(decaySeconds * rate));
    const double energy = 1.0 / (criticalDistanceM * criticalDistanceM);
    std::mt19937_64 random(seed);
    std::normal_distribution<double> gauss(0.0, 1.0);
    std::uniform_real_distribution<double> uniform(0.0, 1.0);
    mResponse.assign(static_cast<size_t>(length), 0.0f);

    // Early reflections: random instants, random signs, weaker the later they come.
    const int earlyFrom = static_cast<int>(kEarlyFromMs * rate / 1000.0);
    double earlyEnergy = 0.0;
    std::array<double, kEarlyTaps> raw{};
    for (int k = 0; k < kEarlyTaps; ++k) {
        mTapDelay[static_cast<size_t>(k)] = earlyFrom + static_cast<int>(uniform(random) * (tailFrom - earlyFrom - 1));
        raw[static_cast<size_t>(k)] = (uniform(random) < 0.5 ? -1.0 : 1.0) * (1.0 - 0.5 * k / kEarlyTaps);
        earlyEnergy += raw[static_cast<size_t>(k)] * raw[static_cast<size_t>(k)];
    }
    for (int k = 0; k < kEarlyTaps; ++k) {
        const float g = static_cast<float>(raw[static_cast<size_t>(k)] * std::sqrt(kEarlyShare * energy / earlyEnergy));
        mTapGain[static_cast<size_t>(k)] = g;
        mResponse[static_cast<size_t>(mTapDelay[static_cast<size_t>(k)])] += g;
    }

    // The tail: amplitude exp(-k t) with 20 log10 exp(-k T60) = -60 dB.
    const double k = 3.0 * std::log(10.0) / decaySeconds;
    std::vector<double> tail(static_cast<size_t>(length - tailFrom));
    double tailEnergy = 0.0;
    for (size_t i = 0; i < tail.size(); ++i) {
        const double t = static_cast<double>(tailFrom + static_cast<int>(i)) / rate;
        tail[i] = gauss(random) * std::exp(-k * t);
        tailEnergy += tail[i] * tail[i];
    }
    const double scale = std::sqrt((1.0 - kEarlyShare) * energy / tailEnergy);
    std::vector<float> shifted(tail.size());
    for (size_t i = 0; i < tail.size(); ++i) {
        shifted[i] = static_cast<float>(tail[i] * scale);
        mResponse[static_cast<size_t>(tailFrom) + i] = shifted[i];
    }
    // The convolver delays by one block, which is where the tail begins.
    mTail = std::make_unique<Convolver>(shifted);
    mHistory.assign(kHistory, 0.0f);
}

void RoomReverb::process(const float* in, float* out, int count) {
    if (!mTail) {
        std::fill(out, out + count, 0.0f);
        return;
    }
    mTail->process(in, out, count);
    for (int i = 0; i < count; ++i) {
        mHistory[static_cast<size_t>(mHistoryAt)] = in[i];
        float early = 0.0f;
        for (int k = 0; k < kEarlyTaps; ++k) {
            early += mTapGain[static_cast<size_t>(k)] *
                     mHistory[static_cast<size_t>((mHistoryAt - mTapDelay[static_cast<size_t>(k)]) & (kHistory - 1))];
        }
        out[i] += early;
        mHistoryAt = (mHistoryAt + 1) & (kHistory - 1);
    }
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
