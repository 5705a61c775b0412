// The vote over seven frames: the published rows, the tally's log lines, and a
// randomised comparison with a plain "count, then earliest of the most frequent".
#include <limits>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "meter/SoundMeter.h"
#include "support/DspTestSupport.h"

namespace test = korvo::platform::test;
using korvo::dsptest::Strings;

namespace {

class FrameVoting : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        meter.reset(new SoundMeter());
        test::clearLog();  // the meter's construction lines
    }

    // Votes over `row` placed as row 1 of a matrix whose row 0 is noise.
    int vote(const std::vector<int>& row) {
        int frames[14];
        for (int i = 0; i < 7; ++i) {
            frames[i] = 1000 + i;
            frames[7 + i] = row[i];
        }
        return meter->getFrequentIndex(frames, 1);
    }

    Strings lines(bool countsOnly = false) {
        Strings out;
        for (const std::string& l : korvo::dsptest::logMessages(3, "TQX"))
            if (!countsOnly || l.find("Count added") != std::string::npos) out.push_back(l);
        return out;
    }

    std::unique_ptr<SoundMeter> meter;
};

TEST_F(FrameVoting, PublishedRows) {
    const struct {
        std::vector<int> row;
        int want;
    } rows[] = {
        {{30, 30, 40, 40, 50, 50, 50}, 50}, {{0, 0, 0, 0, 0, 0, 0}, 0}, {{5, 0, 5, 0, 0, 9, 9}, 0},
        {{7, 7, 3, 3, 3, 7, 9}, 7}, {{1, 2, 2, 1, 255, 255, 255}, 255},
        {{30, 40, 40, 30, 70, 80, 90}, 30},  // 2 : 2, 30 appeared first
        {{11, 22, 33, 44, 55, 66, 77}, 11},  // all counts 1
        {{40, 30, 30, 40, 30, 40, 0}, 40},   // 3 : 3, 40 first
        {{0, 30, 30, 0, 30, 0, 0}, 0},       // 0 counts like any value
        // Decided: negative values are packed like any other; the result has no
        // meaning but is defined (here every -1 lands in a slot of its own).
        {{-1, -1, -1, -1, -1, -1, -1}, 0},
    };
    for (const auto& r : rows) EXPECT_EQ(vote(r.row), r.want) << ::testing::PrintToString(r.row);
    const int big = std::numeric_limits<int>::max(), small = std::numeric_limits<int>::min();
    vote({big, small, big, small, 0, -1, big});  // must not trip the overflow checks
}

TEST_F(FrameVoting, LogLinesOfOneVote) {
    EXPECT_EQ(vote({5, 0, 5, 0, 0, 9, 9}), 0);
    const Strings want = {
        "[SoundMeter] DETECTING FREQ IN FRAME [1]",
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[0]=5",
        "[5] Count added to tp[0]=5001",
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[1]=0",
        "[0] Count added to tp[1]=1",  // 0 meets an empty slot through the match branch
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[2]=5",
        "[5] Count added to tp[0]=5002",
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[3]=0",
        "[0] Count added to tp[1]=2",
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[4]=0",
        "[0] Count added to tp[1]=3",
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[5]=9",  // new slot: no count line
        "[SoundMeter] DETECTING FREQ IN FRAME two peaks[6]=9",
        "[9] Count added to tp[2]=9002",
        "[SoundMeter] TP Debug",
    };
    EXPECT_EQ(lines(), want);

    test::clearLog();
    vote({0, 0, 0, 0, 0, 0, 0});
    Strings counts;
    for (int i = 1; i <= 7; ++i) counts.push_back("[0] Count added to tp[0]=" + std::to_string(i));
    EXPECT_EQ(lines(true), counts);
    test::clearLog();
    vote({11, 22, 33, 44, 55, 66, 77});
    EXPECT_EQ(lines(true), Strings{"[11] Count added to tp[0]=11001"});
}

TEST_F(FrameVoting, TwoPeakFrameVotesEachRow) {
    int frames[14] = {30, 30, 30, 30, 30, 30, 30, 120, 120, 120, 120, 120, 120, 120};
    int first = -1, second = -1;
    meter->detectTwoPeakFrame(frames, &first, &second);
    EXPECT_EQ(first, 30);
    EXPECT_EQ(second, 120);
    const Strings l = lines();
    ASSERT_EQ(l.size(), 2u * (1 + 7 * 2 + 1));
    EXPECT_EQ(l[0], "[SoundMeter] DETECTING FREQ IN FRAME [0]");
    EXPECT_EQ(l[14], "[30] Count added to tp[0]=30007");
    EXPECT_EQ(l[15], "[SoundMeter] TP Debug");
    EXPECT_EQ(l[16], "[SoundMeter] DETECTING FREQ IN FRAME [1]");
    EXPECT_EQ(l[30], "[120] Count added to tp[0]=120007");

    // No sorting: a larger first row stays first.
    int swapped[14] = {200, 200, 200, 200, 200, 200, 200, 10, 10, 10, 10, 10, 10, 10};
    meter->detectTwoPeakFrame(swapped, &first, &second);
    EXPECT_EQ(first, 200);
    EXPECT_EQ(second, 10);
}

TEST_F(FrameVoting, RandomRowsAgainstPlainCount) {
    test::captureLog(false);
    std::mt19937 rng(7331u);
    for (int n = 0; n < 3000; ++n) {
        // Narrow ranges give ties and repeats; wide ones give all-different rows.
        std::uniform_int_distribution<int> pick(0, (n % 3 == 0) ? 3 : (n % 3 == 1) ? 10 : 255);
        std::vector<int> row(7);
        for (int& v : row) v = pick(rng);
        std::map<int, int> count;
        for (int v : row) ++count[v];
        int want = row[0];
        for (int v : row)  // scanning in frame order keeps the earliest among the most frequent
            if (count[v] > count[want]) want = v;
        ASSERT_EQ(vote(row), want) << "row " << n;
    }
}

}  // namespace
