#include "envelope/Trials.h"

#include <algorithm>
#include <cmath>

#include "envelope/simulated/OfflineListener.h"

namespace korvo {
namespace envelope {

namespace {

struct Trial {
    bool heard = false;
    double latencyMs = 0.0;
    int others = 0;
    bool covered = false;
};

Trial runTrial(const Point& p, int code, int level, uint64_t seed) {
    std::mt19937_64 random(seed);
    std::uniform_real_distribution<double> u(0.0, 1.0);
    host::OfflineListener listener(p.decoder, static_cast<int>(random() % host::kPhases));
    listener.setLevel(level);
    NoiseSource noise(p.noise, random());
    ToneInNoise spec;
    spec.hz = korvo::codeHz(code);
    spec.phase = 2.0 * 3.14159265358979323846 * u(random);
    spec.noiseDbfs = noiseDbfsAt(p.snrDb);
    spec.toneStart = korvo::kWarmUpSteps * kFrame + static_cast<int64_t>((0.2 + 0.1 * u(random)) * kRate);
    spec.toneEnd = spec.toneStart + static_cast<int64_t>(p.toneMs * kRate / 1000.0);
    const int64_t end = spec.toneEnd + static_cast<int64_t>(0.3 * kRate);
    Trial t;
    std::vector<int16_t> frame;
    for (int64_t at = 0; at + kFrame <= end; at += kFrame) {
        frame.clear();
        synthesize(spec, noise, at, kFrame, &frame);
        const host::CodeSet begun = listener.step(frame.data());
        const int64_t analysed = listener.analysedFrame() * kFrame;
        const int64_t inside = std::min(analysed + kFrame, spec.toneEnd) - std::max(analysed, spec.toneStart);
        if (analysed >= 0 && 4 * inside >= kFrame) t.covered = true;
        for (int c = 0; c < korvo::kPlanCodes; ++c) {
            if (!(begun & host::codeBit(c))) continue;
            if (c == code && !t.heard && at + kFrame > spec.toneStart) {
                t.heard = true;
                t.latencyMs = static_cast<double>(at + kFrame - spec.toneStart) * 1000.0 / kRate;
            } else if (c != code) {
                ++t.others;
            }
        }
    }
    return t;
}

double logChoose(int n, int k) { return std::lgamma(n + 1.0) - std::lgamma(k + 1.0) - std::lgamma(n - k + 1.0); }

// P(X >= k) for X ~ Binomial(n, p).
double upperTail(int k, int n, double p) {
    double sum = 0.0;
    for (int i = k; i <= n; ++i) {
        sum += std::exp(logChoose(n, i) + i * std::log(p) + (n - i) * std::log1p(-p));
    }
    return sum;
}

}  // namespace

double noiseDbfsAt(double snrDb) { return kToneDbfs - snrDb; }

double lowerBound(int k, int n, double confidence) {
    if (k <= 0 || n <= 0) return 0.0;
    double lo = 0.0, hi = static_cast<double>(k) / n;
    for (int i = 0; i < 60; ++i) {
        const double mid = 0.5 * (lo + hi);
        if (upperTail(k, n, mid) < 1.0 - confidence) {
            lo = mid;
        } else {
            hi = mid;
        }
    }
    return lo;
}

double quantile(const std::vector<double>& sorted, double q) {
    if (sorted.empty()) return -1.0;
    const size_t rank = static_cast<size_t>(std::ceil(q * static_cast<double>(sorted.size())));
    return sorted[std::min(sorted.size(), std::max<size_t>(rank, 1)) - 1];
}

int calibratedLevel(DecoderKind decoder, Noise noise, double noiseDbfs, uint64_t seed) {
    host::OfflineListener listener(decoder, static_cast<int>(seed % host::kPhases));
    listener.calibrateFirst();
    NoiseSource source(noise, seed);
    ToneInNoise spec;
    spec.noiseDbfs = noiseDbfs;
    std::vector<int16_t> frame;
    for (int64_t at = 0; !listener.calibrated(); at += kFrame) {
        frame.clear();
        synthesize(spec, source, at, kFrame, &frame);
        listener.step(frame.data());
    }
    return listener.proposal().level;
}

PointResult runPoint(const Point& p) {
    PointResult r;
    r.point = p;
    r.level = calibratedLevel(p.decoder, p.noise, noiseDbfsAt(p.snrDb), p.seed * 7919 + 17);
    std::mt19937_64 random(p.seed);
    std::vector<double> latencies;
    for (int i = 0; i < p.trials; ++i) {
        const int code = p.code >= 0 ? p.code : static_cast<int>(random() % host::codesHeardBy(p.decoder));
        const Trial t = runTrial(p, code, r.level, random());
        if (t.heard) {
            ++r.heard;
            latencies.push_back(t.latencyMs);
        }
        r.falseCodes += t.others;
        r.covered += t.covered ? 1 : 0;
    }
    std::sort(latencies.begin(), latencies.end());
    r.medianMs = quantile(latencies, 0.5);
    r.p99Ms = quantile(latencies, 0.99);
    r.lower95 = lowerBound(r.heard, p.trials, 0.95);
    return r;
}

FalseResult runNoiseOnly(DecoderKind decoder, Noise noise, double noiseDbfs, double minutes, uint64_t seed) {
    FalseResult r;
    r.decoder = decoder;
    r.noise = noise;
    r.noiseDbfs = noiseDbfs;
    r.minutes = minutes;
    host::OfflineListener listener(decoder, static_cast<int>(seed % host::kPhases));
    listener.calibrateFirst();
    NoiseSource source(noise, seed);
    ToneInNoise spec;
    spec.noiseDbfs = noiseDbfs;
    std::vector<int16_t> frame;
    const int64_t steps = static_cast<int64_t>(minutes * 60.0 * kRate / kFrame);
    for (int64_t at = 0; !listener.calibrated() || r.steps < steps; at += kFrame) {
        frame.clear();
        synthesize(spec, source, at, kFrame, &frame);
        const host::CodeSet begun = listener.step(frame.data());
        if (!listener.calibrated()) continue;
        ++r.steps;
        r.falseCodes += __builtin_popcountll(begun);
    }
    r.level = listener.proposal().level;
    return r;
}

}  // namespace envelope
}  // namespace korvo
