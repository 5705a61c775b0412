// The shared frame record, the event word and the level function.
#include <cmath>
#include <cstring>
#include <vector>

#include <log/log.h>

#include "capture/FrameExchange.h"
#include "support/MeterTestSupport.h"

using korvo::testing::logOf;
using korvo::testing::PlatformTest;

class FrameExchangeTest : public PlatformTest {
protected:
    void SetUp() override {
        PlatformTest::SetUp();
        korvo::resetSharedRecordForTests();
    }
};

TEST_F(FrameExchangeTest, FirstUseInitialisesOnceAndReadsZeros) {
    Mmic_data_t record;
    memset(&record, 0x5A, sizeof record);
    int unused = 0;
    EXPECT_EQ(read_write_audio(&unused, 0, &record), 1);
    EXPECT_EQ(record.index, 0);
    EXPECT_EQ(record.level, 0.0f);
    EXPECT_EQ(record.count, 0);
    EXPECT_EQ(record.reserved, 0);
    for (int16_t s : record.data) ASSERT_EQ(s, 0);
    read_write_audio(&unused, 0, &record);
    EXPECT_EQ(logOf("TQX"), std::vector<std::string>{"D/[SoundMeter] Initialize MDATA"});
}

TEST_F(FrameExchangeTest, OnlyDirectionOneWrites) {
    Mmic_data_t written;
    memset(&written, 0, sizeof written);
    written.index = 3;
    written.level = -12.5f;
    written.count = 212;
    written.reserved = 77;
    for (int i = 0; i < 2560; ++i) written.data[i] = static_cast<int16_t>(i - 1280);
    int unused = 0;
    read_write_audio(&unused, 1, &written);
    for (int direction : {0, 2, -1}) {
        Mmic_data_t read;
        memset(&read, 0, sizeof read);
        read_write_audio(&unused, direction, &read);
        EXPECT_EQ(memcmp(&read, &written, sizeof read), 0) << "direction " << direction;
    }
    // A read leaves the shared record as it was.
    Mmic_data_t other;
    memset(&other, 0, sizeof other);
    read_write_audio(&unused, 2, &other);
    Mmic_data_t again;
    read_write_audio(&unused, 0, &again);
    EXPECT_EQ(again.count, 212);
}

TEST_F(FrameExchangeTest, EventWordStartsAtZeroAndKeepsWhatIsWritten) {
    int value = 99;
    EXPECT_EQ(read_write_audio_int(0, &value), 1);
    EXPECT_EQ(value, 0);
    int stored = -4242;
    read_write_audio_int(1, &stored);
    value = 0;
    read_write_audio_int(5, &value);
    EXPECT_EQ(value, -4242);
    EXPECT_TRUE(logOf("TQX").empty());
}

TEST_F(FrameExchangeTest, ReadDoneLevels) {
    std::vector<short> constant(512, 1234);
    EXPECT_TRUE(std::isinf(readDone(constant.data(), 512)));
    EXPECT_LT(readDone(constant.data(), 512), 0.0);

    std::vector<short> square(512);
    for (int i = 0; i < 512; ++i) square[i] = i % 2 ? 32767 : -32767;
    EXPECT_NEAR(readDone(square.data(), 512), 0.6, 0.001);

    // A sine of amplitude A has variance A²/2: level = 20·log10(A/32768) − 3.01 + 0.6.
    std::vector<short> wave(512);
    for (int i = 0; i < 512; ++i) wave[i] = static_cast<short>(std::lround(8192 * std::sin(2 * M_PI * 8 * i / 512.0)));
    EXPECT_NEAR(readDone(wave.data(), 512), 20 * std::log10(0.25) - 3.0103 + 0.6, 0.01);

    EXPECT_FALSE(std::isfinite(readDone(square.data(), 0)));
}

TEST(FrameExchangeLayout, RecordIsPackedWithoutGaps) {
    EXPECT_EQ(sizeof(Mmic_data_t), 4u + 4u + 5120u + 4u + 4u);
}
