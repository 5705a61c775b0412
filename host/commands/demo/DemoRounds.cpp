#include "host/commands/demo/DemoRounds.h"

#include <algorithm>
#include <cstdarg>
#include <cstdio>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/output/JsonEvent.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

const char* const kWhoName[2] = {"listener", "speaker"};

void DemoRounds::add(Who who, const ProtocolLine& p) {
    const long long t = p.get("t", monotonicMs());
    const int code = static_cast<int>(p.get("code"));
    const int round = static_cast<int>(p.get("round"));
    Round& r = mRound[round];
    if (p.event == "said") {
        (who == kSpeaker ? r.said : r.answered) = code;
        (who == kSpeaker ? r.saidAt : r.answeredAt) = t;
        if (who == kSpeaker && r.firstSaidAt < 0) r.firstSaidAt = t;
        const long long attempt = p.get("attempt", 1);
        event(JsonEvent("said").add("device", kWhoName[who]).add("round", round).add("code", code).add("attempt", attempt),
              t, who, "says  code %2d (%5d Hz)%s", code, codeHz(code), attempt > 1 ? " again" : "");
    } else if (p.event == "heard") {
        const long long toneAt = who == kListener ? r.saidAt : r.answeredAt;
        const long long oneWay = toneAt >= 0 ? t - toneAt : p.get("waited");
        if (toneAt < 0) ++mForeign;  // its peer has not said it in this round
        (who == kListener ? r.heard : r.answerHeard) = code;
        event(JsonEvent("heard").add("device", kWhoName[who]).add("round", round).add("code", code).add("one_way_ms", oneWay),
              t, who, "hears code %2d (%5d Hz), one way %lld ms", code, codeHz(code), oneWay);
        exchangeDone(round, t);
    } else if (p.event == "missed") {
        show(t, who, "missed code " + std::to_string(code) + " (" + std::to_string(codeHz(code)) + " Hz)");
    } else if (p.event == "timeout") {
        show(t, who, "did not hear code " + std::to_string(code) + " (" + std::to_string(codeHz(code)) + " Hz) within " +
                         std::to_string(p.get("waited")) + " ms");
    } else if (p.event == "done") {
        show(t, who, "finished, " + std::to_string(p.get("completed")) + " of " + plural(p.get("rounds"), "round"));
    }
}

// An exchange counts once both devices did their part of the same round with the same codes.
void DemoRounds::exchangeDone(int round, long long t) {
    const Round& r = mRound[round];
    const bool heard = r.said >= 0 && r.heard == r.said;
    const bool complete = mNoAck ? heard : heard && r.answered == r.said + 1 && r.answerHeard == r.answered;
    if (!complete || mCounted.count(round)) return;
    mCounted.insert({round, true});
    const long long roundTrip = t - r.firstSaidAt;
    mLatencies.push_back(roundTrip);
    JsonEvent e("exchange");
    e.add("round", round).add("code", r.said).add("round_trip_ms", roundTrip);
    if (!mNoAck) e.add("answer", r.answered);
    event(e, t, kSpeaker, mNoAck ? "exchange %d complete, code said to code heard in %lld ms"
                                 : "exchange %d complete, round trip %lld ms (code first said to its answer heard)",
          round, roundTrip);
}

void DemoRounds::event(const JsonEvent& e, long long t, Who who, const char* fmt, ...) const {
    char text[200];
    va_list ap;
    va_start(ap, fmt);
    vsnprintf(text, sizeof text, fmt, ap);
    va_end(ap);
    progressf(e, "%8.3f s  %-8s  %s\n", (t - mStart) / 1000.0, kWhoName[who], text);
}

void DemoRounds::show(long long t, Who who, const std::string& text) const {
    infof("%8.3f s  %-8s  %s\n", (t - mStart) / 1000.0, kWhoName[who], text.c_str());
}

void DemoRounds::summarize() const {
    const int done = completed();
    JsonEvent summary("summary");
    summary.add("rounds", mRounds).add("completed", done);
    std::string shared;
    if (mShared) {
        summary.add("foreign", mForeign);
        shared = "; " + plural(mForeign, "code") + " heard before this pair said " + (mForeign == 1 ? "it" : "them");
    }
    if (done == 0) {
        resultf(summary, "0 of %s completed%s\n", plural(mRounds, "exchange").c_str(), shared.c_str());
        return;
    }
    std::vector<long long> sorted = mLatencies;
    std::sort(sorted.begin(), sorted.end());
    const size_t mid = sorted.size() / 2;
    const double median = sorted.size() % 2 ? double(sorted[mid]) : (sorted[mid - 1] + sorted[mid]) / 2.0;
    summary.add("median_ms", median).add("worst_ms", sorted.back());
    resultf(summary, "%d of %s completed, %s median %.0f ms, worst %lld ms%s\n", done, plural(mRounds, "exchange").c_str(),
            mNoAck ? "one way" : "round trip", median, sorted.back(), shared.c_str());
}

}  // namespace host
}  // namespace korvo
