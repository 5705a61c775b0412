#include "routes/sim/SimRoomSlot.h"

#include <algorithm>

namespace korvo {
namespace platform {
namespace sim {

void placeSamples(SpeakerSlot& slot, int64_t position, const int16_t* samples, size_t count) {
    const int64_t end = slot.end.load(std::memory_order_relaxed);  // only we write it
    if (position < end) {  // never rewrite the past a reader may already hold
        const int64_t skip = std::min<int64_t>(end - position, int64_t(count));
        samples += skip;
        count -= size_t(skip);
        position += skip;
    }
    if (count == 0) return;
    const int64_t stop = position + int64_t(count);

    int64_t begin = slot.begin.load(std::memory_order_relaxed);
    int64_t fillFrom = end;
    if (position - end >= kRingSamples) {
        begin = position;  // nothing of the old stream survives the jump
        fillFrom = position;
    } else {
        begin = std::max(begin, stop - kRingSamples);
        fillFrom = std::max(end, begin);
    }
    slot.begin.store(begin, std::memory_order_relaxed);
    for (int64_t p = fillFrom; p < position; ++p) {
        slot.ring[p & kRingMask].store(0, std::memory_order_release);
    }
    for (size_t i = 0; i < count; ++i) {
        slot.ring[(position + int64_t(i)) & kRingMask].store(samples[i], std::memory_order_release);
    }
    slot.end.store(stop, std::memory_order_release);
}

SlotSpan readSamples(const SpeakerSlot& slot, int64_t position, size_t count, int16_t* scratch) {
    SlotSpan span;
    const int64_t end = slot.end.load(std::memory_order_acquire);
    const int64_t to = std::min(position + int64_t(count), end);
    const int64_t from = std::max(position, slot.begin.load(std::memory_order_acquire));
    if (from >= to) return span;
    for (int64_t p = from; p < to; ++p) {
        scratch[p - position] = slot.ring[p & kRingMask].load(std::memory_order_acquire);
    }
    // Read after the cells: covers every rewrite that any loaded cell came from.
    const int64_t begin = slot.begin.load(std::memory_order_acquire);
    span.from = std::max(from, begin);
    span.to = to;
    return span;
}

}  // namespace sim
}  // namespace platform
}  // namespace korvo
