#include "support/ToneTestSupport.h"

#include <iterator>
#include <thread>

namespace korvo {
namespace tonetest {

namespace {

std::vector<test::LogLine> toneLines() {
    std::vector<test::LogLine> lines = test::logLines(), out;
    std::copy_if(lines.begin(), lines.end(), std::back_inserter(out),
                 [](const test::LogLine& l) { return l.tag == "MiniToneGenerator"; });
    return out;
}

bool matches(const std::string& line, const std::string& want) {
    if (want.empty() || want.back() != '*') return line == want;
    return line.compare(0, want.size() - 1, want, 0, want.size() - 1) == 0;
}

::testing::AssertionResult failure(const std::string& what, const Lines& lines) {
    ::testing::AssertionResult r = ::testing::AssertionFailure() << what << ", the log:";
    for (const std::string& l : lines) r << "\n  " << l;
    return r;
}

::testing::AssertionResult stateIs(const Engine& gen, uint16_t state) {
    if (stateOf(gen) == state) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "state " << stateOf(gen) << ", wanted " << state;
}

}  // namespace

bool waitUntil(const std::function<bool()>& pred, int timeoutMs) {
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    while (!pred()) {
        if (std::chrono::steady_clock::now() >= deadline) return pred();
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

Lines toneMessages() {
    Lines out;
    for (const test::LogLine& l : toneLines()) out.push_back(l.msg);
    return out;
}

int toneCount(const std::string& msg) {
    Lines all = toneMessages();
    return static_cast<int>(std::count(all.begin(), all.end(), msg));
}

bool hasToneLine(int prio, const std::string& wanted) {
    std::vector<test::LogLine> lines = toneLines();
    return std::any_of(lines.begin(), lines.end(),
                       [&](const test::LogLine& l) { return l.prio == prio && matches(l.msg, wanted); });
}

::testing::AssertionResult lastToneLine(int prio, const std::string& wanted) {
    std::vector<test::LogLine> lines = toneLines();
    if (!lines.empty() && lines.back().prio == prio && matches(lines.back().msg, wanted)) {
        return ::testing::AssertionSuccess();
    }
    return failure("\"" + wanted + "\" at " + std::to_string(prio) + " is not last", toneMessages());
}

::testing::AssertionResult inOrder(const Lines& lines, const Lines& wanted) {
    size_t w = 0;
    for (size_t i = 0; i < lines.size() && w < wanted.size(); ++i) w += matches(lines[i], wanted[w]) ? 1 : 0;
    return w == wanted.size() ? ::testing::AssertionSuccess() : failure("\"" + wanted[w] + "\" missing", lines);
}

::testing::AssertionResult linesAre(const Lines& lines, const Lines& wanted) {
    if (lines.size() == wanted.size()) return inOrder(lines, wanted);
    return failure(std::to_string(wanted.size()) + " lines wanted", lines);
}

bool startAndPump(Engine& gen, int code, int ms, test::PumpResult* first, size_t samples) {
    int waits = toneCount("Wait for start callback");
    auto started = async([&gen, code, ms] { return gen.startTone(code, ms); });
    EXPECT_TRUE(waitForToneMessage("Wait for start callback", waits + 1));
    test::PumpResult p = test::pumpTrack(samples);
    EXPECT_TRUE(p.called);
    if (first) *first = p;
    EXPECT_TRUE(ready(started)) << "startTone did not return";
    return ready(started) && started.get();
}

std::future<void> stopAsync(Engine& gen) {
    int waits = toneCount("waiting cond");
    auto stopped = async([&gen] { gen.stopTone(); });
    EXPECT_TRUE(waitForToneMessage("waiting cond", waits + 1));
    return stopped;
}

void drain(Engine& gen, int maxPumps) {
    for (int i = 0; i < maxPumps && stateOf(gen) != Engine::TONE_INIT; ++i) test::pumpTrack();
    EXPECT_EQ(stateOf(gen), Engine::TONE_INIT);
}

::testing::AssertionResult pumped(Engine& gen, uint16_t state) {
    test::pumpTrack();
    return stateIs(gen, state);
}

::testing::AssertionResult pumped(Engine& gen, uint16_t state, const Samples& want, const Lines& log,
                                  size_t bytes) {
    test::clearLog();
    test::PumpResult p = test::pumpTrack();
    if (!p.called) return ::testing::AssertionFailure() << "no callback";
    if (p.samples != want) {
        return ::testing::AssertionFailure() << "samples " << ::testing::PrintToString(p.samples) << ", wanted "
                                             << ::testing::PrintToString(want);
    }
    if (p.sizeBytes != bytes) {
        return ::testing::AssertionFailure() << "size " << p.sizeBytes << ", wanted " << bytes;
    }
    ::testing::AssertionResult lines = linesAre(toneMessages(), log);
    return lines ? stateIs(gen, state) : lines;
}

}  // namespace tonetest
}  // namespace korvo
