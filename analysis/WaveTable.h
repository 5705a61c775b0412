// Reference-counted tables of doubles that know their size.
#pragma once
#include <cstdint>
#include <cstring>

#include <utils/RefBase.h>

#include "interface/Export.h"

// The read of an entry of an empty table: prints the ERROR line, yields -2222.0.
[[gnu::cold]] double WaveTable_emptyRead();

// A table's entries seen through the guarded read. Hot loops take a local copy so
// that the length test stays in a register instead of being reloaded per entry.
struct WaveTable_Reader {
    const double* data;
    int32_t length;

    double operator[](int i) const {
        if (__builtin_expect(length < 1, 0)) return WaveTable_emptyRead();
        return data[i];
    }

    // Guarded reads of `count` entries from position `from` into dst, the length test
    // made once for the block.
    void copyTo(int from, double* dst, int count) const {
        if (count < 1) return;
        if (__builtin_expect(length < 1, 0)) {
            for (int k = 0; k < count; ++k) dst[k] = WaveTable_emptyRead();
            return;
        }
        std::memcpy(dst, data + from, static_cast<size_t>(count) * sizeof(double));
    }
};

class WaveTable_Double : public android::RefBase {
public:
    explicit WaveTable_Double(int length);
    ~WaveTable_Double() override;

    // Guarded read: an empty table prints the ERROR line and yields -2222.0.
    double get(int i) const { return reader()[i]; }
    void set(int i, double v) { data[i] = v; }

    // The same accesses as relaxed atomics, for a table that one thread writes while
    // others read it without a lock (the spectrum table).
    double getRelaxed(int i) const {
        if (__builtin_expect(length < 1, 0)) return WaveTable_emptyRead();
        double v;
        __atomic_load(&data[i], &v, __ATOMIC_RELAXED);
        return v;
    }
    void setRelaxed(int i, double v) { __atomic_store(&data[i], &v, __ATOMIC_RELAXED); }

    WaveTable_Reader reader() const { return WaveTable_Reader{data, length}; }

    double* data;
    int32_t length;
};

class WaveTable_Double_2 : public android::RefBase {
public:
    WaveTable_Double_2(int length, int width);
    ~WaveTable_Double_2() override;

    // Guarded read of entry (row, column).
    double get(int row, int column) const {
        if (__builtin_expect(length < 1, 0)) return WaveTable_emptyRead();
        return data[row * width + column];
    }
    void set(int row, int column, double v) { data[row * width + column] = v; }

    double* data;
    int32_t length;  // rows
    int32_t width;   // entries per row
};

// Copies `length` entries of src (from srcPos) into dst (from dstPos), through the guarded read.
KORVO_EXPORT void System_arraycopy(android::sp<WaveTable_Double> src, int srcPos,
                                   android::sp<WaveTable_Double> dst, int dstPos, int length);
