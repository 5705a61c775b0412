// soundmeter listen: hears one given code (HearFreqIdx), or reports every code
// that sounds (the masked read-out and the two-peak detector).
#include <CLI/CLI.hpp>

#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/CodeTracker.h"
#include "host/Interrupt.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Session.h"
#include "host/Spectrum.h"

namespace korvo {
namespace host {
namespace {

struct ListenOptions {
    int code = -1;  // -1: report every code
    int level = 0;
    bool levelGiven = false;
    double seconds = 10.0;  // 0: until Ctrl-C
};

int64_t deadlineOf(int64_t start, double seconds) {
    return seconds > 0 ? start + static_cast<int64_t>(seconds * 1000.0) : INT64_MAX;
}

int listenForCode(Session& session, const ListenOptions& o) {
    if (!codeHearable(o.code)) errf("note: code %d (%d Hz) %s", o.code, codeHz(o.code), codeReach(o.code));
    outf("listening for code %d (%d Hz)\n", o.code, codeHz(o.code));
    int64_t start = monotonicMs();
    Heard heard = session.device().hearUntil(o.code, deadlineOf(start, o.seconds));
    int64_t waited = monotonicMs() - start;
    session.close();
    switch (heard) {
        case Heard::Yes:
            outf("heard code %d (%d Hz) after %lld ms\n", o.code, codeHz(o.code), static_cast<long long>(waited));
            return 0;
        case Heard::TimedOut:
            errf("code %d (%d Hz) not heard within %.1f s", o.code, codeHz(o.code), o.seconds);
            return 1;
        case Heard::Interrupted:
            break;
    }
    errf("interrupted before code %d was heard", o.code);
    return 1;
}

int reportCodes(Session& session, const ListenOptions& o) {
    outf("listening for every code\n");
    SoundMeter_vir& meter = session.meter();
    CodeTracker tracker;
    SpectrumLook look;
    int count = 0;
    int64_t start = monotonicMs();
    int64_t deadline = deadlineOf(start, o.seconds);
    for (int64_t now = start; now < deadline && !interrupted(); now = monotonicMs()) {
        meter.processAudio();
        lookAtSpectrum(meter, &look);
        uint64_t fresh = tracker.update(monotonicMs(), look.codeFirst, look.codeSecond);
        for (int c = 0; c < kCodeCount; ++c) {
            if (fresh & (uint64_t{1} << c)) {
                ++count;
                outf("%8.3f s  heard code %d (%d Hz)\n", (monotonicMs() - start) / 1000.0, c, codeHz(c));
            }
        }
    }
    double elapsed = (monotonicMs() - start) / 1000.0;
    session.close();
    outf("listened %.1f s: %d code%s\n", elapsed, count, count == 1 ? "" : "s");
    return 0;  // reporting is the job; Ctrl-C is the normal way to end it
}

int runListen(const CommonOptions& common, const ListenOptions& o) {
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;  // listener without acknowledgement: hearing changes nothing it needs
    settings.setLevel = o.levelGiven;
    settings.level = o.level;
    if (int status = session.open(settings)) return status;
    return o.code >= 0 ? listenForCode(session, o) : reportCodes(session, o);
}

}  // namespace

Command addListenCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<ListenOptions>();
    CLI::App* sub = app.add_subcommand(
        "listen",
        "Listen for one code (--code: exit 0 when heard, 1 when time is up), or report every code heard, "
        "one line each.");
    sub->add_option("--code", options->code, "code to listen for, 0..39 (only 0..17 can be heard)")
        ->check(CLI::Range(0, kCodeCount - 1));
    sub->add_option_function<int>(
           "--level",
           [options](const int& v) {
               options->level = v;
               options->levelGiven = true;
           },
           "detection level: spectrum levels at or below it count as silence (level 100 = full scale, "
           "1 unit = 1.2 dB)");
    sub->add_option("--seconds", options->seconds, "how long to listen; 0: until Ctrl-C")
        ->check(CLI::Range(0.0, 86400.0))
        ->capture_default_str();
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runListen(common, *options); }};
}

}  // namespace host
}  // namespace korvo
