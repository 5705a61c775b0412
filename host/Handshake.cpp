// soundmeter handshake: one device of an exchange with a peer elsewhere.
//
// The exchange: the speaker says code k; the listener hears k and, with
// acknowledgement, answers k + 1; the speaker hears k + 1. Then the next round.
//
// How the meter object's state machine is driven for several rounds:
// - Speaker, role 2. SayFreqIdx needs speaker state 0 and leaves it at 1 (with
//   acknowledgement: the hearing gate opens for the answer) or 10 (without). The
//   answer does not bring the state back to 0, because the machine compares it with
//   the last code of the sweep, not with a code said by SayFreqIdx. So the device
//   re-arms with setSpeakerState(0) before every SayFreqIdx.
// - Listener without acknowledgement, role 1: the first code heard moves the
//   listener state 0 -> 10; state 10 keeps the hearing gate open, so later rounds
//   just go on hearing.
// - Listener with acknowledgement, role 3: role 1 alone would stop at listener
//   state 10 after its first answer with its saying gate closed for good. With both
//   bits the first round goes listener 0 -> 1 (heard) -> 10 (answered) and speaker
//   0 -> 1; from then on the hearing gate stays open (listener 10) and every answer
//   is said after re-arming the speaker state to 0, which SayFreqIdx sets back to 1.
//   (Hearing code 0 with speaker state 1 moves both sides to 0; re-arming covers it.)
#include <CLI/CLI.hpp>

#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/JsonEvent.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Session.h"

namespace korvo {
namespace host {
namespace {

struct HandshakeOptions {
    std::string role;
    int rounds = 3;
    bool noAck = false;
    int toneMs = 300;
    int timeoutMs = 10000;
    int firstCode = 0;
    int level = 0;
    bool levelGiven = false;
};

// Code the speaker says in round r (from 0). With acknowledgement the answer k + 1
// must be heard too, so the speaker keeps to 0..16 and steps by two (0, 2, .., 16,
// 1, 3, .., 15, 0, ..): every hearable code is used, each answer included.
int speakerCode(const HandshakeOptions& o, int round) {
    if (o.noAck) return (o.firstCode + round) % kHearableCodes;
    return (o.firstCode + 2 * round) % (kHearableCodes - 1);
}

class Exchange {
public:
    Exchange(Session& session, const HandshakeOptions& o) : mSession(session), mDevice(session.device()), mOpt(o) {}

    // Runs the rounds; the number completed. `stop` tells why it stopped early, if it did.
    int run(bool speaker, Outcome* stop) {
        int completed = 0;
        *stop = Outcome::Done;
        for (int r = 0; r < mOpt.rounds; ++r) {
            if ((*stop = mSession.interruption()) != Outcome::Done) break;
            const Outcome o = speaker ? speakerRound(r) : listenerRound(r);
            if (o != Outcome::Done) {
                *stop = o;
                break;  // the peer and this device no longer agree on the round
            }
            ++completed;
        }
        // The last tone said is still sounding; tearing down now would cut it.
        if (*stop == Outcome::Done && mLastSaidAt >= 0) *stop = mDevice.stepUntil(mLastSaidAt + mOpt.toneMs + kToneTailMs);
        return completed;
    }

private:
    Outcome speakerRound(int r) {
        int code = speakerCode(mOpt, r);
        if (!mOpt.noAck) {
            say(r, code);
            return hear(r, code + 1);
        }
        // Without acknowledgement nothing comes back: leave a gap after each tone so
        // that two tones never overlap in the room.
        if (mLastSaidAt >= 0) {
            const Outcome gap = mDevice.stepUntil(mLastSaidAt + mOpt.toneMs + kToneTailMs);
            if (gap != Outcome::Done) return gap;
        }
        say(r, code);
        return Outcome::Done;
    }

    Outcome listenerRound(int r) {
        int code = speakerCode(mOpt, r);
        const Outcome heard = hear(r, code);
        if (heard == Outcome::Done && !mOpt.noAck) say(r, code + 1);
        return heard;
    }

    void say(int r, int code) {
        // Stamped before the call: the tone cannot be heard before it was asked for,
        // however the call and the printing are scheduled.
        mLastSaidAt = monotonicMs();
        mDevice.sayCode(code, mOpt.toneMs);
        progressf(JsonEvent("said").add("round", r + 1).add("code", code).add("hz", codeHz(code)).add("t", mLastSaidAt),
                "said round=%d code=%d hz=%d t=%lld\n", r + 1, code, codeHz(code), static_cast<long long>(mLastSaidAt));
    }

    Outcome hear(int r, int code) {
        const int64_t start = monotonicMs();
        const Outcome heard = mDevice.hearUntil(code, start + mOpt.timeoutMs);
        const int64_t now = monotonicMs();
        if (heard != Outcome::Done && heard != Outcome::TimedOut) return heard;
        const char* event = heard == Outcome::Done ? "heard" : "timeout";
        progressf(JsonEvent(event).add("round", r + 1).add("code", code).add("hz", codeHz(code)).add("t", now).add("waited_ms", now - start),
                "%s round=%d code=%d hz=%d t=%lld waited=%lld\n", event, r + 1, code, codeHz(code),
                static_cast<long long>(now), static_cast<long long>(now - start));
        return heard;
    }

    Session& mSession;
    Device& mDevice;
    const HandshakeOptions& mOpt;
    int64_t mLastSaidAt = -1;
};

int runHandshake(const CommonOptions& common, const HandshakeOptions& o) {
    bool speaker = o.role == "speaker";
    int limit = o.noAck ? kHearableCodes - 1 : kHearableCodes - 2;
    if (o.firstCode > limit) {
        errf("--first-code: must be 0..%d %s (codes above 17 cannot be heard)", limit,
             o.noAck ? "without acknowledgement" : "with acknowledgement, whose answer is code + 1");
        return 2;
    }
    Session session(common);
    DeviceSettings settings;
    settings.role = speaker ? 2 : (o.noAck ? 1 : 3);
    settings.needAck = !o.noAck;
    settings.setLevel = o.levelGiven;
    settings.level = o.level;
    settings.routes.mic = !speaker || !o.noAck;
    settings.routes.speaker = speaker || !o.noAck;
    if (int status = session.open(settings)) return status;
    const long long t = monotonicMs();
    progressf(JsonEvent("ready").add("role", o.role).add("ack", !o.noAck).add("rounds", o.rounds).add("t", t),
            "ready role=%s ack=%d rounds=%d t=%lld\n", o.role.c_str(), o.noAck ? 0 : 1, o.rounds, t);

    Exchange exchange(session, o);
    Outcome stop = Outcome::Done;
    const int completed = exchange.run(speaker, &stop);
    session.close();
    if (stop == Outcome::Interrupted || stop == Outcome::RouteFailed) return exitStatusOf(stop);
    const long long end = monotonicMs();
    resultf(JsonEvent("summary").add("completed", completed).add("rounds", o.rounds).add("t", end),
            "done completed=%d rounds=%d t=%lld\n", completed, o.rounds, end);
    if (completed == o.rounds) return 0;
    errf("%d of %s completed", completed, plural(o.rounds, "round").c_str());
    return 1;
}

}  // namespace

Command addHandshakeCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<HandshakeOptions>();
    CLI::App* sub = app.add_subcommand(
        "handshake",
        "Be one device of an exchange with a peer elsewhere (another process or machine): the speaker says "
        "code k, the listener hears it and, with acknowledgement, answers k + 1, which the speaker hears. "
        "Prints one line per step (ready, said, heard, timeout, done); exit 0 when every round completed.");
    sub->add_option("--role", options->role, "speaker or listener")
        ->required()
        ->check(CLI::IsMember({"speaker", "listener"}));
    sub->add_option("--rounds", options->rounds, "number of exchanges")
        ->check(CLI::Range(1, 100000))
        ->capture_default_str();
    sub->add_flag("--no-ack", options->noAck, "no acknowledgement: the listener only hears");
    sub->add_option("--tone-ms", options->toneMs, "duration of each tone in milliseconds")
        ->check(CLI::Range(20, 10000))
        ->capture_default_str();
    sub->add_option("--timeout-ms", options->timeoutMs, "how long to wait for each code before giving up")
        ->check(CLI::Range(100, 3600000))
        ->capture_default_str();
    sub->add_option("--first-code", options->firstCode,
                    "code of the first round; codes cycle through 0..17 (0..16 said, answers k + 1, with "
                    "acknowledgement)")
        ->check(CLI::Range(0, kHearableCodes - 1))
        ->capture_default_str();
    addLevelOption(sub, &options->level, &options->levelGiven,
                   "detection level: spectrum levels at or below it count as silence (raise it in noise)");
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runHandshake(common, *options); }};
}

}  // namespace host
}  // namespace korvo
