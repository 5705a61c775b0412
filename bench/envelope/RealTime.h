// The simulation checked against the real thing: a recording of many trials heard by a
// real-time `soundmeter listen` and offline by the simulation, trial by trial.
#pragma once
#include <string>

#include "envelope/Trials.h"

namespace korvo {
namespace envelope {

struct RealTimeCheck {
    Point point;
    int tones = 0;
    int heardLive = 0;
    double medianLiveMs = -1.0;
    double p99LiveMs = -1.0;
    double heardSimulated = 0.0;  // mean over the ten analysis phases
    double medianSimulatedMs = -1.0;
    double p99SimulatedMs = -1.0;
    std::string error;  // why the live run could not be made
};

// Writes the recording into `folder`, runs `soundmeter` on it in real time and simulates it.
RealTimeCheck checkRealTime(const Point& point, int tones, const std::string& soundmeter, const std::string& folder);

}  // namespace envelope
}  // namespace korvo
