// The tone code plan: both plans' records and log lines, the look-ups, the
// pair correction and the meter object's forwarders.
#include <cstring>
#include <initializer_list>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "meter/SoundMeter.h"
#include "support/DspTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace test = korvo::platform::test;
using Gen = android::MiniToneGenerator;
using korvo::dsptest::Strings;

namespace {

using Desc = Gen::ToneDescriptor;
Desc* const kTable = Gen::sToneDescriptors;

void zeroTable() { std::memset(kTable, 0, sizeof(Gen::sToneDescriptors)); }

// A record as the plans write it: the first segment plays f1 (+ f2) forever, all else zero.
Desc record(unsigned code, int key, unsigned f1 = 0, unsigned f2 = 0) {
    Desc d;
    std::memset(&d, 0, sizeof d);
    if (f1 != 0) d.segments[0].duration = 0xFFFFFFFFu;
    d.segments[0].waveFreq[0] = static_cast<unsigned short>(f1);
    d.segments[0].waveFreq[1] = static_cast<unsigned short>(f2);
    d.code = code;
    d.freq_code = key;
    return d;
}

bool same(const Desc& a, const Desc& b) { return std::memcmp(&a, &b, sizeof(Desc)) == 0; }

void expectSingleFrequencyPlan() {
    // Code c plays 2580 Hz + 860 Hz per code; key = index * 1000.
    for (int c = 0; c < 40; ++c) EXPECT_TRUE(same(kTable[c], record(c, (3 + c) * 10000, 2580u + 860u * c))) << c;
}

void setRecord(int rec, unsigned code, int key) {
    kTable[rec].code = code;
    kTable[rec].freq_code = key;
}

// Rows of (first, second, code) and of (index, key) through the two look-ups.
void expectCodes(std::initializer_list<std::vector<int>> rows) {
    for (const auto& r : rows) EXPECT_EQ(Gen::getCodeFromTwoFreq(r[0], r[1]), r[2]) << r[0] << "/" << r[1];
}
void expectKeys(std::initializer_list<std::pair<int, int>> rows) {
    for (const auto& r : rows) EXPECT_EQ(Gen::getFreqCodeFromIndex(r.first), r.second) << r.first;
}

using Pair = std::pair<int, int>;
Pair fixed(int a, int b) {
    Gen::fixFreq(&a, &b);
    return {a, b};
}

class CodePlan : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        zeroTable();
    }
};

TEST_F(CodePlan, SingleFrequencyPlanRecordsAndLog) {
    EXPECT_EQ(Gen::generateToneTable_ZORV(), 39);
    expectSingleFrequencyPlan();
    EXPECT_TRUE(same(kTable[40], record(999, 99999)));
    for (int r = 41; r < 512; ++r) ASSERT_TRUE(same(kTable[r], record(0, 0))) << r;
    // The rows of the published plan.
    EXPECT_EQ(kTable[17].segments[0].waveFreq[0], 17200u);
    EXPECT_EQ(kTable[22].segments[0].waveFreq[0], 21500u);
    EXPECT_EQ(kTable[23].freq_code, 260000);
    EXPECT_EQ(kTable[39].segments[0].waveFreq[0], 36120u);

    const Strings lines = korvo::dsptest::logMessages(3, "MiniToneGenerator");
    ASSERT_EQ(lines.size(), 1u + 40u * 5u + 2u);
    EXPECT_EQ(Strings(lines.begin(), lines.begin() + 6),
              (Strings{"[MiniToneGenerator] sample_interval_HZ :86.000000 , SAMPLE_RATE : 44100",
                       "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 2580, 0, 0 }, 0, 0 }},",
                       "code: 0,", "freq_code: 30000", "[MiniToneGenerator] freq1_index = 30(2580)Hz",
                       "[MiniToneGenerator] index = 0"}));
    EXPECT_EQ(Strings(lines.begin() + 196, lines.end()),
              (Strings{"{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 36120, 0, 0 }, 0, 0 }},",
                       "code: 39,", "freq_code: 420000", "[MiniToneGenerator] freq1_index = 420(36120)Hz",
                       "[MiniToneGenerator] index = 39", "[MiniToneGenerator] out of index = 40",
                       "END MAKING Tone Generate Table"}));
    EXPECT_EQ(Gen::getFreqTableSize(), 512);
}

TEST_F(CodePlan, TwoFrequencyPlanThenSingleFrequencyPlanAgain) {
    EXPECT_EQ(Gen::generateToneTable(), 119);
    const unsigned lowHz[8] = {1290, 2150, 3010, 3870, 4730, 5590, 6450, 7310};
    for (int c = 0; c < 120; ++c) {
        const Desc want = record(c, (15 + 10 * (c % 8)) * 1000 + 100 + 10 * (c / 8), lowHz[c % 8], 8600u + 860u * (c / 8));
        EXPECT_TRUE(same(kTable[c], want)) << c;
    }
    EXPECT_TRUE(same(kTable[120], record(999, 99999)));
    for (int r = 121; r < 512; ++r) ASSERT_TRUE(same(kTable[r], record(0, 0))) << r;
    EXPECT_EQ(kTable[7].segments[0].waveFreq[0], 7310u);
    EXPECT_EQ(kTable[8].segments[0].waveFreq[1], 9460u);
    EXPECT_EQ(kTable[119].segments[0].waveFreq[1], 20640u);
    expectKeys({{7, 85100}, {8, 15110}, {119, 85240}});

    const Strings lines = korvo::dsptest::logMessages(3, "MiniToneGenerator");
    ASSERT_EQ(lines.size(), 1u + 120u * 5u + 1u);
    EXPECT_EQ(Strings(lines.begin(), lines.begin() + 6),
              (Strings{"[MiniToneGenerator] sample_interval_HZ :86.000000 , SAMPLE_RATE : 44100",
                       "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 1290, 8600, 0 }, 0, 0 }},",
                       "code: 0,", "freq_code: 15100 },", "[MiniToneGenerator] 15(1290Hz):100(8600)Hz",
                       "[MiniToneGenerator] index = 0"}));
    EXPECT_EQ(lines[596], "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 7310, 20640, 0 }, 0, 0 }},");
    EXPECT_EQ(Strings(lines.begin() + 599, lines.end()),
              (Strings{"[MiniToneGenerator] 85(7310Hz):240(20640)Hz", "[MiniToneGenerator] index = 119",
                       "END MAKING Tone Generate Table"}));
    expectCodes({{15, 100, 0}, {85, 100, 7}, {15, 110, 8}, {85, 240, 119}, {100, 15, 999}});
    EXPECT_EQ(Gen::getFreqTableSize(), 512);

    // A later construction lays the single plan over records 0..40; 41..120 keep
    // the two-frequency content behind the new end record.
    std::vector<Desc> before(kTable, kTable + 121);
    Gen::generateToneTable_ZORV();
    expectSingleFrequencyPlan();
    Desc end = before[40];  // the end record's segments are left as they were
    end.code = 999;
    end.freq_code = 99999;
    EXPECT_TRUE(same(kTable[40], end));
    for (int r = 41; r <= 120; ++r) ASSERT_TRUE(same(kTable[r], before[r])) << r;
    EXPECT_EQ(kTable[41].segments[0].waveFreq[1], 8600u + 860u * 5);
    expectCodes({{15, 100, 999}, {25, 150, 999}});  // (25, 150): record 41, hidden behind the end
    expectKeys({{41, 25150}});
    EXPECT_EQ(Gen::getFreqTableSize(), 512);
}

TEST_F(CodePlan, LookUps) {
    Gen::generateToneTable_ZORV();
    test::clearLog();
    // The key is first * 1000 + second: (29, 1000) names the same tone as (30, 0).
    expectCodes({{30, 0, 0}, {420, 0, 39}, {250, 0, 22}, {35, 0, 999}, {30, 1, 999}, {0, 0, 999}, {29, 1000, 0}});
    for (int c = 0; c < 40; ++c) EXPECT_EQ(Gen::getCodeFromTwoFreq(30 + 10 * c, 0), c);
    // Decided: an index outside the table answers 0 instead of reading beyond it.
    expectKeys({{0, 30000}, {39, 420000}, {40, 99999}, {41, 0}, {511, 0}, {-1, 0}, {512, 0}});
    EXPECT_TRUE(test::logLines().empty());
}

TEST_F(CodePlan, LookUpsOnHandMadeTables) {
    // No end record anywhere: the scans cover the 512 records and no more.
    expectCodes({{30, 0, 999}, {420, 0, 999}});
    EXPECT_EQ(fixed(31, 1), Pair(31, 1));
    EXPECT_TRUE(test::logLines().empty());
    expectKeys({{0, 0}});
    // A key stored in the very last record is still found.
    setRecord(511, 511, 77000);
    expectCodes({{77, 0, 511}});

    // Key 5000 sits behind a record whose code is above 999.
    zeroTable();
    setRecord(0, 0, 1000);
    setRecord(1, 1000, 2000);
    setRecord(2, 2, 5000);
    expectCodes({{1, 0, 0}, {2, 0, 1000}, {5, 0, 1000}});  // the stop comes before the key test
    kTable[1].code = 0x80000000u;  // compared as unsigned: still a stop
    expectCodes({{5, 0, static_cast<int>(0x80000000u)}});
    setRecord(1, 1, 1000);  // the first matching record wins
    expectCodes({{1, 0, 0}});

    // Several neighbours of (10, 10) are tones: (10,10), (9,11), (11,9), (10,9).
    zeroTable();
    const int keys[] = {10010, 9011, 11009, 10009};
    for (int i = 0; i < 4; ++i) setRecord(i, static_cast<unsigned>(i), keys[i]);
    setRecord(4, 999, 99999);
    EXPECT_EQ(fixed(10, 10), Pair(9, 11));  // (9,11) is the third candidate, the pair itself the fifth
    kTable[1].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(10, 9));  // (10,9) is fourth: before the pair itself
    kTable[3].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(10, 10));  // now the pair itself, before (11,9)
    kTable[0].freq_code = 1;
    EXPECT_EQ(fixed(10, 10), Pair(11, 9));  // seventh
}

TEST_F(CodePlan, FixFreq) {
    Gen::generateToneTable_ZORV();
    const struct {
        int a, b, wantA, wantB;
        const char* line;  // nullptr: nothing logged
    } cases[] = {
        {31, 1, 30, 0, "[MiniToneGenerator] Fix Freq Code From[31/1] To [30/0]"},
        {29, -1, 30, 0, "[MiniToneGenerator] Fix Freq Code From[29/-1] To [30/0]"},  // ninth candidate
        {30, 0, 30, 0, "[MiniToneGenerator] Fix Freq Code From[30/0] To [30/0]"},
        {421, 0, 420, 0, "[MiniToneGenerator] Fix Freq Code From[421/0] To [420/0]"},
        {249, 1, 250, 0, "[MiniToneGenerator] Fix Freq Code From[249/1] To [250/0]"},
        {35, 0, 35, 0, nullptr},
        {30, 2, 30, 2, nullptr},
        {2147483647, -2147483647 - 1, 2147483647, -2147483647 - 1, nullptr},  // neighbours wrap, no overflow
    };
    for (const auto& c : cases) {
        test::clearLog();
        EXPECT_EQ(fixed(c.a, c.b), Pair(c.wantA, c.wantB)) << c.a << "/" << c.b;
        EXPECT_EQ(korvo::dsptest::logMessages(3, "MiniToneGenerator"), c.line ? Strings{c.line} : Strings{});
    }
}

TEST_F(CodePlan, MeterForwardsAndGeneratorKeepsAFilledPlan) {
    Gen::generateToneTable_ZORV();
    const std::vector<Desc> before(kTable, kTable + 512);
    EXPECT_EQ(Gen(AUDIO_STREAM_MUSIC, 1.0f, false).getMaxToneIndex(), 39);
    EXPECT_EQ(std::memcmp(before.data(), kTable, sizeof(Desc) * 512), 0);

    SoundMeter meter;
    ASSERT_EQ(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.getCodeFromTwoFreq(250, 0), 22);
    EXPECT_EQ(meter.getCodeFromTwoFreq(35, 0), 999);
    EXPECT_EQ(meter.getFreqCodeFromIndex(40), 99999);
    auto meterFix = [&](int a, int b) {
        meter.fixFreq(&a, &b);
        return Pair(a, b);
    };
    EXPECT_EQ(meterFix(31, 1), Pair(30, 0));

    // With a generator, whose construction lays the plan down again.
    zeroTable();
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    ASSERT_NE(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.toneGenerator->getMaxToneIndex(), 39);
    EXPECT_EQ(meter.getCodeFromTwoFreq(420, 0), 39);
    EXPECT_EQ(meter.getFreqCodeFromIndex(39), 420000);
    EXPECT_EQ(meterFix(419, 1), Pair(420, 0));
    meter.releaseToneGenerator();
}

}  // namespace
