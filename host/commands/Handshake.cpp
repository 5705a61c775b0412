// soundmeter handshake: one device of an exchange with a peer elsewhere.
//
// The exchange: the speaker says code k; the listener hears k and, with
// acknowledgement, answers k + 1; the speaker hears k + 1. Then the next round.
// Codes cycle through 0..17, which every listener hears whatever its decoder.
//
// A round lost to noise is said again: a speaker that has not heard the answer a
// little after its tone ended says k once more, until the round's time is up. A
// listener that hears the previous round's code again (its answer was lost) answers
// it again. Without acknowledgement nothing comes back: the listener takes a later
// round's code as the sign that rounds were missed, and goes on from there.
//
// The plug-in's state machine only guards saying here: every code is said with
// SayFreqIdx after the saying gate has been opened with setSpeakerState(0). A speaker
// has role 2; a listener that answers has roles 1 and 2 (3), one that only hears role 1.
#include <poll.h>
#include <unistd.h>

#include <CLI/CLI.hpp>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/core/LiveHearing.h"
#include "host/base/Interrupt.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

constexpr int kHandshakeCodes = kBuiltinCodes;
// After its tone has ended, how long a speaker waits for the answer before saying the code again.
constexpr int64_t kAnswerWaitMs = 400;
// Without acknowledgement, how many rounds ahead a listener looks for the speaker's code.
constexpr int kLookAhead = 3;

struct HandshakeOptions {
    std::string role;
    int rounds = 3;
    bool noAck = false;
    int toneMs = 64;  // heard to -11 dB SNR; a longer tone only delays the answer it overlaps
    int timeoutMs = 10000;
    int firstCode = -1;  // -1: the lowest of the codes
    CodeRange codes;
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
    bool startOnStdin = false;
};

// Code the speaker says in round r (from 0). With acknowledgement the answer k + 1
// must be a handshake code too, so the speaker keeps to LO..HI-1 and steps by two (with
// 0..17: 0, 2, .., 16, 1, 3, .., 15, 0, ..): every code is used, each answer included.
int speakerCode(const HandshakeOptions& o, int round) {
    const int first = (o.firstCode < 0 ? o.codes.lo : o.firstCode) - o.codes.lo;
    if (o.noAck) return o.codes.lo + (first + round) % o.codes.count();
    return o.codes.lo + (first + 2 * round) % (o.codes.count() - 1);
}

// After "ready", waits for a line on stdin before the first round, hearing meanwhile so the
// microphone stays drained: the demo starts both devices together and lets them begin once
// both have calibrated, so that neither's first wait counts the other's start-up.
Outcome waitForStart(LiveHearing* hearing, Device& device) {
    for (;;) {
        const Outcome stop = device.interruption();
        if (stop != Outcome::Done) return stop;
        if (hearing) hearing->step();
        pollfd in = {STDIN_FILENO, POLLIN, 0};
        if (poll(&in, 1, hearing ? 0 : 20) <= 0) continue;
        char text[64];
        const ssize_t n = read(STDIN_FILENO, text, sizeof text);
        if (n > 0) return Outcome::Done;
        errf("standard input closed before the start");
        return Outcome::TimedOut;
    }
}

class Exchange {
public:
    Exchange(Session& session, LiveHearing& hearing, const HandshakeOptions& o)
        : mSession(session), mDevice(session.device()), mHearing(hearing), mOpt(o) {}

    // Runs the rounds; the number completed. `stop` tells why it stopped early, if it did.
    int run(bool speaker, Outcome* stop) {
        int completed = 0;
        *stop = Outcome::Done;
        for (int r = 0; r < mOpt.rounds;) {
            if ((*stop = mSession.interruption()) != Outcome::Done) break;
            int next = r + 1;
            const Outcome o = speaker ? speakerRound(r) : listenerRound(r, &next);
            if (o != Outcome::Done) {
                *stop = o;
                break;  // the peer is gone, or the room too loud for the round's time
            }
            ++completed;
            r = next;
        }
        // The last tone said is still sounding; tearing down now would cut it.
        if (*stop == Outcome::Done && mLastSaidAt >= 0) *stop = mDevice.stepUntil(mLastSaidAt + mOpt.toneMs + kToneTailMs);
        return completed;
    }

private:
    Outcome speakerRound(int r) {
        const int code = speakerCode(mOpt, r);
        if (mOpt.noAck) {
            // Nothing comes back: a gap after each tone keeps two tones from overlapping.
            if (mLastSaidAt >= 0) {
                const Outcome gap = mDevice.stepUntil(mLastSaidAt + mOpt.toneMs + kToneTailMs);
                if (gap != Outcome::Done) return gap;
            }
            say(r, code, 1);
            return Outcome::Done;
        }
        const int64_t start = monotonicMs();
        const int64_t roundEnd = start + mOpt.timeoutMs;
        for (int attempt = 1;; ++attempt) {
            say(r, code, attempt);
            const int64_t again = mLastSaidAt + mOpt.toneMs + kAnswerWaitMs;
            int heard = -1;
            const Outcome o = mHearing.waitFor(codeBit(code + 1), std::min(again, roundEnd), &heard);
            if (o == Outcome::Done) {
                report("heard", r, code + 1, start);
                return o;
            }
            if (o != Outcome::TimedOut) return o;
            if (monotonicMs() >= roundEnd) {
                report("timeout", r, code + 1, start);
                return o;
            }
        }
    }

    // *next: the round after the one heard (later than r + 1 when rounds were missed).
    Outcome listenerRound(int r, int* next) {
        const int code = speakerCode(mOpt, r);
        const int64_t start = monotonicMs();
        const int64_t roundEnd = start + mOpt.timeoutMs;
        CodeSet wanted = 0;
        if (mOpt.noAck) {
            for (int k = 0; k < kLookAhead && r + k < mOpt.rounds; ++k) wanted |= codeBit(speakerCode(mOpt, r + k));
        } else {
            wanted = codeBit(code);
            if (r > 0) wanted |= codeBit(speakerCode(mOpt, r - 1));  // said again: our answer was lost
        }
        for (;;) {
            int heard = -1;
            const Outcome o = mHearing.waitFor(wanted, roundEnd, &heard);
            if (o == Outcome::TimedOut) report("timeout", r, code, start);
            if (o != Outcome::Done) return o;
            if (mOpt.noAck) {
                int at = r;
                for (; speakerCode(mOpt, at) != heard; ++at) report("missed", at, speakerCode(mOpt, at), start);
                report("heard", at, heard, start);
                *next = at + 1;
                return o;
            }
            if (heard != code) {
                say(r - 1, heard + 1, ++mAnswers[heard]);
                continue;
            }
            report("heard", r, code, start);
            mAnswers[code] = 1;
            say(r, code + 1, 1);
            return o;
        }
    }

    void say(int r, int code, int attempt) {
        // Stamped before the call: the tone cannot be heard before it was asked for,
        // however the call and the printing are scheduled.
        mLastSaidAt = monotonicMs();
        mDevice.sayCode(code, mOpt.toneMs);
        progressf(JsonEvent("said").add("round", r + 1).add("code", code).add("hz", codeHz(code)).add("t", mLastSaidAt).add("attempt", attempt),
                  "said round=%d code=%d hz=%d t=%lld attempt=%d\n", r + 1, code, codeHz(code),
                  static_cast<long long>(mLastSaidAt), attempt);
    }

    void report(const char* event, int r, int code, int64_t since) {
        const int64_t now = monotonicMs();
        progressf(JsonEvent(event).add("round", r + 1).add("code", code).add("hz", codeHz(code)).add("t", now).add("waited_ms", now - since),
                  "%s round=%d code=%d hz=%d t=%lld waited=%lld\n", event, r + 1, code, codeHz(code),
                  static_cast<long long>(now), static_cast<long long>(now - since));
    }

    Session& mSession;
    Device& mDevice;
    LiveHearing& mHearing;
    const HandshakeOptions& mOpt;
    int64_t mLastSaidAt = -1;
    int mAnswers[kCodeCount] = {};  // answers said to each code in its round
};

int runHandshake(const CommonOptions& common, const HandshakeOptions& o) {
    if (!levelApplies("handshake", o.level, o.decoder)) return 2;
    // A device of the demo: the demo stops it with SIGTERM and says why itself.
    if (o.startOnStdin) leaveInterruptionsToParent();
    const bool speaker = o.role == "speaker";
    const int limit = o.noAck ? o.codes.hi : o.codes.hi - 1;
    if (o.firstCode >= 0 && (o.firstCode < o.codes.lo || o.firstCode > limit)) {
        errf("--first-code: must be %d..%d %s", o.codes.lo, limit,
             o.noAck ? "without acknowledgement" : "with acknowledgement, whose answer is code + 1");
        return 2;
    }
    const DecoderKind kind = o.decoder;
    Session session(common);
    DeviceSettings settings;
    settings.role = speaker ? 2 : (o.noAck ? 1 : 3);
    settings.needAck = !o.noAck;
    settings.routes.mic = !speaker || !o.noAck;
    settings.routes.speaker = speaker || !o.noAck;
    if (int status = session.open(settings)) return status;
    LiveHearing hearing(session.device(), kind);
    if (settings.routes.mic) {
        const Outcome level = hearing.applyLevel(o.level);
        if (level != Outcome::Done) {
            session.close();
            return exitStatusOf(level);
        }
    }
    const long long t = monotonicMs();
    progressf(JsonEvent("ready").add("role", o.role).add("ack", !o.noAck).add("rounds", o.rounds).add("t", t),
              "ready role=%s ack=%d rounds=%d t=%lld\n", o.role.c_str(), o.noAck ? 0 : 1, o.rounds, t);

    if (o.startOnStdin) {
        const Outcome start = waitForStart(settings.routes.mic ? &hearing : nullptr, session.device());
        if (start != Outcome::Done) {
            session.close();
            return exitStatusOf(start);
        }
    }
    Exchange exchange(session, hearing, o);
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
        "code k, the listener hears it and, with acknowledgement, answers k + 1, which the speaker hears; a "
        "round whose answer is not heard is said again. Prints one line per step (ready, said, heard, "
        "missed, timeout, done); exit 0 when every round completed.");
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
    sub->add_option("--timeout-ms", options->timeoutMs,
                    "how long a round may take, said again as often as it needs, before the device gives up")
        ->check(CLI::Range(100, 3600000))
        ->capture_default_str();
    sub->add_option("--first-code", options->firstCode,
                    "code of the first round (default: the lowest of --codes); codes cycle through 0..17 (0..16 said, "
                    "answers k + 1, with acknowledgement)")
        ->check(CLI::Range(0, kHandshakeCodes - 1));
    addCodesOption(sub, &options->codes,
                   "use codes LO..HI only: the ones a loudspeaker carries, or one pair's share of a room (both devices "
                   "must agree)");
    addLevelOption(sub, &options->level,
                   "detection level for --decoder builtin: spectrum levels at or below it count as silence (raise it in noise)");
    addDecoderOption(sub, &options->decoder);
    // The demo's own: not in the help.
    sub->add_flag("--start-on-stdin", options->startOnStdin, "after ready, begin on a line from standard input")->group("");
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runHandshake(common, *options); }};
}

}  // namespace host
}  // namespace korvo
