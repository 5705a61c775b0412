// The demo's report of rounds: the devices' protocol lines turned into steps shown as
// they happen, exchanges counted once both devices did their part with the right codes,
// and the summary.
#pragma once
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "host/core/Protocol.h"

namespace korvo {
namespace host {

class JsonEvent;

enum Who { kListener = 0, kSpeaker = 1 };
extern const char* const kWhoName[2];

class DemoRounds {
public:
    DemoRounds(int rounds, bool noAck) : mRounds(rounds), mNoAck(noAck) {}
    // In a room shared with other pairs: the summary also counts the codes a device heard
    // before its peer said them in that round (another pair's, taken for its own).
    void shareRoom() { mShared = true; }

    // Times are shown from `startMs` on.
    void start(int64_t startMs) { mStart = startMs; }
    // A device's protocol line ("said", "heard", "missed", "timeout", "done"), shown.
    void add(Who who, const ProtocolLine& line);
    // A step of the demo itself at `t`.
    void show(long long t, Who who, const std::string& text) const;
    int completed() const { return static_cast<int>(mLatencies.size()); }
    // The summary line: exchanges completed, median and worst time.
    void summarize() const;
    int foreign() const { return mForeign; }

private:
    // What happened in one round, from both devices' lines.
    struct Round {
        int said = -1, heard = -1, answered = -1, answerHeard = -1;  // codes
        long long saidAt = -1, answeredAt = -1;                      // the latest attempts
        long long firstSaidAt = -1;
    };

    void exchangeDone(int round, long long t);
    void event(const JsonEvent& e, long long t, Who who, const char* fmt, ...) const __attribute__((format(printf, 5, 6)));

    int mRounds;
    bool mNoAck;
    bool mShared = false;
    int mForeign = 0;
    int64_t mStart = 0;
    std::map<int, Round> mRound;
    std::map<int, bool> mCounted;
    std::vector<long long> mLatencies;  // per completed exchange, from the speaker's code
};

}  // namespace host
}  // namespace korvo
