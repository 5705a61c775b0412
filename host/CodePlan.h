// The host's view of the code plan and the masked read-out, from the numbers the
// plug-in shares with its hosts (interface/SoundMeterConstants.h).
#pragma once
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

using korvo::codeHearable;
using korvo::codeHz;
using korvo::codeIndex;
using korvo::codeOfIndex;

constexpr int kCodeCount = korvo::kPlanCodes;

// Number of codes heard through the masked read-out: they come first in the plan.
constexpr int hearableCodeCount() {
    int n = 0;
    while (n < kCodeCount && codeHearable(n)) ++n;
    return n;
}
constexpr int kHearableCodes = hearableCodeCount();  // 18: codes 0..17

// Why a code can or cannot be heard, in a few words, for messages.
const char* codeReach(int code);

// The plan's reach in a few lines, for --help.
extern const char* const kReachText;

}  // namespace host
}  // namespace korvo
