// Detection: the peak scans and the vote as free functions over arrays, the meter's
// forwarders, and the tone code plan with its look-ups.
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <limits>
#include <iterator>
#include <memory>

#include <utils/Timers.h>

#include "detection/FrameVoting.h"
#include "detection/PeakDetection.h"
#include "detection/ToneCodePlan.h"
#include "meter/SoundMeter.h"
#include "support/LibraryTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace {

using namespace korvo::testing;
using Peaks = std::vector<std::pair<int, float>>;
using Pair = std::pair<int, int>;
const int kIntMax = std::numeric_limits<int>::max();
const float kNaN = std::numeric_limits<float>::quiet_NaN();

// Exactly 256 floats on the heap, so that a read outside 0..255 trips the address checker.
struct Spectrum {
    std::unique_ptr<float[]> v{new float[256]()};
    explicit Spectrum(const Peaks& peaks = {}, float fill = 0.0f) {
        std::fill(v.get(), v.get() + 256, fill);
        for (const auto& p : peaks) v[p.first] = p.second;
    }
    float* data() { return v.get(); }
};

using Detection = LoggedTest;

TEST_F(Detection, SinglePeakScans) {
    enum Scan { kPlain, kZorv, kSecond };
    const int kPreset = 77;  // the plain scan leaves the index alone when it finds nothing
    struct Check { Scan scan; int arg; float level; int index; };
    const struct { Peaks peaks; std::vector<Check> checks; float fill = 0.0f; } rows[] = {
        {{}, {{kPlain, 0, 0.0f, kPreset}, {kZorv, 0, 0.0f, 0}, {kSecond, 40, 0.0f, 0}}},
        {{{200, 4.0f}}, {{kPlain, 0, 0.0f, kPreset}, {kZorv, 0, 0.0f, 0}}, kNaN},  // no rise after a NaN
        {{}, {{kPlain, 0, 0.0f, kPreset}}, -5.0f},                                    // nothing at or below 0
        {{{30, 50.0f}}, {{kZorv, 0, 50.0f, 30}, {kPlain, 0, 50.0f, 30}, {kSecond, 30, 0.0f, 0}}},
        // 80 displaced only the initial 0; with 60 before it, 60 is what 80 displaced.
        {{{30, 50.0f}, {80, 40.0f}}, {{kSecond, 30, 0.0f, 0}}},
        {{{30, 50.0f}, {80, 40.0f}, {60, 10.0f}}, {{kSecond, 30, 10.0f, 60}}},
        // Equal maxima and plateaus: the lowest index; a rise after a plateau wins.
        {{{40, 20.0f}, {90, 20.0f}}, {{kPlain, 0, 20.0f, 40}, {kZorv, 0, 20.0f, 40}}},
        {{{50, 30.0f}, {51, 30.0f}, {52, 31.0f}}, {{kPlain, 0, 31.0f, 52}, {kZorv, 0, 31.0f, 52}}},
        // Entry 1 faces 0.0 in the plain scan, entry 0 in the zorv scan; entry 0 is never a peak.
        {{{0, 60.0f}, {1, 50.0f}}, {{kPlain, 0, 50.0f, 1}, {kZorv, 0, 0.0f, 0}}},
        {{{0, 99.0f}, {10, 5.0f}}, {{kPlain, 0, 5.0f, 10}, {kZorv, 0, 5.0f, 10}}},
        // From 100: the plain scan compares 101 with entry 99, the zorv scan with entry 100.
        {{{99, 40.0f}, {100, 5.0f}, {101, 30.0f}}, {{kPlain, 100, 0.0f, kPreset}, {kZorv, 100, 30.0f, 101}}},
        {{{99, 1.0f}, {100, 80.0f}, {101, 30.0f}}, {{kPlain, 100, 30.0f, 101}, {kZorv, 100, 0.0f, 0}}},
        // Starts at the end examine nothing; decided: a negative start counts as 0.
        {{{255, 9.0f}, {3, 1.0f}},
         {{kPlain, 254, 9.0f, 255}, {kPlain, 255, 0.0f, kPreset}, {kZorv, 255, 0.0f, 0}, {kZorv, kIntMax, 0.0f, 0},
          {kPlain, -7, 9.0f, 255}, {kZorv, -7, 9.0f, 255}}},
        // 36..44 lie in the gap around 40: 45 faces 35 (a rise), not 44; a high 35 hides it.
        {{{40, 90.0f}, {44, 70.0f}, {45, 20.0f}, {36, 60.0f}, {200, 50.0f}}, {{kSecond, 40, 20.0f, 45}}},
        {{{40, 90.0f}, {44, 70.0f}, {45, 20.0f}, {36, 60.0f}, {200, 50.0f}, {35, 25.0f}}, {{kSecond, 40, 25.0f, 35}}},
        // A gap at the start: 8 faces entry 0.
        {{{0, 10.0f}, {2, 99.0f}, {8, 5.0f}, {9, 12.0f}, {100, 30.0f}}, {{kSecond, 3, 12.0f, 9}}},
        // A gap at the end, and far-off first values that leave nothing out, without overflow.
        {{{10, 4.0f}, {248, 6.0f}, {250, 90.0f}},
         {{kSecond, 253, 4.0f, 10}, {kSecond, std::numeric_limits<int>::min(), 6.0f, 248}, {kSecond, kIntMax, 6.0f, 248}}},
    };
    for (size_t n = 0; n < std::size(rows); ++n) {
        Spectrum s(rows[n].peaks, rows[n].fill);
        for (const Check& c : rows[n].checks) {
            SCOPED_TRACE("row " + std::to_string(n) + ", scan " + std::to_string(c.scan) + "(" + std::to_string(c.arg) + ")");
            int idx = kPreset;
            const float level = c.scan == kPlain  ? korvo::detectPeakFreq(s.data(), c.arg, &idx)
                                : c.scan == kZorv ? korvo::detectPeakFreq_zorv(s.data(), c.arg, &idx)
                                                  : korvo::detectSecondPeakFreq_zorv(s.data(), c.arg, &idx);
            EXPECT_EQ(level, c.level);
            EXPECT_EQ(idx, c.index);
        }
    }
}

// Records the calls that reach the single-peak operations through the virtual table.
class RecordingMeter : public SoundMeter {
public:
    float detectPeakFreq(float* s, int start, int* index) override {
        calls.push_back("peak(" + std::to_string(start) + ")");
        return SoundMeter::detectPeakFreq(s, start, index);
    }
    float detectPeakFreq_zorv(float* s, int start, int* index) override {
        calls.push_back("zorv(" + std::to_string(start) + ")");
        return SoundMeter::detectPeakFreq_zorv(s, start, index);
    }
    float detectSecondPeakFreq_zorv(float* s, int first, int* index) override {
        calls.push_back("second(" + std::to_string(first) + ")");
        *index = 7;  // an answer the real scan would not give
        return 1.0f;
    }
    Strings calls;
};

TEST_F(Detection, ALowBandPeakMustRiseAboveTheFloor) {
    // Entry 0 is the floor: an entry level with it is no peak, one above it is.
    float s[256] = {};
    s[0] = 5.0f;
    s[20] = 5.0f;
    int second = -1;
    EXPECT_EQ(korvo::detectLowBandPeak(s, 150, &second), 0.0f);
    EXPECT_EQ(second, -1);
    s[30] = 6.0f;
    EXPECT_EQ(korvo::detectLowBandPeak(s, 150, &second), 6.0f);
    EXPECT_EQ(second, 30);
}

TEST_F(Detection, TwoPeakOperationsThroughTheMeter) {
    struct Row {
        Peaks peaks;
        int presetSecond, wantFirst, wantSecond;  // the first index is preset to -1
        const char* log;  // after the time: indices after the swap, levels in the order found
        Strings calls;
    } rows[] = {
        // Strongest below 100: the second search starts at 101 (entry 100 is never found).
        {{{40, 50.0f}, {100, 30.0f}}, -1, -1, 40, "-1(50.000000) and 40(0.000000)", {"peak(0)", "peak(100)"}},
        {{{40, 50.0f}, {101, 20.0f}}, -1, 40, 101, "40(50.000000) and 101(20.000000)", {"peak(0)", "peak(100)"}},
        // Strongest at 100 or above: entries 1..99 only, the caller's value kept when none qualifies.
        {{{150, 50.0f}, {120, 30.0f}}, 500, 150, 500, "150(50.000000) and 500(0.000000)", {"peak(0)"}},
        // Entry 0 is the comparison value of every low entry, not the predecessor.
        {{{150, 50.0f}, {50, 20.0f}, {0, 10.0f}}, -1, 50, 150, "50(50.000000) and 150(20.000000)", {"peak(0)"}},
        {{{150, 50.0f}, {50, 20.0f}, {0, 30.0f}}, -1, -1, 150, "-1(50.000000) and 150(0.000000)", {"peak(0)"}},
        {{{150, 50.0f}, {60, 20.0f}, {70, 20.0f}, {59, kNaN}}, -1, 60, 150, "60(50.000000) and 150(20.000000)", {"peak(0)"}},
        // Within three of the first peak is left out; from 103 on nothing of 1..99 is.
        {{{100, 50.0f}, {97, 20.0f}, {96, 10.0f}}, -1, 96, 100, "96(50.000000) and 100(10.000000)", {"peak(0)"}},
        {{{103, 50.0f}, {99, 20.0f}}, -1, 99, 103, "99(50.000000) and 103(20.000000)", {"peak(0)"}},
    };
    RecordingMeter meter;
    SoundMeter_vir* api = &meter;
    for (size_t n = 0; n < std::size(rows); ++n) {
        SCOPED_TRACE("row " + std::to_string(n));
        Spectrum s(rows[n].peaks);
        int a = -1, b = rows[n].presetSecond;
        test::clearLog();
        meter.calls.clear();
        const long before = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
        api->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
        const long after = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
        EXPECT_EQ(Pair(a, b), Pair(rows[n].wantFirst, rows[n].wantSecond));
        EXPECT_EQ(meter.calls, rows[n].calls);
        const Strings lines = logOf("TQX");
        ASSERT_EQ(lines.size(), 1u);
        long ms = -1;
        char rest[128] = {};
        ASSERT_EQ(std::sscanf(lines[0].c_str(), "D/[SoundMeter] TIME[%ld]%127[^\n]", &ms, rest), 2) << lines[0];
        EXPECT_TRUE(ms >= before) << ms;
        EXPECT_TRUE(ms <= after) << ms;
        EXPECT_EQ(rest, " Two Max Power is " + std::string(rows[n].log) + " END");
    }
    // The zorv pair: the strongest, then the second scan on it, sorted, nothing logged.
    Spectrum s({{40, 50.0f}});
    int a = -1, b = -1;
    meter.calls.clear();
    test::clearLog();
    api->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(meter.calls, (Strings{"zorv(0)", "second(40)"}));
    EXPECT_EQ(Pair(a, b), Pair(7, 40));
    EXPECT_TRUE(logOf("TQX").empty());
    // The real second scan through a plain meter (the single scans' forwarders: the C host).
    SoundMeter plain;
    Spectrum t({{30, 50.0f}, {60, 10.0f}, {80, 40.0f}});
    plain.detectTwoPeakFreq_zorv(0.9f, t.data(), &a, &b);
    EXPECT_EQ(Pair(a, b), Pair(30, 60));
}

TEST_F(Detection, FrameVote) {
    // Row 1 votes; row 0 is noise.
    auto vote = [](const std::vector<int>& row) {
        int frames[14];
        for (int i = 0; i < 7; ++i) frames[i] = 1000 + i, frames[7 + i] = row[i];
        return korvo::frequentIndex(frames, 1);
    };
    const struct { std::vector<int> row; int want; } rows[] = {
        {{30, 30, 40, 40, 50, 50, 50}, 50}, {{0, 0, 0, 0, 0, 0, 0}, 0},   {{7, 7, 3, 3, 3, 7, 9}, 7},
        {{30, 40, 40, 30, 70, 80, 90}, 30}, {{11, 22, 33, 44, 55, 66, 77}, 11}, {{1, 2, 2, 1, 255, 255, 255}, 255},
        {{40, 30, 30, 40, 30, 40, 0}, 40},  {{0, 30, 30, 0, 30, 0, 0}, 0},
        {{-1, -1, -1, -1, -1, -1, -1}, 0},  // decided: packed like any value; defined, meaningless
    };
    for (const auto& r : rows) EXPECT_EQ(vote(r.row), r.want) << ::testing::PrintToString(r.row);
    vote({kIntMax, std::numeric_limits<int>::min(), kIntMax, 0, -1, kIntMax, 5});  // no overflow trap

    test::clearLog();
    EXPECT_EQ(vote({5, 0, 5, 0, 0, 9, 9}), 0);
    const Strings frame = {"D/[SoundMeter] DETECTING FREQ IN FRAME two peaks["};
    EXPECT_EQ(logOf("TQX"),
              (Strings{"D/[SoundMeter] DETECTING FREQ IN FRAME [1]", frame[0] + "0]=5", "D/[5] Count added to tp[0]=5001",
                       frame[0] + "1]=0", "D/[0] Count added to tp[1]=1",  // 0 meets an empty slot as a match
                       frame[0] + "2]=5", "D/[5] Count added to tp[0]=5002", frame[0] + "3]=0",
                       "D/[0] Count added to tp[1]=2", frame[0] + "4]=0", "D/[0] Count added to tp[1]=3",
                       frame[0] + "5]=9",  // a new slot: no count line
                       frame[0] + "6]=9", "D/[9] Count added to tp[2]=9002", "D/[SoundMeter] TP Debug"}));

    // Through the meter: row 0, then row 1, no sorting.
    int frames[14] = {200, 200, 200, 200, 200, 200, 200, 10, 10, 10, 10, 10, 10, 10}, first = -1, second = -1;
    test::clearLog();
    SoundMeter().detectTwoPeakFrame(frames, &first, &second);
    EXPECT_TRUE(first == 200);
    EXPECT_TRUE(second == 10);
    EXPECT_TRUE(logOf("TQX", "IN FRAME [").back() == "D/[SoundMeter] DETECTING FREQ IN FRAME [1]");
}

// ---- the code plan --------------------------------------------------------------

using Gen = android::MiniToneGenerator;
using Desc = Gen::ToneDescriptor;
Desc* const kTable = Gen::sToneDescriptors;

// A record as the plans write it: the first segment plays f1 (+ f2) forever, all else zero.
Desc record(unsigned code, int key, unsigned f1 = 0, unsigned f2 = 0) {
    Desc d{};
    if (f1 != 0) d.segments[0].duration = 0xFFFFFFFFu;
    d.segments[0].waveFreq[0] = static_cast<unsigned short>(f1);
    d.segments[0].waveFreq[1] = static_cast<unsigned short>(f2);
    d.code = code;
    d.freq_code = key;
    return d;
}
bool same(const Desc& a, const Desc& b) { return std::memcmp(&a, &b, sizeof(Desc)) == 0; }
void setRecord(int rec, unsigned code, int key) { kTable[rec].code = code, kTable[rec].freq_code = key; }
Pair fixed(int a, int b) { return Gen::fixFreq(&a, &b), Pair(a, b); }

class CodePlan : public LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        std::memset(kTable, 0, sizeof(Gen::sToneDescriptors));
    }
};

TEST_F(CodePlan, BothPlansTheirRecordsAndLogs) {
    EXPECT_EQ(Gen::generateToneTable(), 119);
    const unsigned lowHz[8] = {1290, 2150, 3010, 3870, 4730, 5590, 6450, 7310};
    for (int c = 0; c < 120; ++c)
        ASSERT_TRUE(same(kTable[c], record(c, (15 + 10 * (c % 8)) * 1000 + 100 + 10 * (c / 8), lowHz[c % 8],
                                           8600u + 860u * (c / 8)))) << c;
    EXPECT_TRUE(same(kTable[120], record(999, 99999)));
    for (int r = 121; r < 512; ++r) ASSERT_TRUE(same(kTable[r], record(0, 0))) << r;
    Strings log = logOf("MiniToneGenerator");
    ASSERT_EQ(log.size(), 602u);
    EXPECT_EQ(Strings(log.begin(), log.begin() + 6),
              (Strings{"D/[MiniToneGenerator] sample_interval_HZ :86.000000 , SAMPLE_RATE : 44100",
                       "D/{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 1290, 8600, 0 }, 0, 0 }},",
                       "D/code: 0,", "D/freq_code: 15100 },", "D/[MiniToneGenerator] 15(1290Hz):100(8600)Hz",
                       "D/[MiniToneGenerator] index = 0"}));
    EXPECT_EQ(log.back(), "D/END MAKING Tone Generate Table");
    EXPECT_EQ(Gen::getCodeFromTwoFreq(85, 240), 119);
    EXPECT_EQ(Gen::getCodeFromTwoFreq(100, 15), 999);

    // The single-frequency plan over it: records 0..40 rewritten, 41..120 kept behind the end.
    const std::vector<Desc> before(kTable, kTable + 121);
    test::clearLog();
    EXPECT_EQ(Gen::generateToneTable_ZORV(), 39);
    for (int c = 0; c < 40; ++c) ASSERT_TRUE(same(kTable[c], record(c, (3 + c) * 10000, 2580u + 860u * c))) << c;
    Desc end = before[40];
    end.code = 999, end.freq_code = 99999;
    EXPECT_TRUE(same(kTable[40], end));
    for (int r = 41; r <= 120; ++r) ASSERT_TRUE(same(kTable[r], before[r])) << r;
    EXPECT_EQ(Gen::getCodeFromTwoFreq(25, 150), 999);  // record 41, hidden behind the end record
    log = logOf("MiniToneGenerator");
    ASSERT_EQ(log.size(), 203u);
    EXPECT_EQ(log[4], "D/[MiniToneGenerator] freq1_index = 30(2580)Hz");
    EXPECT_EQ(Strings(log.end() - 3, log.end()),
              (Strings{"D/[MiniToneGenerator] index = 39", "D/[MiniToneGenerator] out of index = 40",
                       "D/END MAKING Tone Generate Table"}));
    EXPECT_EQ(Gen::getFreqTableSize(), 512);
}

TEST_F(CodePlan, TheExportedTableHasTheRecordLayoutHostsRead) {
    // Hosts read sToneDescriptors by this layout: 512 records of 13 segments of 16 bytes,
    // then the code and the frequency code.
    using android::ToneDescriptor;
    using android::ToneSegment;
    EXPECT_EQ(korvo::plan::kSegments, static_cast<int>(std::size(ToneDescriptor{}.segments)));
    EXPECT_EQ(Gen::NUM_SEGMENTS, 13);
    EXPECT_EQ(offsetof(ToneSegment, waveFreq), 4u);
    EXPECT_EQ(offsetof(ToneSegment, loopCnt), 12u);
    EXPECT_EQ(offsetof(ToneSegment, loopIndex), 14u);
    EXPECT_EQ(sizeof(ToneDescriptor), 216u);
    EXPECT_EQ(offsetof(ToneDescriptor, code), 208u);
    EXPECT_EQ(offsetof(ToneDescriptor, freq_code), 212u);
    EXPECT_EQ(sizeof(Gen::sToneDescriptors), 512u * 216u);
}

TEST_F(CodePlan, LookUpsAndPairCorrection) {
    // No plan yet: nothing found, and the scans stop after record 511, where a key is still found.
    EXPECT_EQ(Gen::getCodeFromTwoFreq(30, 0), 999);
    EXPECT_EQ(fixed(31, 1), Pair(31, 1));
    setRecord(511, 511, 77000);
    EXPECT_EQ(Gen::getCodeFromTwoFreq(77, 0), 511);
    // A code of 999 or more (unsigned) stops the scan before its key is tested; the first match wins.
    setRecord(0, 0, 1000), setRecord(1, 0x80000000u, 2000), setRecord(2, 2, 5000), setRecord(3, 3, 1000);
    EXPECT_EQ(Gen::getCodeFromTwoFreq(5, 0), static_cast<int>(0x80000000u));
    EXPECT_EQ(Gen::getCodeFromTwoFreq(1, 0), 0);
    // Several neighbours of (10, 10) in the plan: the candidate order decides.
    std::memset(kTable, 0, sizeof(Gen::sToneDescriptors));
    const int keys[] = {10010, 9011, 11009, 10009};
    for (int i = 0; i < 4; ++i) setRecord(i, static_cast<unsigned>(i), keys[i]);
    setRecord(4, 999, 99999);
    EXPECT_EQ(fixed(10, 10), Pair(9, 11));  // third candidate; the pair itself is fifth
    kTable[1].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(10, 9));  // fourth
    kTable[3].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(10, 10));
    kTable[0].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(11, 9));  // seventh

    Gen::generateToneTable_ZORV();
    const int codes[][3] = {{30, 0, 0}, {420, 0, 39}, {250, 0, 22}, {35, 0, 999}, {30, 1, 999}, {0, 0, 999}, {29, 1000, 0}};
    for (const auto& c : codes) EXPECT_EQ(Gen::getCodeFromTwoFreq(c[0], c[1]), c[2]) << c[0] << "/" << c[1];
    // Decided: an index outside the table answers 0 instead of reading beyond it.
    const Pair keyAt[] = {{0, 30000}, {39, 420000}, {40, 99999}, {41, 0}, {511, 0}, {-1, 0}, {512, 0}};
    for (const auto& k : keyAt) EXPECT_EQ(Gen::getFreqCodeFromIndex(k.first), k.second) << k.first;
    const struct { int a, b, wantA, wantB; bool logged; } fixes[] = {
        {31, 1, 30, 0, true}, {29, -1, 30, 0, true}, {30, 0, 30, 0, true}, {421, 0, 420, 0, true},
        {35, 0, 35, 0, false}, {kIntMax, -kIntMax - 1, kIntMax, -kIntMax - 1, false},  // neighbours wrap
    };
    for (const auto& f : fixes) {
        test::clearLog();
        EXPECT_EQ(fixed(f.a, f.b), Pair(f.wantA, f.wantB));
        char line[96];
        std::snprintf(line, sizeof line, "D/[MiniToneGenerator] Fix Freq Code From[%d/%d] To [%d/%d]", f.a, f.b,
                      f.wantA, f.wantB);
        EXPECT_EQ(logOf("MiniToneGenerator"), f.logged ? Strings{line} : Strings{});
    }

    // The meter forwards, with or without a generator.
    SoundMeter meter;
    EXPECT_EQ(meter.getCodeFromTwoFreq(250, 0), 22);
    EXPECT_EQ(meter.getFreqCodeFromIndex(40), 99999);
    int a = 419, b = 1;
    meter.fixFreq(&a, &b);
    EXPECT_EQ(Pair(a, b), Pair(420, 0));
}

}  // namespace
