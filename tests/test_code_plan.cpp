// The tone code plan: both plans' records and log lines, the look-ups, the
// pair correction and the meter object's forwarders.
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

namespace test = korvo::platform::test;
using android::MiniToneGenerator;

namespace {

using Desc = MiniToneGenerator::ToneDescriptor;

void zeroTable() { std::memset(MiniToneGenerator::sToneDescriptors, 0, sizeof(MiniToneGenerator::sToneDescriptors)); }

bool isZero(const void* p, size_t n) {
    const unsigned char* b = static_cast<const unsigned char*>(p);
    for (size_t i = 0; i < n; ++i)
        if (b[i] != 0) return false;
    return true;
}

// Checks a generated record: the first segment plays f1 (+ f2) forever, the
// other twelve segments are zero.
void expectRecord(int rec, unsigned f1, unsigned f2, int key) {
    SCOPED_TRACE("record " + std::to_string(rec));
    const Desc& d = MiniToneGenerator::sToneDescriptors[rec];
    EXPECT_EQ(d.segments[0].duration, 0xFFFFFFFFu);
    EXPECT_EQ(d.segments[0].waveFreq[0], f1);
    EXPECT_EQ(d.segments[0].waveFreq[1], f2);
    EXPECT_EQ(d.segments[0].waveFreq[2], 0u);
    EXPECT_EQ(d.segments[0].waveFreq[3], 0u);
    EXPECT_EQ(d.segments[0].loopCnt, 0u);
    EXPECT_EQ(d.segments[0].loopIndex, 0u);
    EXPECT_TRUE(isZero(&d.segments[1], sizeof(d.segments) - sizeof(d.segments[0])));
    EXPECT_EQ(d.code, static_cast<unsigned>(rec));
    EXPECT_EQ(d.freq_code, key);
}

// The end record's segments are left as they were (zero on a fresh table).
void expectEndRecord(int rec, bool freshTable = true) {
    SCOPED_TRACE("end record " + std::to_string(rec));
    const Desc& d = MiniToneGenerator::sToneDescriptors[rec];
    EXPECT_EQ(d.code, 999u);
    EXPECT_EQ(d.freq_code, 99999);
    if (freshTable) {
        EXPECT_TRUE(isZero(d.segments, sizeof(d.segments)));
    }
}

std::vector<std::string> planLines() {
    std::vector<std::string> out;
    for (const auto& l : test::logLines()) {
        EXPECT_EQ(l.tag, "MiniToneGenerator") << l.msg;
        EXPECT_EQ(l.prio, 3) << l.msg;
        out.push_back(l.msg);
    }
    return out;
}

class CodePlan : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        test::captureLog(true);
        test::clearLog();
        zeroTable();
    }
    void TearDown() override { test::captureLog(false); }
};

TEST_F(CodePlan, SingleFrequencyPlanRecordsAndLog) {
    EXPECT_EQ(MiniToneGenerator::generateToneTable_ZORV(), 39);
    // Code c plays 2580 Hz + 860 Hz per code; key = index * 1000.
    for (int c = 0; c < 40; ++c) expectRecord(c, 2580u + 860u * c, 0u, (3 + c) * 10000);
    expectEndRecord(40);
    for (int r = 41; r < 512; ++r) ASSERT_TRUE(isZero(&MiniToneGenerator::sToneDescriptors[r], sizeof(Desc))) << r;
    // The rows of the published plan.
    EXPECT_EQ(MiniToneGenerator::sToneDescriptors[17].segments[0].waveFreq[0], 17200u);
    EXPECT_EQ(MiniToneGenerator::sToneDescriptors[22].segments[0].waveFreq[0], 21500u);
    EXPECT_EQ(MiniToneGenerator::sToneDescriptors[23].freq_code, 260000);
    EXPECT_EQ(MiniToneGenerator::sToneDescriptors[39].segments[0].waveFreq[0], 36120u);

    const std::vector<std::string> lines = planLines();
    ASSERT_EQ(lines.size(), 1u + 40u * 5u + 2u);
    EXPECT_EQ(lines[0], "[MiniToneGenerator] sample_interval_HZ :86.000000 , SAMPLE_RATE : 44100");
    EXPECT_EQ(lines[1], "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 2580, 0, 0 }, 0, 0 }},");
    EXPECT_EQ(lines[2], "code: 0,");
    EXPECT_EQ(lines[3], "freq_code: 30000");
    EXPECT_EQ(lines[4], "[MiniToneGenerator] freq1_index = 30(2580)Hz");
    EXPECT_EQ(lines[5], "[MiniToneGenerator] index = 0");
    EXPECT_EQ(lines[196], "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 36120, 0, 0 }, 0, 0 }},");
    EXPECT_EQ(lines[197], "code: 39,");
    EXPECT_EQ(lines[198], "freq_code: 420000");
    EXPECT_EQ(lines[199], "[MiniToneGenerator] freq1_index = 420(36120)Hz");
    EXPECT_EQ(lines[200], "[MiniToneGenerator] index = 39");
    EXPECT_EQ(lines[201], "[MiniToneGenerator] out of index = 40");
    EXPECT_EQ(lines[202], "END MAKING Tone Generate Table");
    EXPECT_EQ(MiniToneGenerator::getFreqTableSize(), 512);
}

TEST_F(CodePlan, TwoFrequencyPlanThenSingleFrequencyPlanAgain) {
    EXPECT_EQ(MiniToneGenerator::generateToneTable(), 119);
    const unsigned lowHz[8] = {1290, 2150, 3010, 3870, 4730, 5590, 6450, 7310};
    for (int c = 0; c < 120; ++c) {
        const int low = 15 + 10 * (c % 8);
        const int high = 100 + 10 * (c / 8);
        expectRecord(c, lowHz[c % 8], 8600u + 860u * (c / 8), low * 1000 + high);
    }
    expectEndRecord(120);
    for (int r = 121; r < 512; ++r) ASSERT_TRUE(isZero(&MiniToneGenerator::sToneDescriptors[r], sizeof(Desc))) << r;
    const Desc* t = MiniToneGenerator::sToneDescriptors;
    EXPECT_EQ(t[7].segments[0].waveFreq[0], 7310u);
    EXPECT_EQ(t[7].freq_code, 85100);
    EXPECT_EQ(t[8].segments[0].waveFreq[1], 9460u);
    EXPECT_EQ(t[8].freq_code, 15110);
    EXPECT_EQ(t[119].segments[0].waveFreq[1], 20640u);
    EXPECT_EQ(t[119].freq_code, 85240);

    const std::vector<std::string> lines = planLines();
    ASSERT_EQ(lines.size(), 1u + 120u * 5u + 1u);
    EXPECT_EQ(lines[0], "[MiniToneGenerator] sample_interval_HZ :86.000000 , SAMPLE_RATE : 44100");
    EXPECT_EQ(lines[1], "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 1290, 8600, 0 }, 0, 0 }},");
    EXPECT_EQ(lines[2], "code: 0,");
    EXPECT_EQ(lines[3], "freq_code: 15100 },");
    EXPECT_EQ(lines[4], "[MiniToneGenerator] 15(1290Hz):100(8600)Hz");
    EXPECT_EQ(lines[5], "[MiniToneGenerator] index = 0");
    EXPECT_EQ(lines[596], "{ segments: { { duration: MiniToneGenerator::TONEGEN_INF, waveFreq: { 7310, 20640, 0 }, 0, 0 }},");
    EXPECT_EQ(lines[599], "[MiniToneGenerator] 85(7310Hz):240(20640)Hz");
    EXPECT_EQ(lines[600], "[MiniToneGenerator] index = 119");
    EXPECT_EQ(lines[601], "END MAKING Tone Generate Table");

    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(15, 100), 0);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(85, 100), 7);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(15, 110), 8);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(85, 240), 119);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(100, 15), 999);
    EXPECT_EQ(MiniToneGenerator::getFreqTableSize(), 512);

    // A later construction lays the single plan over records 0..40; 41..120 keep
    // the two-frequency content behind the new end record.
    std::vector<Desc> before(t, t + 121);
    MiniToneGenerator::generateToneTable_ZORV();
    for (int c = 0; c < 40; ++c) expectRecord(c, 2580u + 860u * c, 0u, (3 + c) * 10000);
    expectEndRecord(40, false);
    EXPECT_EQ(std::memcmp(t[40].segments, before[40].segments, sizeof(t[40].segments)), 0);
    for (int r = 41; r <= 120; ++r) ASSERT_EQ(std::memcmp(&t[r], &before[r], sizeof(Desc)), 0) << r;
    EXPECT_EQ(t[41].segments[0].waveFreq[1], 8600u + 860u * 5);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(15, 100), 999);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(25, 150), 999);  // record 41, hidden behind the end
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(41), 25150);
    EXPECT_EQ(MiniToneGenerator::getFreqTableSize(), 512);
}

TEST_F(CodePlan, LookUps) {
    MiniToneGenerator::generateToneTable_ZORV();
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(30, 0), 0);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(420, 0), 39);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(250, 0), 22);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(35, 0), 999);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(30, 1), 999);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(0, 0), 999);
    // The key is first * 1000 + second: (29, 1000) names the same tone as (30, 0).
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(29, 1000), 0);
    for (int c = 0; c < 40; ++c) EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(30 + 10 * c, 0), c);

    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(0), 30000);
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(39), 420000);
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(40), 99999);
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(41), 0);
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(511), 0);
    // Decided: an index outside the table answers 0 instead of reading beyond it.
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(-1), 0);
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(512), 0);
    test::clearLog();
    MiniToneGenerator::getCodeFromTwoFreq(30, 0);
    MiniToneGenerator::getFreqCodeFromIndex(3);
    EXPECT_TRUE(test::logLines().empty());
}

TEST_F(CodePlan, ScanStopsAtFirstCodeOf999OrMore) {
    // A hand-made table: key 5000 sits behind a record whose code is above 999.
    Desc* t = MiniToneGenerator::sToneDescriptors;
    t[0].code = 0;
    t[0].freq_code = 1000;
    t[1].code = 1000;
    t[1].freq_code = 2000;
    t[2].code = 2;
    t[2].freq_code = 5000;
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(1, 0), 0);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(2, 0), 1000);  // the stop comes before the key test
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(5, 0), 1000);
    t[1].code = 0x80000000u;  // compared as unsigned: still a stop
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(5, 0), static_cast<int>(0x80000000u));
    // The first matching record wins.
    t[1].code = 1;
    t[1].freq_code = 1000;
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(1, 0), 0);
}

TEST_F(CodePlan, LookUpBeforeAnyPlanStopsAtLastRecord) {
    // No end record anywhere: the scans cover the 512 records and no more.
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(30, 0), 999);
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(420, 0), 999);
    int a = 31, b = 1;
    MiniToneGenerator::fixFreq(&a, &b);
    EXPECT_EQ(a, 31);
    EXPECT_EQ(b, 1);
    EXPECT_TRUE(test::logLines().empty());
    EXPECT_EQ(MiniToneGenerator::getFreqCodeFromIndex(0), 0);
    // A key stored in the very last record is still found.
    MiniToneGenerator::sToneDescriptors[511].code = 511;
    MiniToneGenerator::sToneDescriptors[511].freq_code = 77000;
    EXPECT_EQ(MiniToneGenerator::getCodeFromTwoFreq(77, 0), 511);
    zeroTable();
}

TEST_F(CodePlan, FixFreq) {
    MiniToneGenerator::generateToneTable_ZORV();
    test::clearLog();
    struct Case {
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
    for (const Case& c : cases) {
        SCOPED_TRACE(std::to_string(c.a) + "/" + std::to_string(c.b));
        test::clearLog();
        int a = c.a, b = c.b;
        MiniToneGenerator::fixFreq(&a, &b);
        EXPECT_EQ(a, c.wantA);
        EXPECT_EQ(b, c.wantB);
        const auto lines = test::logLines();
        if (c.line == nullptr) {
            EXPECT_TRUE(lines.empty());
        } else {
            ASSERT_EQ(lines.size(), 1u);
            EXPECT_EQ(lines[0].msg, c.line);
            EXPECT_EQ(lines[0].tag, "MiniToneGenerator");
            EXPECT_EQ(lines[0].prio, 3);
        }
    }
}

TEST_F(CodePlan, FixFreqTriesTheNeighbourhoodInOrder) {
    // A hand-made plan where several neighbours of (10, 10) are tones.
    Desc* t = MiniToneGenerator::sToneDescriptors;
    const int keys[] = {10010, 9011, 11009, 10009};  // (10,10), (9,11), (11,9), (10,9)
    for (int i = 0; i < 4; ++i) {
        t[i].code = static_cast<unsigned>(i);
        t[i].freq_code = keys[i];
    }
    t[4].code = 999;
    t[4].freq_code = 99999;
    int a = 10, b = 10;
    MiniToneGenerator::fixFreq(&a, &b);  // (9,11) is the third candidate, the pair itself the fifth
    EXPECT_EQ(a, 9);
    EXPECT_EQ(b, 11);
    t[1].freq_code = 1;
    a = 10, b = 10;
    MiniToneGenerator::fixFreq(&a, &b);  // (10,9) is fourth: before the pair itself
    EXPECT_EQ(a, 10);
    EXPECT_EQ(b, 9);
    t[3].freq_code = 1;
    a = 10, b = 10;
    MiniToneGenerator::fixFreq(&a, &b);  // now the pair itself, before (11,9)
    EXPECT_EQ(a, 10);
    EXPECT_EQ(b, 10);
    t[0].freq_code = 1;
    a = 10, b = 10;
    MiniToneGenerator::fixFreq(&a, &b);  // seventh
    EXPECT_EQ(a, 11);
    EXPECT_EQ(b, 9);
    zeroTable();
}

TEST_F(CodePlan, MeterForwardsWithOrWithoutToneGenerator) {
    MiniToneGenerator::generateToneTable_ZORV();
    SoundMeter meter;
    ASSERT_EQ(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.getCodeFromTwoFreq(250, 0), 22);
    EXPECT_EQ(meter.getCodeFromTwoFreq(35, 0), 999);
    EXPECT_EQ(meter.getFreqCodeFromIndex(40), 99999);
    int a = 31, b = 1;
    meter.fixFreq(&a, &b);
    EXPECT_EQ(a, 30);
    EXPECT_EQ(b, 0);

    // With a generator, whose construction lays the plan down again.
    zeroTable();
    meter.makeToneGenerator(AUDIO_STREAM_MUSIC);
    ASSERT_NE(meter.toneGenerator, nullptr);
    EXPECT_EQ(meter.toneGenerator->getMaxToneIndex(), 39);
    EXPECT_EQ(meter.getCodeFromTwoFreq(420, 0), 39);
    EXPECT_EQ(meter.getFreqCodeFromIndex(39), 420000);
    a = 419, b = 1;
    meter.fixFreq(&a, &b);
    EXPECT_EQ(a, 420);
    EXPECT_EQ(b, 0);
    meter.releaseToneGenerator();
}

TEST_F(CodePlan, ToneGeneratorConstructionKeepsAFilledPlan) {
    MiniToneGenerator::generateToneTable_ZORV();
    std::vector<Desc> before(MiniToneGenerator::sToneDescriptors, MiniToneGenerator::sToneDescriptors + 512);
    {
        MiniToneGenerator gen(AUDIO_STREAM_MUSIC, 1.0f, false);
        EXPECT_EQ(gen.getMaxToneIndex(), 39);
    }
    EXPECT_EQ(std::memcmp(before.data(), MiniToneGenerator::sToneDescriptors, sizeof(Desc) * 512), 0);
}

}  // namespace
