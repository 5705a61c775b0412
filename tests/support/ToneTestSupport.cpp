#include "support/ToneTestSupport.h"

#include <cstring>
#include <thread>

namespace korvo {
namespace tonetest {

namespace test = korvo::platform::test;

bool waitUntil(const std::function<bool()>& pred, int timeoutMs) {
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    while (!pred()) {
        if (std::chrono::steady_clock::now() >= deadline) return pred();
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

std::vector<std::string> messagesOf(const std::string& tag) {
    std::vector<std::string> out;
    for (const test::LogLine& line : test::logLines()) {
        if (line.tag == tag) out.push_back(line.msg);
    }
    return out;
}

std::vector<std::string> toneMessages() { return messagesOf("MiniToneGenerator"); }

int countMessage(const std::string& tag, const std::string& msg) {
    int n = 0;
    for (const std::string& m : messagesOf(tag)) n += m == msg ? 1 : 0;
    return n;
}

bool hasLine(const std::string& tag, int prio, const std::string& msg) {
    for (const test::LogLine& line : test::logLines()) {
        if (line.tag == tag && line.prio == prio && line.msg == msg) return true;
    }
    return false;
}

bool waitForToneMessage(const std::string& msg, int count, int timeoutMs) {
    return waitUntil([&] { return countMessage("MiniToneGenerator", msg) >= count; }, timeoutMs);
}

bool inOrder(const std::vector<std::string>& lines, const std::vector<std::string>& wanted) {
    size_t w = 0;
    for (size_t i = 0; i < lines.size() && w < wanted.size(); ++i) {
        const std::string& want = wanted[w];
        bool match;
        if (!want.empty() && want.back() == '*') {
            match = lines[i].compare(0, want.size() - 1, want, 0, want.size() - 1) == 0;
        } else {
            match = lines[i] == want;
        }
        if (match) ++w;
    }
    return w == wanted.size();
}

ScopedDescriptor::ScopedDescriptor(int code,
                                   std::initializer_list<MiniToneGenerator::ToneSegment> segments)
    : mCode(code), mSaved(MiniToneGenerator::sToneDescriptors[code]) {
    MiniToneGenerator::ToneDescriptor& d = MiniToneGenerator::sToneDescriptors[code];
    std::memset(&d, 0, sizeof d);
    size_t i = 0;
    for (const MiniToneGenerator::ToneSegment& s : segments) d.segments[i++] = s;
    d.code = static_cast<unsigned>(code);
}

ScopedDescriptor::~ScopedDescriptor() { MiniToneGenerator::sToneDescriptors[mCode] = mSaved; }

RefWave::RefWave(unsigned rate, unsigned freq, float gain)
    : mGen(static_cast<unsigned short>(rate), static_cast<unsigned short>(freq), gain) {}

std::vector<int16_t> RefWave::block(unsigned count, unsigned command) {
    std::vector<int16_t> out(count, 0);
    mGen.getSamples(out.data(), count, command);
    return out;
}

void RefWave::addInto(std::vector<int16_t>& out, unsigned command) {
    mGen.getSamples(out.data(), static_cast<unsigned>(out.size()), command);
}

}  // namespace tonetest
}  // namespace korvo
