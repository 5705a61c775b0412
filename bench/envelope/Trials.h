// Trials of the envelope, each heard offline by the listener a live device would be.
//
// A trial: the device's warm-up, 200..300 ms of noise, the tone, 300 ms more of noise.
// The analysis phase is drawn anew for each trial, and so is the tone's start within a
// frame, its phase and the noise. A code heard between the tone's start and the end of
// the trial counts; its latency runs from the tone's start to the end of the frame of
// the step that heard it. Other codes heard are false codes.
#pragma once
#include <cstdint>
#include <vector>

#include "envelope/Signals.h"
#include "host/hearing/Decoder.h"

namespace korvo {
namespace envelope {

using host::DecoderKind;

struct Point {
    DecoderKind decoder = DecoderKind::Host;
    Noise noise = Noise::White;
    int code = 0;        // -1: a code drawn for each trial among those the decoder hears
    double toneMs = 300.0;
    double snrDb = 0.0;
    int trials = 300;
    uint64_t seed = 1;
};

struct PointResult {
    Point point;
    int level = 0;  // the calibrated detection level used
    int heard = 0;
    double lower95 = 0.0;    // one-sided 95 % lower bound of the probability heard (Clopper-Pearson)
    double medianMs = -1.0;  // latency of the trials heard
    double p99Ms = -1.0;
    int falseCodes = 0;      // other codes heard during the trials
    // Trials in which some analysed frame was at least a quarter filled with the tone: no
    // decision made through the read-outs can hear a tone that no analysed frame holds.
    int covered = 0;
    double rate() const { return point.trials ? double(heard) / point.trials : 0.0; }
    double coverage() const { return point.trials ? double(covered) / point.trials : 0.0; }
};

double noiseDbfsAt(double snrDb);

// The level --level auto would take in this noise (1.5 s of it, after the warm-up).
int calibratedLevel(DecoderKind decoder, Noise noise, double noiseDbfs, uint64_t seed);

PointResult runPoint(const Point& point);

struct FalseResult {
    DecoderKind decoder = DecoderKind::Host;
    Noise noise = Noise::White;
    double noiseDbfs = 0.0;
    double minutes = 0.0;
    int level = 0;
    int64_t steps = 0;
    int falseCodes = 0;
    double per10k() const { return steps ? falseCodes * 1e4 / double(steps) : 0.0; }
};

// Noise alone for `minutes`, heard after --level auto's calibration.
FalseResult runNoiseOnly(DecoderKind decoder, Noise noise, double noiseDbfs, double minutes, uint64_t seed);

// One-sided lower confidence bound of a proportion k / n.
double lowerBound(int k, int n, double confidence);
// The q-quantile (0..1) of sorted values (nearest rank); -1 when empty.
double quantile(const std::vector<double>& sorted, double q);

}  // namespace envelope
}  // namespace korvo
