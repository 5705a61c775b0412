// Peak detection on a spectrum array of 256 levels. Every scan follows one rule:
// an entry becomes the running maximum only if it is strictly greater than the
// maximum so far (starting at 0.0) and than the entry examined just before it.
// So nothing at or below 0.0 and no NaN is ever a peak, and among equal largest
// values the lowest index wins. Entry 0 is a comparison value, never a peak.
// The scans run on the caller's thread, read only entries 0..255 and allocate nothing.
#pragma once

namespace korvo {

// Strongest entry from start+1 on, the one before start+1 being compared with entry
// start-1 (0.0 at start 0). *index is written only when an entry qualifies.
float detectPeakFreq(const float* spectrum, int start, int* index);
// The same, the first examined entry being compared with entry start; *index is
// always written, 0 when nothing qualifies.
float detectPeakFreq_zorv(const float* spectrum, int start, int* index);
// Over entries 1..255 outside first-4..first+4: the maximum that the final maximum
// displaced (index 0 and 0.0 when only one entry ever became maximum).
float detectSecondPeakFreq_zorv(const float* spectrum, int first, int* index);
// Second peak of the plain two-peak search when the first lies at 100 or above:
// entries 1..99 above entry 0 and more than three away from first; *second takes
// each new maximum at once and keeps the caller's value when none qualifies.
float detectLowBandPeak(const float* spectrum, int first, int* second);
// Puts a pair in ascending order.
void orderPeaks(int* first, int* second);

}  // namespace korvo
