#include "host/hearing/HostDecision.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>

#include "host/hearing/LevelPower.h"

namespace korvo {
namespace host {

namespace {

constexpr int kLastBin = korvo::kLastSpectrumEntry;

double fromDb(double db) { return std::pow(10.0, db / 10.0); }

}  // namespace

std::array<int, HostDecision::kReferenceBins> HostDecision::referenceBins(int code) {
    std::array<int, kReferenceBins> bins{};
    const int bin = korvo::codeIndex(code);
    int found = 0;
    for (int d = kNearestReference; found < kReferenceBins; ++d) {
        for (int b : {bin - d, bin + d}) {
            if (b >= 1 && b <= kLastBin && found < kReferenceBins) bins[static_cast<size_t>(found++)] = b;
        }
    }
    return bins;
}

HostDecision::HostDecision() {
    for (int c = 0; c < kHostCodes; ++c) mReference[static_cast<size_t>(c)] = referenceBins(c);
}

void HostDecision::reset() {
    for (Track& t : mTracks) t = Track{};
    mPrevious.fill(0.0f);
    mHeard = 0;
    mStepsWithoutFrame = 0;
}

void HostDecision::release(int code) {
    mTracks[code] = Track{};
    mHeard &= ~codeBit(code);
}

double HostDecision::evidence(const Track& t, int n, bool* peak) const {
    double sum = 0.0;
    double code = 0.0;
    std::array<double, 2 * kNeighbours> near{};
    for (int k = 0; k < n; ++k) {
        const Evidence& e = t.frames[static_cast<size_t>((t.newest - k + kMaxWindow) % kMaxWindow)];
        if (e.code > 1.0) sum += std::log(e.code);
        code += e.code;
        for (size_t i = 0; i < near.size(); ++i) near[i] += e.near[i];
    }
    *peak = std::all_of(near.begin(), near.end(), [code](double v) { return code > v; });
    return sum;
}

CodeSet HostDecision::addFrame(const float* levels, int level) {
    const double floor = levelPower(level);  // a 0 entry lies at or below the level
    std::array<double, korvo::kSpectrumBins> powers{};
    for (int b = 1; b <= kLastBin; ++b) powers[static_cast<size_t>(b)] = levels[b] == 0.0f ? floor : levelPower(levels[b]);
    auto power = [&](int bin) { return bin < 1 || bin > kLastBin ? 0.0 : powers[static_cast<size_t>(bin)]; };
    const double hold = std::log(fromDb(kHoldDb));
    for (int c = 0; c < kHostCodes; ++c) {
        Track& t = mTracks[static_cast<size_t>(c)];
        t.newest = (t.newest + 1) % kMaxWindow;
        t.count = std::min(t.count + 1, kMaxWindow);
        Evidence& e = t.frames[static_cast<size_t>(t.newest)];
        const int bin = korvo::codeIndex(c);
        double reference = 0.0;
        for (int b : mReference[static_cast<size_t>(c)]) reference += power(b);
        reference /= kReferenceBins;
        if (reference <= 0.0) reference = floor;
        e.code = power(bin) / reference;
        for (int d = 1; d <= kNeighbours; ++d) {
            e.near[static_cast<size_t>(d - 1)] = power(bin - d) / reference;
            e.near[static_cast<size_t>(kNeighbours + d - 1)] = power(bin + d) / reference;
        }

        bool peak = false;
        if (t.heard) {
            const bool held = (evidence(t, 1, &peak) >= hold && peak) ||
                              (evidence(t, std::min(t.count, 3), &peak) >= hold * std::min(t.count, 3) && peak);
            t.misses = held ? 0 : t.misses + 1;
            if (t.misses >= kReleaseFrames) release(c);
            continue;
        }
        for (int w = 0; w < kWindows; ++w) {
            const int n = kWindowFrames[static_cast<size_t>(w)];
            if (n > t.count) break;
            if (evidence(t, n, &peak) >= kThresholdNats[static_cast<size_t>(w)] && peak) {
                t.heard = true;
                t.misses = 0;
                mHeard |= codeBit(c);
                break;
            }
        }
    }
    return mHeard;
}

CodeSet HostDecision::hear(Ear& ear) {
    std::array<float, korvo::kSpectrumBins> levels{};
    ear.spectrum(levels.data());
    // A new analysed frame shows as a changed read-out; the analysis runs a turn every
    // second step or so, and between turns the read-out repeats the last frame.
    if (std::equal(levels.begin() + 1, levels.end(), mPrevious.begin() + 1)) {
        // Frames from before a long stillness say nothing of what comes after it.
        if (++mStepsWithoutFrame == kStaleSteps) {
            for (int c = 0; c < kHostCodes; ++c) release(c);
        }
        return mHeard;
    }
    mPrevious = levels;
    mStepsWithoutFrame = 0;
    return addFrame(levels.data(), ear.detectionLevel());
}

}  // namespace host
}  // namespace korvo
