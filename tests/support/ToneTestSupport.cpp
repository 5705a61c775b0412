#include "support/ToneTestSupport.h"

namespace korvo {
namespace tonetest {

Strings toneLog() {
    Strings out;
    for (const auto& l : test::logLines())
        if (l.tag == "MiniToneGenerator") out.push_back(l.msg);
    return out;
}

::testing::AssertionResult inOrder(const Strings& lines, const Strings& wanted) {
    auto matches = [](const std::string& line, const std::string& want) {
        return !want.empty() && want.back() == '*' ? line.compare(0, want.size() - 1, want, 0, want.size() - 1) == 0
                                                   : line == want;
    };
    size_t w = 0;
    for (size_t i = 0; i < lines.size() && w < wanted.size(); ++i) w += matches(lines[i], wanted[w]) ? 1 : 0;
    if (w == wanted.size()) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "\"" << wanted[w] << "\" missing from " << ::testing::PrintToString(lines);
}

bool startAndPump(Engine& gen, int code, int ms, test::PumpResult* first, size_t samples) {
    const long waits = toneCount("Wait for start callback");
    auto started = std::async(std::launch::async, [&gen, code, ms] { return gen.startTone(code, ms); });
    EXPECT_TRUE(waitFor([&] { return toneCount("Wait for start callback") > waits; }));
    test::PumpResult p = test::pumpTrack(samples);
    EXPECT_TRUE(p.called);
    if (first) *first = p;
    return ready(started) && started.get();
}

std::future<void> stopAsync(Engine& gen) {
    const long waits = toneCount("waiting cond");
    auto stopped = std::async(std::launch::async, [&gen] { gen.stopTone(); });
    EXPECT_TRUE(waitFor([&] { return toneCount("waiting cond") > waits; }));
    return stopped;
}

void drain(Engine& gen) {
    for (int i = 0; i < 200 && stateOf(gen) != Engine::TONE_INIT; ++i) test::pumpTrack();
    EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
}

::testing::AssertionResult pumped(Engine& gen, uint16_t state, const Samples& want, const Strings& log, size_t bytes) {
    test::clearLog();
    const test::PumpResult p = test::pumpTrack();
    if (!p.called) return ::testing::AssertionFailure() << "no callback";
    if (p.samples != want) return ::testing::AssertionFailure() << "samples differ";
    if (p.sizeBytes != bytes) return ::testing::AssertionFailure() << "size " << p.sizeBytes;
    const Strings got = toneLog();
    if (got.size() != log.size() || !inOrder(got, log))
        return ::testing::AssertionFailure() << "log " << ::testing::PrintToString(got);
    if (stateOf(gen) != state) return ::testing::AssertionFailure() << "state " << stateOf(gen);
    return ::testing::AssertionSuccess();
}

}  // namespace tonetest
}  // namespace korvo
