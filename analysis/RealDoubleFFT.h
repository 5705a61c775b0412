// Unnormalised forward DFT of a real sequence, in place, mixed radix.
#pragma once
#include <cstdint>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "analysis/WaveTable.h"

class RealDoubleFFT : public android::RefBase {
public:
    explicit RealDoubleFFT(int n);
    ~RealDoubleFFT() override;

    // Replaces the first n entries of data by their transform.
    void forwardTransform(android::sp<WaveTable_Double> data);

    int32_t n;
    android::sp<WaveTable_Double> wavetable;  // work, twiddle and factor table of 2n + 15 entries
};
