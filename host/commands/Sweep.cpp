// soundmeter sweep: a speaker saying codes in turn for a given time.
//
// By default the host walks the codes every listener hears as themselves (0..17),
// with SayFreqIdx; with acknowledgement it says k, listens for the answer k + 1 and
// goes on with k + 2, as the plug-in's own sweep does. --all-codes runs the plug-in's
// sweep (SayAllFreqIndex) through the whole plan of 40 codes instead: the plug-in
// chooses its codes and tells them only through the lines it prints on standard output
// ("... TONE PLAYING[code:key] ..."), which the host reads from the pipe it keeps there.
// Codes 18 and up are then said too, and the host says for each what listeners make of it.
#include <condition_variable>
#include <cstdio>
#include <deque>
#include <mutex>

#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/core/LiveHearing.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

struct SweepOptions {
    int ms = 200;
    double seconds = 5.0;
    bool noAck = false;
    bool allCodes = false;
    DecoderKind decoder = DecoderKind::Host;
};

// Codes the host's own walk says: those every listener hears as themselves.
constexpr int kWalkCodes = kBuiltinCodes;
// Between two SayAllFreqIndex calls; the plug-in's own pause decides when a call says.
constexpr int64_t kCallPeriodMs = 50;
// Between the end of a tone and the next, as the plug-in's sweep pauses.
constexpr int64_t kPauseMs = 350;
// How long, after its tone, an answer may take before the sweep moves on.
constexpr int64_t kAnswerWaitMs = 1500;

// Codes the plug-in's sweep reported having said, handed from the pipe's reader thread.
class SaidCodes {
public:
    LibraryStdout::LineHandler handler(bool verbose) {
        auto forward = libraryLinesToStderr(verbose);
        return [this, forward](const std::string& line) {
            forward(line);
            size_t at = line.find("TONE PLAYING[");
            int code = -1;
            int key = 0;
            if (at != std::string::npos && sscanf(line.c_str() + at, "TONE PLAYING[%d:%d]", &code, &key) == 2) {
                std::lock_guard<std::mutex> lock(mMutex);
                mCodes.push_back(code);
            }
        };
    }
    // The next code reported, or -1 when none is waiting.
    int take() {
        std::lock_guard<std::mutex> lock(mMutex);
        if (mCodes.empty()) return -1;
        int code = mCodes.front();
        mCodes.pop_front();
        return code;
    }

private:
    std::mutex mMutex;
    std::deque<int> mCodes;
};

class Sweep {
public:
    Sweep(Session& session, LiveHearing& hearing, const SweepOptions& o)
        : mSession(session), mDevice(session.device()), mHearing(hearing), mOpt(o),
          mOutputRate(static_cast<int>(korvo::platform::outputRateOf(korvo::platform::speakerRoute()))) {}

    Outcome walk(int64_t end) {
        Outcome outcome = Outcome::Done;
        int code = 0;
        for (int64_t next = monotonicMs(); monotonicMs() < end;) {
            if ((outcome = mDevice.stepUntil(std::min(next, end))) != Outcome::Done || monotonicMs() >= end) break;
            mDevice.sayCode(code, mOpt.ms);
            said(code);
            next = mSaidAt + mOpt.ms + kPauseMs;
            if (!mOpt.noAck && (outcome = awaitAnswer(korvo::acknowledgementOf(code), end)) != Outcome::Done) break;
            code = (code + (mOpt.noAck ? 1 : 2)) % (mOpt.noAck ? kWalkCodes : kWalkCodes - 1);
        }
        return outcome;
    }

    Outcome pluginSweep(SaidCodes& codes, int64_t end) {
        SoundMeter_vir& meter = mDevice.meter();
        Outcome outcome = Outcome::Done;
        for (int64_t nextCall = monotonicMs(); monotonicMs() < end;) {
            if ((outcome = mSession.interruption()) != Outcome::Done) break;
            if (monotonicMs() >= nextCall) {
                meter.SayAllFreqIndex(mOpt.ms);
                nextCall = monotonicMs() + kCallPeriodMs;
            }
            mDevice.step();
            for (int code; (code = codes.take()) >= 0;) {
                said(code);
                if (mOpt.noAck) continue;
                outcome = awaitAnswer(korvo::acknowledgementOf(code), end);
                // Answered or not, the plug-in's pause then lets the next code be said.
                meter.setSpeakerState(10);
                if (outcome != Outcome::Done) return outcome;
            }
        }
        return outcome;
    }

    int saidCount() const { return mSaid; }
    int answered() const { return mAnswered; }

private:
    void said(int code) {
        ++mSaid;
        mSaidAt = monotonicMs();
        const int hz = code < kCodeCount ? codeHz(code) : 0;
        const std::string truth = code < kCodeCount ? codeTruth(code, mOutputRate) : "";
        progressf(JsonEvent("said").add("code", code).add("hz", hz).add("ms", mOpt.ms).add("t_s", elapsed()),
                  "%8.3f s  said code %d (%d Hz)\n", elapsed(), code, hz);
        if (!truth.empty()) infof("          note: %s\n", truth.c_str());
    }

    // Listens for the answer; Done also when it did not come in time (said so).
    Outcome awaitAnswer(int answer, int64_t end) {
        if (!hears(mHearing.decoder(), answer)) {
            infof("%8.3f s  no answer can be heard to code %d\n", elapsed(), answer - 1);
            return Outcome::Done;
        }
        int heard = -1;
        const Outcome o = mHearing.waitFor(codeBit(answer), std::min(end, mSaidAt + mOpt.ms + kAnswerWaitMs), &heard);
        if (o == Outcome::Done) {
            ++mAnswered;
            const int64_t roundTrip = monotonicMs() - mSaidAt;
            progressf(JsonEvent("heard").add("code", answer).add("hz", codeHz(answer)).add("round_trip_ms", roundTrip),
                      "%8.3f s  heard answer code %d (%d Hz), round trip %lld ms\n", elapsed(), answer,
                      codeHz(answer), static_cast<long long>(roundTrip));
            return o;
        }
        if (o != Outcome::TimedOut) return o;
        infof("%8.3f s  no answer code %d\n", elapsed(), answer);
        return Outcome::Done;
    }

    double elapsed() const { return (monotonicMs() - mStart) / 1000.0; }

    Session& mSession;
    Device& mDevice;
    LiveHearing& mHearing;
    const SweepOptions& mOpt;
    const int mOutputRate;
    const int64_t mStart = monotonicMs();
    int64_t mSaidAt = 0;
    int mSaid = 0;
    int mAnswered = 0;
};

int runSweep(const CommonOptions& common, const SweepOptions& o) {
    const DecoderKind kind = o.decoder;
    SaidCodes codes;
    Session session(common);
    DeviceSettings settings;
    settings.role = 2;
    settings.needAck = !o.noAck;
    settings.routes.speaker = true;
    settings.routes.mic = !o.noAck;  // answers are heard
    if (int status = session.open(settings, o.allCodes ? codes.handler(common.verbose > 0) : nullptr)) return status;
    noteSilentSpeaker();
    infof("sweeping %s for %.1f s, tones of %d ms, acknowledgement %s\n",
          o.allCodes ? "the plug-in's whole plan (codes 0..39)" : "codes 0..17", o.seconds, o.ms, o.noAck ? "off" : "on");
    LiveHearing hearing(session.device(), kind);
    Sweep sweep(session, hearing, o);
    const int64_t end = monotonicMs() + static_cast<int64_t>(o.seconds * 1000.0);
    Outcome outcome = o.allCodes ? sweep.pluginSweep(codes, end) : sweep.walk(end);
    if (outcome == Outcome::Done) outcome = session.device().stepUntil(monotonicMs() + o.ms + kToneTailMs);
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);
    JsonEvent summary("summary");
    summary.add("said", sweep.saidCount());
    if (o.noAck) {
        resultf(summary, "said %s\n", plural(sweep.saidCount(), "code").c_str());
    } else {
        resultf(summary.add("answered", sweep.answered()), "said %s, %d answered\n", plural(sweep.saidCount(), "code").c_str(),
                sweep.answered());
    }
    return 0;
}

}  // namespace

Command addSweepCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<SweepOptions>();
    CLI::App* sub = app.add_subcommand(
        "sweep",
        "Say codes in turn (role speaker) for a while: codes 0..17, which every listener hears as themselves, or "
        "with --all-codes the plug-in's own sweep through all 40. With acknowledgement each code waits for its "
        "answer, code + 1, from a peer.");
    sub->add_option("--ms", options->ms, "tone duration in milliseconds")
        ->check(CLI::Range(20, 10000))
        ->capture_default_str();
    sub->add_option("--seconds", options->seconds, "how long to sweep")
        ->check(finiteRange(0.1, 86400.0))
        ->capture_default_str();
    sub->add_flag("--no-ack", options->noAck, "do not wait for answers");
    sub->add_flag("--all-codes", options->allCodes,
                  "the plug-in's sweep (SayAllFreqIndex) through the whole plan, codes 18..39 included: what "
                  "listeners make of each is said beside it");
    addDecoderOption(sub, &options->decoder);
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runSweep(common, *options); }};
}

}  // namespace host
}  // namespace korvo
