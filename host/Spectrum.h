// One look at the live spectrum through the interface: the masked read-out and
// the detector that the handshake itself uses.
#pragma once
#include "interface/SoundMeterConstants.h"
#include "interface/SoundMeter_vir.h"

namespace korvo {
namespace host {

struct SpectrumLook {
    float levels[korvo::kSpectrumBins];   // the masked read-out; entry 30 + 10c is the band of code c
    int bins = 0;        // bins with a positive level; 0 before the analysis has a frame
    int first = -1;      // the two peak indices, sorted, as the detector reports them
    int second = -1;
    int codeFirst = -1;  // codes named by those indices, -1 when none
    int codeSecond = -1;
};

// Reads the spectrum the analysis thread holds now; no capture step.
void lookAtSpectrum(SoundMeter_vir& meter, SpectrumLook* look);

}  // namespace host
}  // namespace korvo
