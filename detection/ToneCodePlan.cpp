#include "detection/ToneCodePlan.h"

#include "common/LogTags.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace plan {

using android::ToneDescriptor;
using android::ToneSegment;

namespace {

const char* const kTag = kToneTag;
const float kSampleIntervalHz = static_cast<float>(kIndexHz);  // the plan's step per frequency index

// Hz of frequency index k, as both ends of the link compute it.
int indexToHz(int k) { return static_cast<int>(static_cast<float>(k) * kSampleIntervalHz); }

// Key of a frequency pair in 32-bit arithmetic that wraps instead of overflowing.
int32_t pairKey(int first, int second) {
    return static_cast<int32_t>(static_cast<uint32_t>(first) * 1000u + static_cast<uint32_t>(second));
}

// Every construction of a generator lays the plan down again while a playback
// thread may be reading it; storing only what differs keeps a filled table untouched.
template <typename T, typename V>
void storeIfDifferent(T& field, V value) {
    if (field != static_cast<T>(value)) field = static_cast<T>(value);
}

void writeFirstSegment(ToneDescriptor& rec, int f1, int f2) {
    ToneSegment& seg = rec.segments[0];
    storeIfDifferent(seg.duration, kToneForever);
    storeIfDifferent(seg.waveFreq[0], f1);
    storeIfDifferent(seg.waveFreq[1], f2);
    storeIfDifferent(seg.waveFreq[2], 0);
    storeIfDifferent(seg.loopCnt, 0);
    storeIfDifferent(seg.loopIndex, 0);
}

void writeCodes(ToneDescriptor& rec, unsigned int code, int freqCode) {
    storeIfDifferent(rec.code, code);
    storeIfDifferent(rec.freq_code, freqCode);
}

// Returns the code of the first record with this key; the scan ends at an end
// record or, when no plan was laid down yet, after the last record.
int findCode(const ToneDescriptor* table, int32_t key) {
    for (int i = 0; i < kTableRecords; ++i) {
        const ToneDescriptor& rec = table[i];
        if (rec.code >= kEndCode) return static_cast<int>(rec.code);
        if (rec.freq_code == key) return static_cast<int>(rec.code);
    }
    return static_cast<int>(kEndCode);
}

}  // namespace

int layDownSingleFrequencyPlan(ToneDescriptor* table) {
    const int kCodes = kPlanCodes;
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] sample_interval_HZ :%f , SAMPLE_RATE : %d\n", kTag,
                        static_cast<double>(kSampleIntervalHz), kSampleRate);
    for (int i = 0; i < kCodes; ++i) {
        const int k = codeIndex(i);
        const int f = indexToHz(k);
        const int key = k * 1000;
        ToneDescriptor& rec = table[i];
        writeFirstSegment(rec, f, 0);
        __android_log_print(ANDROID_LOG_DEBUG, kTag,
                            "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { %d, 0, 0 }, 0, 0 }},\n",
                            f);
        storeIfDifferent(rec.code, static_cast<unsigned int>(i));
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "code: %d,", i);
        storeIfDifferent(rec.freq_code, key);
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "freq_code: %d\n", key);
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] freq1_index = %d(%d)Hz\n", kTag, k, f);
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] index = %d\n", kTag, i);
    }
    writeCodes(table[kCodes], kEndCode, kEndFreqCode);
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] out of index = %d\n", kTag, kCodes);
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "END MAKING Tone Generate Table\n");
    return kCodes - 1;
}

int layDownTwoFrequencyPlan(ToneDescriptor* table) {
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] sample_interval_HZ :%f , SAMPLE_RATE : %d\n", kTag,
                        static_cast<double>(kSampleIntervalHz), kSampleRate);
    int c = 0;
    for (int h = 100; h < 247; h += 10) {
        const int fh = indexToHz(h);
        for (int l = 15; l <= 85; l += 10) {
            const int fl = indexToHz(l);
            const int key = l * 1000 + h;
            ToneDescriptor& rec = table[c];
            writeFirstSegment(rec, fl, fh);
            __android_log_print(ANDROID_LOG_DEBUG, kTag,
                                "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { %d, %d, 0 }, 0, 0 }},\n",
                                fl, fh);
            storeIfDifferent(rec.code, static_cast<unsigned int>(c));
            __android_log_print(ANDROID_LOG_DEBUG, kTag, "code: %d,", c);
            storeIfDifferent(rec.freq_code, key);
            __android_log_print(ANDROID_LOG_DEBUG, kTag, "freq_code: %d },", key);
            __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] %d(%dHz):%d(%d)Hz\n", kTag, l, fl, h, fh);
            __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] index = %d\n", kTag, c);
            ++c;
        }
    }
    writeCodes(table[c], kEndCode, kEndFreqCode);
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "END MAKING Tone Generate Table\n");
    return c - 1;
}

int freqCodeAt(const ToneDescriptor* table, int index) {
    // An index outside the table names no record: answer 0, as records past the end do.
    if (index < 0 || index >= kTableRecords) return 0;
    return table[index].freq_code;
}

int codeOfPair(const ToneDescriptor* table, int first, int second) { return findCode(table, pairKey(first, second)); }

void fixPair(const ToneDescriptor* table, int* first, int* second) {
    const int a = *first;
    const int b = *second;
    // Neighbours wrap at the ends of int rather than overflow.
    auto step = [](int v, int d) { return static_cast<int>(static_cast<uint32_t>(v) + static_cast<uint32_t>(d)); };
    for (int da = -1; da <= 1; ++da) {
        for (int db = -1; db <= 1; ++db) {
            const int x = step(a, da);
            const int y = step(b, db);
            if (codeOfPair(table, x, y) != static_cast<int>(kEndCode)) {
                __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] Fix Freq Code From[%d/%d] To [%d/%d]\n", kTag, a, b,
                                    x, y);
                *first = x;
                *second = y;
                return;
            }
        }
    }
}

}  // namespace plan
}  // namespace korvo
