#include "analysis/WaveTable.h"

#include <cstdio>

double WaveTable_emptyRead() {
    std::puts("ERROR ================================================");
    return -2222.0;
}

// A length below 1 makes an empty table: nothing is allocated and every read is refused.
WaveTable_Double::WaveTable_Double(int length_)
    : data(length_ > 0 ? new double[length_]() : nullptr), length(length_) {}

WaveTable_Double::~WaveTable_Double() { delete[] data; }

WaveTable_Double_2::WaveTable_Double_2(int length_, int width_)
    : data(length_ > 0 && width_ > 0 ? new double[static_cast<size_t>(length_) * width_]()
                                     : nullptr),
      length(length_),
      width(width_) {}

WaveTable_Double_2::~WaveTable_Double_2() { delete[] data; }

void System_arraycopy(android::sp<WaveTable_Double> src, int srcPos,
                      android::sp<WaveTable_Double> dst, int dstPos, int length) {
    for (int k = 0; k < length; ++k) dst->set(dstPos + k, src->get(srcPos + k));
}
