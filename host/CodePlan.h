// The host's view of the single-frequency code plan: code c is played at
// 86 * (30 + 10c) Hz and found by the masked read-out at spectrum index 30 + 10c.
#pragma once

namespace korvo {
namespace host {

constexpr int kCodeCount = 40;       // codes 0..39 exist in the plan
constexpr int kHearableCodes = 18;   // codes 0..17 survive the masked read-out
constexpr int kLastMaskedCode = 22;  // 18..22 lie inside the 256 bins but are masked out

inline int codeIndex(int code) { return 30 + 10 * code; }
inline int codeHz(int code) { return 86 * codeIndex(code); }
inline bool codeHearable(int code) { return code >= 0 && code < kHearableCodes; }

// Code named by a spectrum index, or -1 when the index is no code of the plan.
int codeOfIndex(int index);

// Why a code can or cannot be heard, in a few words, for messages.
const char* codeReach(int code);

// The plan's reach in a few lines, for --help.
extern const char* const kReachText;

}  // namespace host
}  // namespace korvo
