#include "host/hearing/BuiltinDecoder.h"

#include <initializer_list>

namespace korvo {
namespace host {

bool BuiltinDecoder::leakFromAbove(const float* levels, float level) {
    for (int i = korvo::kLastBandEntry + 1; i <= korvo::kLastSpectrumEntry; ++i) {
        if (levels[i] >= level + kGuardLevels) return true;
    }
    return false;
}

bool BuiltinDecoder::risesAboveTheBands(const float* levels) {
    const int own = korvo::codeIndex(kBuiltinCodes - 1);
    for (int d = 1; d <= kEdgeBins; ++d) {
        if (levels[own + d] > levels[own]) return true;
    }
    return false;
}

CodeSet BuiltinDecoder::decide(Ear& ear) {
    float masked[korvo::kSpectrumBins] = {};
    if (ear.maskedSpectrum(masked) == 0) return 0;  // nothing analysed yet
    int first = -1;
    int second = -1;
    ear.twoPeaks(masked, &first, &second);
    CodeSet heard = 0;
    float levels[korvo::kSpectrumBins] = {};
    bool unmaskedRead = false;
    for (int index : {first, second}) {
        const int code = korvo::codeOfIndex(index);
        if (code < 0 || code >= kBuiltinCodes) continue;
        if (!unmaskedRead) {
            ear.spectrum(levels);
            unmaskedRead = true;
        }
        if (leakFromAbove(levels, masked[index])) continue;
        if (code == kBuiltinCodes - 1 && risesAboveTheBands(levels)) continue;
        heard |= codeBit(code);
    }
    return heard;
}

}  // namespace host
}  // namespace korvo
