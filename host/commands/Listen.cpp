// soundmeter listen: hears one given code, or reports every code that begins to sound,
// with its time on the microphone's clock (the time in a recording). On a file it ends
// a moment after the file does, and on a terminal it shows where it is in the file.
#include <CLI/CLI.hpp>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/output/FileWatch.h"
#include "host/core/LiveHearing.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

struct ListenOptions {
    int code = -1;  // -1: report every code
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
    double seconds = 10.0;  // 0: until Ctrl-C
};

int64_t deadlineOf(int64_t start, double seconds) {
    return seconds > 0 ? start + static_cast<int64_t>(seconds * 1000.0) : INT64_MAX;
}

int listenForCode(Session& session, LiveHearing& hearing, const ListenOptions& o) {
    if (!hears(hearing.decoder(), o.code)) {
        infof("note: code %d (%d Hz) %s\n", o.code, codeHz(o.code), codeReach(o.code, hearing.decoder()));
    }
    infof("listening for code %d (%d Hz)\n", o.code, codeHz(o.code));
    FileWatch file;
    const int64_t start = monotonicMs();
    const int64_t deadline = deadlineOf(start, o.seconds);
    Outcome outcome = Outcome::TimedOut;
    bool fileOver = false;
    for (int64_t now = start; now < deadline; now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        if (hearing.step() & codeBit(o.code)) break;
        outcome = Outcome::TimedOut;
        if ((fileOver = file.over(now))) break;
    }
    const int64_t waited = monotonicMs() - start;
    const double at = hearing.seconds();
    file.clear();
    session.close();
    if (outcome == Outcome::Done) {
        resultf(JsonEvent("heard").add("code", o.code).add("hz", codeHz(o.code)).add("t_s", at).add("listened_ms", waited),
                "heard code %d (%d Hz) at %.3f s, after %lld ms of listening\n", o.code, codeHz(o.code), at,
                static_cast<long long>(waited));
        return 0;
    }
    if (outcome != Outcome::TimedOut) return exitStatusOf(outcome);
    if (fileOver) {
        errf("code %d (%d Hz) not heard in the file", o.code, codeHz(o.code));
    } else {
        errf("code %d (%d Hz) not heard within %.1f s", o.code, codeHz(o.code), o.seconds);
    }
    return 1;
}

int reportCodes(Session& session, LiveHearing& hearing, const ListenOptions& o) {
    infof("listening for every code\n");
    FileWatch file;
    int count = 0;
    Outcome outcome = Outcome::Done;
    const int64_t start = monotonicMs();
    const int64_t deadline = deadlineOf(start, o.seconds);
    for (int64_t now = start; now < deadline && !file.over(now); now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        const CodeSet begun = hearing.step();
        for (int c = 0; c < kCodeCount; ++c) {
            if (!(begun & codeBit(c))) continue;
            ++count;
            file.clear();
            printHeard(c, hearing.seconds());
        }
    }
    const double elapsed = (monotonicMs() - start) / 1000.0;
    file.clear();
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);
    resultf(JsonEvent("summary").add("listened_s", elapsed).add("codes", count), "listened %.1f s: %s\n", elapsed,
            plural(count, "code").c_str());
    return 0;
}

int runListen(const CommonOptions& common, const ListenOptions& o) {
    const DecoderKind kind = o.decoder;
    if (!levelApplies("listen", o.level, kind)) return 2;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;  // listener without acknowledgement: hearing changes nothing it needs
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    LiveHearing hearing(session.device(), kind);
    const Outcome level = hearing.applyLevel(o.level);
    if (level != Outcome::Done) {
        session.close();
        return exitStatusOf(level);
    }
    return o.code >= 0 ? listenForCode(session, hearing, o) : reportCodes(session, hearing, o);
}

}  // namespace

Command addListenCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<ListenOptions>();
    CLI::App* sub = app.add_subcommand(
        "listen",
        "Listen for one code (--code: exit 0 when heard, 1 when time is up or the file ended), or report every "
        "code heard, one line each. On a file, ends when the file does.");
    sub->add_option("--code", options->code, "code to listen for, 0..39 (0..22 can be heard, 0..17 by builtin)")
        ->check(CLI::Range(0, kCodeCount - 1));
    addLevelOption(sub, &options->level,
                   "detection level for --decoder builtin: spectrum levels at or below it count as silence "
                   "(level 100 = full scale, 1 unit = 1.2 dB)");
    addDecoderOption(sub, &options->decoder);
    sub->add_option("--seconds", options->seconds, "how long to listen; 0: until Ctrl-C (or the file's end)")
        ->check(finiteRange(0.0, 86400.0))
        ->capture_default_str();
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runListen(common, *options); }};
}

}  // namespace host
}  // namespace korvo
