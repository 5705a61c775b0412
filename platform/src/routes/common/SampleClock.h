// Sample positions against nanoseconds, in 64-bit integers alone: 32-bit processors have no
// wider type, and a product of nanoseconds and a rate outgrows 64 bits after 2.4 days at
// 44.1 kHz. Each splits off whole seconds (whole rates) first, so that the rest is small.
#pragma once
#include <cstdint>

namespace korvo {
namespace platform {

constexpr uint64_t kNsPerSecond = 1000000000ull;

// floor(ns * rate / 1e9): the samples due `ns` after position 0.
constexpr uint64_t samplesIn(uint64_t ns, uint32_t rate) {
    return ns / kNsPerSecond * rate + ns % kNsPerSecond * rate / kNsPerSecond;
}

// ceil(samples * 1e9 / rate): the first nanosecond at which `samples` are due.
constexpr uint64_t nanosecondsOf(uint64_t samples, uint32_t rate) {
    return samples / rate * kNsPerSecond + (samples % rate * kNsPerSecond + rate - 1) / rate;
}

}  // namespace platform
}  // namespace korvo
