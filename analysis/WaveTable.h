// Reference-counted tables of doubles that know their size.
#pragma once
#include <cstdint>

#include <utils/RefBase.h>

#include "interface/Export.h"

class WaveTable_Double : public android::RefBase {
public:
    explicit WaveTable_Double(int length);
    ~WaveTable_Double() override;

    // Guarded read: an empty table prints the ERROR line and yields -2222.0.
    double get(int i) const;
    void set(int i, double v) { data[i] = v; }

    double* data;
    int32_t length;
};

class WaveTable_Double_2 : public android::RefBase {
public:
    WaveTable_Double_2(int length, int width);
    ~WaveTable_Double_2() override;

    // Guarded read of entry (row, column).
    double get(int row, int column) const;
    void set(int row, int column, double v) { data[row * width + column] = v; }

    double* data;
    int32_t length;  // rows
    int32_t width;   // entries per row
};

// Copies `length` entries of src (from srcPos) into dst (from dstPos), through the guarded read.
KORVO_EXPORT void System_arraycopy(android::sp<WaveTable_Double> src, int srcPos,
                                   android::sp<WaveTable_Double> dst, int dstPos, int length);
