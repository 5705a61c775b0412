#include "host/hearing/FrameDecoder.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "host/hearing/OrderStatisticThreshold.h"

namespace korvo {
namespace host {

namespace {

constexpr double kRate = korvo::kSampleRate;
constexpr int kGap = SpectrumWindow::kReferenceGap;

// The code whose nominal frequency is nearest `hz` in ratio, and how far off it is. Codes
// lie evenly in Hz, so only the two around `hz` are compared (no search: every peak of
// every window asks).
int nearestCode(double hz, double* off) {
    const double step = korvo::codeHz(1) - korvo::codeHz(0);
    const int below = std::clamp(static_cast<int>(std::floor((hz - korvo::codeHz(0)) / step)), 0, FrameDecoder::kCodes - 2);
    const double offBelow = std::fabs(std::log(hz / korvo::codeHz(below)));
    const double offAbove = std::fabs(std::log(hz / korvo::codeHz(below + 1)));
    *off = std::expm1(std::min(offBelow, offAbove));
    return offAbove < offBelow ? below + 1 : below;
}

}  // namespace

FrameDecoder::FrameDecoder() : mHistory(static_cast<size_t>(kHistory), 0.0f) {
    for (int w = 0; w < kWindows; ++w) {
        mWindows.push_back(std::make_unique<SpectrumWindow>(kWindowLengths[static_cast<size_t>(w)], referenceCount(w)));
        const int count = mWindows.back()->referenceCount();
        const int rank = SpectrumWindow::rankOf(count);
        const double binHz = mWindows.back()->binHz();
        for (int c = 0; c < kCodes; ++c) {
            Range& r = mRanges[static_cast<size_t>(w)][static_cast<size_t>(c)];
            r.lo = static_cast<int>(std::floor(korvo::codeHz(c) * (1.0 - kTolerance) / binHz));
            r.hi = std::min(static_cast<int>(std::ceil(korvo::codeHz(c) * (1.0 + kTolerance) / binHz)),
                            mWindows.back()->bins() - 2);
            // Noise alone passes a bin of the range with chance p(t) (every bin counted as
            // independent, which overcounts neighbours under Hann: the true rate is lower),
            // so each window's share of the code's 1e-9 is split among its bins.
            const int bins = r.hi - r.lo + 1;
            r.start = orderStatisticThreshold(count, rank, kFalseAlarm / kWindows / bins);
            r.hold = orderStatisticThreshold(count, rank, kHoldFalseAlarm / bins);
        }
    }
    for (int w = 0; w < kWindows; ++w) {
        const SpectrumWindow& win = *mWindows[static_cast<size_t>(w)];
        mSiblingFactor[static_cast<size_t>(w)] =
            orderStatisticThreshold(win.referenceCount(), SpectrumWindow::rankOf(win.referenceCount()), kSiblingFalseAlarm / win.bins());
    }
    mLineFactor = orderStatisticThreshold(kShortReferences, SpectrumWindow::rankOf(kShortReferences), kHoldFalseAlarm);
    reset();
}

FrameDecoder::~FrameDecoder() = default;

int FrameDecoder::searchBins(int window, int code) const {
    const Range& r = mRanges[static_cast<size_t>(window)][static_cast<size_t>(code)];
    return r.hi - r.lo + 1;
}

double FrameDecoder::threshold(int window, int code) const {
    return mRanges[static_cast<size_t>(window)][static_cast<size_t>(code)].start;
}

void FrameDecoder::reset() {
    std::fill(mHistory.begin(), mHistory.end(), 0.0f);
    mFrames = 0;
    mFramePower.fill(0.0);
    for (Track& t : mTracks) t = Track{};
    for (auto& a : mLastHz) a.fill(-1.0);
    mSounding = 0;
    for (auto& w : mWindows) w->clear();
}

void FrameDecoder::levels(float* out256) const {
    const SpectrumWindow& w = *mWindows.front();
    for (int b = 0; b < korvo::kSpectrumBins; ++b) {
        const double p = std::max(static_cast<double>(w.power(b)), 1e-30);
        out256[b] = static_cast<float>(std::max(0.0, 100.0 * (1.0 + std::log10(p) / 12.0)));
    }
}

FrameDecoder::Peak FrameDecoder::find(int window, int code, double least) const {
    const SpectrumWindow& w = *mWindows[static_cast<size_t>(window)];
    const Range& r = mRanges[static_cast<size_t>(window)][static_cast<size_t>(code)];
    Peak p;
    p.bin = w.peak(r.lo, r.hi);
    if (p.bin < 0) return p;
    w.interpolate(p.bin, &p.hz, &p.power);
    double off = 0.0;
    // A peak nearer another code's frequency is that code's (codes 21 and 22 share bins).
    if (nearestCode(p.hz, &off) != code || off > kTolerance) {
        p.bin = -1;
        return p;
    }
    // The exact noise estimate costs most of a frame: a peak below `least` times a lower
    // bound of it cannot pass, and gets no ratio.
    if (w.power(p.bin) < least * w.noiseBound(p.bin, kGap)) return p;
    p.ratio = w.power(p.bin) / w.noise(p.bin, kGap);
    return p;
}

// A loudspeaker's distortion or clipping puts harmonics k f0 of a tone f0 (folded back
// at half the rate: the capture's converter sees them after the distortion) where other
// codes lie: code c's 2nd harmonic is code 2c+3 exactly. A peak that some stronger line
// would put there is taken for that line's harmonic. So two devices saying c and 2c+3 at
// once are told apart only when the upper code arrives at least as loud as the lower.
bool FrameDecoder::harmonicOfStronger(const SpectrumWindow& w, const Peak& p) const {
    const double nyquist = kRate / 2.0;
    const int highest = static_cast<int>(p.hz / kLowestFundamentalHz);
    for (int k = 2; k <= highest; ++k) {
        // Folded harmonics only from the first kMaxFoldedHarmonic: higher ones are weak.
        const int folds = k <= kMaxFoldedHarmonic ? k : 0;
        for (int m = 0; m <= folds; ++m) {
            for (int sign : {1, -1}) {
                if (m == 0 && sign < 0) continue;
                const double f0 = (m * kRate + sign * p.hz) / k;
                if (f0 < kLowestFundamentalHz || f0 > nyquist - 2.0 * w.binHz()) continue;
                if (std::fabs(f0 - p.hz) < 2.0 * w.binHz()) continue;
                const int centre = static_cast<int>(std::lround(f0 / w.binHz()));
                if (k <= kLooseHarmonic) {
                    // The line as it has stood over its last dips: a loudspeaker's tone
                    // beating with its echoes dips for a frame where its harmonic does not.
                    int h = centre - 1;
                    for (int c = centre; c <= centre + 1; ++c) {
                        if (w.heldPower(c) > w.heldPower(h)) h = c;
                    }
                    if (w.heldPower(h) >= w.power(p.bin) && w.heldPower(h) >= mLineFactor * w.noise(h, kGap)) return true;
                    continue;
                }
                const int b = w.peak(centre - 1, centre + 1);
                if (b < 0 || w.power(b) < w.power(p.bin)) continue;
                // Beyond the first harmonics a bin's width at f0 covers many multiples: the
                // line's own frequency, times k, must land on the peak, within the
                // interpolation's error (a few Hz) k times.
                double hz = 0.0, power = 0.0;
                w.interpolate(b, &hz, &power);
                const double folded = std::fabs(std::remainder(k * hz, kRate));
                if (std::fabs(folded - p.hz) > std::max(0.15 * w.binHz(), 3.0) * (k + 1)) continue;
                if (w.power(b) >= mLineFactor * w.noise(b, kGap)) return true;
            }
        }
    }
    return false;
}

// Speech and music make lines too, but never alone: voiced speech and every note bring
// other partials of their fundamental, and chords bring other notes, from 300 Hz up. A
// code's line is the only strong one there, apart from its own weaker harmonics (a
// loudspeaker's distortion) and weaker lines at other codes (another sender). A sibling
// counts when it comes within kSiblingDb of the line and is itself a line (noise alone
// passes kSiblingFactor with chance 1e-3 anywhere in the window), or when it is at least
// half as strong as the line and stands kStrongSiblingDb over its own noise (dense music hides its
// partials' noise estimate; a code in brown or pink noise is still louder than any bin
// of it at the SNRs it is heard at).
bool FrameDecoder::pureLine(int window, const SpectrumWindow& w, const Peak& p) const {
    const double top = w.power(p.bin);
    const double floor = top * std::pow(10.0, -kSiblingDb / 10.0);
    const double otherCode = top * std::pow(10.0, kOtherCodeDb / 10.0);
    const double strong = std::pow(10.0, kStrongSiblingDb / 10.0);
    const double factor = mSiblingFactor[static_cast<size_t>(window)];
    for (int b = std::max(static_cast<int>(kSiblingFromHz / w.binHz()), 1); b <= w.bins() - 2; ++b) {
        const float q = w.power(b);
        if (q < floor || std::abs(b - p.bin) < kGap || q < w.power(b - 1) || q < w.power(b + 1)) continue;
        double hz = 0.0, power = 0.0;
        w.interpolate(b, &hz, &power);
        if (q < top) {
            bool own = false;
            for (int k = 2; k <= kOwnHarmonics && !own; ++k)
                own = std::fabs(std::fabs(std::remainder(k * p.hz, kRate)) - hz) < (1.5 + 0.1 * k) * w.binHz();
            if (own) continue;
        }
        double off = 0.0;
        nearestCode(hz, &off);
        if (off <= kTolerance && q < otherCode) continue;
        const double noise = w.noise(b, kGap);
        if (q >= factor * noise || (q >= 0.5 * top && q >= strong * noise)) return false;
    }
    return true;
}

double FrameDecoder::returnLevel(const Track& t) {
    const double seconds = static_cast<double>(t.sinceEnd * korvo::kFrameSamples) / kRate;
    const double fromEnd = kReturnFactor * t.endLevel * std::pow(10.0, -6.0 * seconds / kMaxReverbSeconds);
    const double fromPeak = kReturnPeakFactor * t.peakLevel * std::pow(10.0, -kReturnPeakDbPerSecond * seconds / 10.0);
    return std::max(fromEnd, fromPeak);
}

bool FrameDecoder::begins(int code, Track& t) {
    for (int w = 0; w < kWindows; ++w) {
        const SpectrumWindow& win = *mWindows[static_cast<size_t>(w)];
        // Only samples heard so far, and none from before the code's last end.
        if (win.length() > mFrames * korvo::kFrameSamples) break;
        if (t.sinceEnd >= 0 && win.length() > t.sinceEnd * korvo::kFrameSamples) break;
        if (!fresh(win.length()) || (w > 0 && !live(win.length()))) continue;
        const Peak p = find(w, code, mRanges[static_cast<size_t>(w)][static_cast<size_t>(code)].start);
        // Beyond one frame a window shares most samples with its previous frame's: a steady
        // line reads the same frequency there, a voice's gliding harmonic does not.
        double& last = mLastHz[static_cast<size_t>(w)][static_cast<size_t>(code)];
        const double before = last;
        last = p.bin < 0 ? -1.0 : p.hz;
        if (w > 0 && std::fabs(p.hz - before) > kSteadyBins * win.binHz()) continue;
        if (p.bin < 0 || p.ratio < mRanges[static_cast<size_t>(w)][static_cast<size_t>(code)].start) continue;
        if (t.sinceEnd >= 0 && p.power < returnLevel(t)) continue;
        if (harmonicOfStronger(win, p) || !pureLine(w, win, p)) continue;
        t.sounding = true;
        t.holdWindows = std::max(w + 1, 2);
        t.misses = 0;
        t.endLevel = 0.0;
        t.peakLevel = p.power;
        t.fallen = 0;
        return true;
    }
    return false;
}

bool FrameDecoder::holdOrEnd(int code, Track& t) {
    double level = 0.0;
    bool held = false;
    for (int w = 0; w < t.holdWindows; ++w) {
        const Peak p = find(w, code, mRanges[static_cast<size_t>(w)][static_cast<size_t>(code)].hold);
        if (p.bin < 0) continue;
        level = std::max(level, p.power);
        held = held || p.ratio >= mRanges[static_cast<size_t>(w)][static_cast<size_t>(code)].hold;
    }
    if (held) {
        t.misses = 0;
        t.endLevel = 0.0;
        const bool fell = t.fallen >= kFallFrames;
        if (fell && level >= kRiseFactor * t.peakLevel) {
            t.fallen = 0;
            t.peakLevel = level;
            return true;
        }
        if (level < kFallFactor * t.peakLevel) {
            ++t.fallen;
        } else if (!fell) {
            t.fallen = 0;
            t.peakLevel = std::max(t.peakLevel, level);
        }
        return false;
    }
    t.endLevel = std::max(t.endLevel, level);
    if (++t.misses >= kReleaseFrames) {
        t.sounding = false;
        t.sinceEnd = 0;
    }
    return false;
}

bool FrameDecoder::live(int length) const {
    const int frames = length / korvo::kFrameSamples;
    const auto slots = static_cast<int64_t>(mFramePower.size());
    double sum = 0.0;
    for (int64_t f = mFrames - frames; f < mFrames; ++f) sum += mFramePower[static_cast<size_t>(f % slots)];
    return mFramePower[static_cast<size_t>((mFrames - 1) % slots)] >= kLiveShare * sum / frames;
}

CodeSet FrameDecoder::addFrame(const int16_t* samples) {
    constexpr int n = korvo::kFrameSamples;
    std::memmove(mHistory.data(), mHistory.data() + n, sizeof(float) * (kHistory - n));
    double power = 0.0;
    for (int i = 0; i < n; ++i) {
        const float v = static_cast<float>(samples[i] * korvo::kInputScale);
        mHistory[static_cast<size_t>(kHistory - n + i)] = v;
        power += static_cast<double>(v) * v;
    }
    mFramePower[static_cast<size_t>(mFrames % static_cast<int64_t>(mFramePower.size()))] = power / n;
    ++mFrames;
    for (auto& w : mWindows) {
        if (w->length() > mFrames * n) break;
        if (fresh(w->length())) w->analyse(mHistory.data() + (kHistory - w->length()));
    }
    CodeSet began = 0;
    for (int c = 0; c < kCodes; ++c) {
        Track& t = mTracks[static_cast<size_t>(c)];
        if (t.sinceEnd >= 0) ++t.sinceEnd;
        if (t.sounding) {
            if (holdOrEnd(c, t)) began |= codeBit(c);
        } else if (begins(c, t)) {
            began |= codeBit(c);
        }
        mSounding = t.sounding ? (mSounding | codeBit(c)) : (mSounding & ~codeBit(c));
    }
    return began;
}

}  // namespace host
}  // namespace korvo
