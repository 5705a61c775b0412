// soundmeter listen: hears one given code (HearFreqIdx), or reports every code
// that sounds (the masked read-out and the two-peak detector). On a file it ends a
// moment after the file does, and on a terminal it shows where it is in the file.
#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/CodeTracker.h"
#include "host/JsonEvent.h"
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

// After a file's last sample, the capture ring and the analysis thread hold a few
// more frames (5 frames of 11.6 ms, one analysed per 20 ms turn).
constexpr int64_t kFileTailMs = 250;
constexpr int64_t kProgressEveryMs = 200;

// Where a file microphone stands: its end, and a progress line on a terminal.
class FileWatch {
public:
    // True once the file has been delivered whole and its last frames analysed.
    bool over(int64_t now) {
        const korvo::platform::SourceProgress p = korvo::platform::microphoneStatus().progress;
        if (!p.finite) return false;
        if (p.ended && mEndedAt < 0) mEndedAt = now;
        if (mTerminal && now >= mNextShow) {
            mNextShow = now + kProgressEveryMs;
            outf("\r  %.1f s of %.1f s in the file, %.1f s left\x1b[K", p.seconds, p.totalSeconds,
                 p.totalSeconds > p.seconds ? p.totalSeconds - p.seconds : 0.0);
            mShown = true;
        }
        return mEndedAt >= 0 && now >= mEndedAt + kFileTailMs;
    }
    // Clears the progress line before a result is printed.
    void clear() {
        if (mShown) outf("\r\x1b[K");
        mShown = false;
    }

private:
    bool mTerminal = hostOutputIsTerminal() && outputMode() == OutputMode::Normal;
    int64_t mEndedAt = -1;
    int64_t mNextShow = 0;
    bool mShown = false;
};

int64_t deadlineOf(int64_t start, double seconds) {
    return seconds > 0 ? start + static_cast<int64_t>(seconds * 1000.0) : INT64_MAX;
}

int listenForCode(Session& session, const ListenOptions& o) {
    if (!codeHearable(o.code)) infof("note: code %d (%d Hz) %s\n", o.code, codeHz(o.code), codeReach(o.code));
    infof("listening for code %d (%d Hz)\n", o.code, codeHz(o.code));
    SoundMeter_vir& meter = session.meter();
    FileWatch file;
    const int64_t start = monotonicMs();
    const int64_t deadline = deadlineOf(start, o.seconds);
    Outcome outcome = Outcome::TimedOut;
    bool fileOver = false;
    for (int64_t now = start; now < deadline; now = monotonicMs()) {
        const Outcome stop = session.interruption();
        if (stop != Outcome::Done) {
            outcome = stop;
            break;
        }
        if (meter.HearFreqIdx(o.code) == o.code) {
            outcome = Outcome::Done;
            break;
        }
        if ((fileOver = file.over(now))) break;
    }
    const int64_t waited = monotonicMs() - start;
    file.clear();
    session.close();
    if (outcome == Outcome::Done) {
        resultf(JsonEvent("heard").add("code", o.code).add("hz", codeHz(o.code)).add("listened_ms", waited),
                "heard code %d (%d Hz) after %lld ms of listening\n", o.code, codeHz(o.code),
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

int reportCodes(Session& session, const ListenOptions& o) {
    infof("listening for every code\n");
    SoundMeter_vir& meter = session.meter();
    CodeTracker tracker;
    SpectrumLook look;
    FileWatch file;
    int count = 0;
    Outcome outcome = Outcome::Done;
    const int64_t start = monotonicMs();
    const int64_t deadline = deadlineOf(start, o.seconds);
    for (int64_t now = start; now < deadline && !file.over(now); now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        meter.processAudio();
        lookAtSpectrum(meter, &look);
        const uint64_t fresh = tracker.update(monotonicMs(), look.codeFirst, look.codeSecond);
        for (int c = 0; c < kCodeCount; ++c) {
            if (!(fresh & (uint64_t{1} << c))) continue;
            ++count;
            const double t = (monotonicMs() - start) / 1000.0;
            file.clear();
            resultf(JsonEvent("heard").add("code", c).add("hz", codeHz(c)).add("t_s", t), "%8.3f s  heard code %d (%d Hz)\n",
                    t, c, codeHz(c));
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
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;  // listener without acknowledgement: hearing changes nothing it needs
    settings.setLevel = o.levelGiven;
    settings.level = o.level;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    return o.code >= 0 ? listenForCode(session, o) : reportCodes(session, o);
}

}  // namespace

Command addListenCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<ListenOptions>();
    CLI::App* sub = app.add_subcommand(
        "listen",
        "Listen for one code (--code: exit 0 when heard, 1 when time is up or the file ended), or report every "
        "code heard, one line each. On a file, ends when the file does.");
    sub->add_option("--code", options->code, "code to listen for, 0..39 (only 0..17 can be heard)")
        ->check(CLI::Range(0, kCodeCount - 1));
    addLevelOption(sub, &options->level, &options->levelGiven,
                   "detection level: spectrum levels at or below it count as silence (level 100 = full scale, "
                   "1 unit = 1.2 dB)");
    sub->add_option("--seconds", options->seconds, "how long to listen; 0: until Ctrl-C (or the file's end)")
        ->check(finiteRange(0.0, 86400.0))
        ->capture_default_str();
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runListen(common, *options); }};
}

}  // namespace host
}  // namespace korvo
