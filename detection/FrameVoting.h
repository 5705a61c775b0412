// Majority vote over seven frames of two-peak results (two rows of seven indices,
// row after row). Ties go to the value seen first. Logs every step; no allocation.
#pragma once

namespace korvo {

constexpr int kVoteFrames = 7;

// The most frequent value of row `row` (0 or 1) of the 14-entry matrix.
int frequentIndex(const int* frames, int row);

}  // namespace korvo
