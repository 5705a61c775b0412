// Writing and reading one speaker slot of a room without any lock.
//
// The one writer of a slot first moves `begin` past every position whose ring
// cell it is about to reuse, then stores the samples (release), then `end`
// (release). A reader takes `end` (acquire), loads the cells (acquire) and only
// then reads `begin`: a cell it saw rewritten brings the newer `begin` with it,
// so the reader drops exactly the positions that may have changed under it.
// Real-time safe: no allocation, no blocking, no system call.
#pragma once
#include <cstddef>
#include <cstdint>

#include "routes/sim/SimRoomLayout.h"

namespace korvo {
namespace platform {
namespace sim {

// Writes count (at most kRingSamples / 2) samples at positions [position, position + count).
// `position` must not be below the slot's end: positions only move forward. A gap
// after the previous write reads as silence.
void placeSamples(SpeakerSlot& slot, int64_t position, const int16_t* samples, size_t count);

struct SlotSpan {
    int64_t from = 0;  // valid positions [from, to); empty when from >= to
    int64_t to = 0;
};

// Copies what the slot holds for [position, position + count) into scratch
// (scratch[i] is position + i) and returns the positions that are valid there.
SlotSpan readSamples(const SpeakerSlot& slot, int64_t position, size_t count, int16_t* scratch);

}  // namespace sim
}  // namespace platform
}  // namespace korvo
