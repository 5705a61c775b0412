#include "host/CodePlan.h"

namespace korvo {
namespace host {

const char* codeReach(int code) {
    if (codeHearable(code)) return "can be heard";
    if (korvo::codeInSpectrum(code)) return "is masked out by the read-out and cannot be heard";
    return "lies beyond the spectrum and cannot be heard";
}

const char* const kReachText =
    "Codes: code c (0..39) is a tone of 86*(30+10c) Hz. Only codes 0..17 (2580..17200 Hz)\n"
    "can be heard: the read-out keeps spectrum entries 26..200 whose index mod 10 is\n"
    "0, 3, 4, 5, 6 or 7; codes 18..22 (18060..21500 Hz) lie inside the 256 bins but are\n"
    "masked out; codes 23..39 (22360 Hz and up) lie beyond the 256 bins and above half\n"
    "the output rate at 44100 Hz (22050 Hz).";

}  // namespace host
}  // namespace korvo
