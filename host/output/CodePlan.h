// The host's view of the code plan: which codes a listener reports, from the numbers the
// plug-in shares with its hosts (interface/SoundMeterConstants.h) and the decoders.
#pragma once
#include <string>

#include "host/hearing/Decoder.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

using korvo::codeHz;
using korvo::codeIndex;
using korvo::codeOfIndex;

constexpr int kCodeCount = korvo::kPlanCodes;

// The code the host's decoder takes a tone of `hz` for (within the share of its frequency
// it allows a sender's clock), or -1.
int codeNear(int hz);
// What listeners report when code `code` is said, in a sentence ("" when every listener
// hears it as itself), for a speaker whose output runs at `outputRate` Hz.
std::string codeTruth(int code, int outputRate);
// Why `decoder` does not hear `code`, in a few words.
const char* codeReach(int code, DecoderKind decoder);

// The plan's reach in a few lines, for --help.
extern const char* const kReachText;

// The line (or JSON event) of a code heard at time `t` (seconds of the microphone's clock).
void printHeard(int code, double t);

}  // namespace host
}  // namespace korvo
