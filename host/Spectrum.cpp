#include "host/Spectrum.h"

#include "host/CodePlan.h"

namespace korvo {
namespace host {

void lookAtSpectrum(SoundMeter_vir& meter, SpectrumLook* look) {
    for (float& v : look->levels) v = 0.0f;  // the read-out leaves entries 0 and 1 alone
    look->bins = meter.getSpectrumData_zorv(look->levels);
    look->first = look->second = -1;
    look->codeFirst = look->codeSecond = -1;
    if (look->bins == 0) return;
    meter.detectTwoPeakFreq_zorv(0.9f, look->levels, &look->first, &look->second);
    look->codeFirst = codeOfIndex(look->first);
    look->codeSecond = codeOfIndex(look->second);
}

}  // namespace host
}  // namespace korvo
