// soundmeter monitor: a live view of the read-out in the terminal.
#include <string>

#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/Hearing.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Session.h"

namespace korvo {
namespace host {
namespace {

struct MonitorOptions {
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
    double seconds = 0.0;  // 0: until Ctrl-C
};

constexpr int64_t kRefreshMs = 150;
// After a file's last sample its last frames are still being analysed.
constexpr int64_t kFileTailMs = 250;

// True a moment after a file microphone has delivered its last sample.
bool fileEnded(int64_t now) {
    static int64_t endedAt = -1;
    const korvo::platform::SourceProgress p = korvo::platform::microphoneStatus().progress;
    if (p.finite && p.ended && endedAt < 0) endedAt = now;
    return endedAt >= 0 && now >= endedAt + kFileTailMs;
}
constexpr int kBarWidth = 50;  // two level units per character, level 100 = full scale
constexpr int kFrameLines = kHostCodes + 4;

std::string bar(float level, int detection) {
    int n = level <= 0.0f ? 0 : static_cast<int>(level / 2.0f);
    if (n > kBarWidth) n = kBarWidth;
    std::string s(static_cast<size_t>(n), '#');
    s.resize(kBarWidth, '.');
    int mark = detection / 2;  // where the detection level sits
    if (detection > 0 && mark < kBarWidth && s[static_cast<size_t>(mark)] == '.') s[static_cast<size_t>(mark)] = '|';
    return s;
}

void drawFrame(bool ansi, bool first, SoundMeter_vir& meter, const float* levels, int bins, CodeSet heard,
               double elapsed) {
    const char* eol = ansi ? "\x1b[K\n" : "\n";
    std::string frame;
    if (ansi && !first) frame += "\x1b[" + std::to_string(kFrameLines) + "F";  // back to the frame's top
    char line[256];
    int detection = meter.getDetectionLevel();
    snprintf(line, sizeof line, "%6.1f s  detection level %d  %s%s", elapsed, detection,
             bins == 0 ? "(no spectrum yet)" : "", eol);
    frame += line;
    for (int c = 0; c < kHostCodes; ++c) {
        const float v = levels[codeIndex(c)];
        snprintf(line, sizeof line, "code %2d %5d Hz %s %5.1f%s", c, codeHz(c), bar(v, detection).c_str(), v, eol);
        frame += line;
    }
    snprintf(line, sizeof line, "bars: each code's own bin; codes 23..39 lie above the spectrum%s", eol);
    frame += line;
    std::string names;
    for (int c = 0; c < kCodeCount; ++c) {
        if (heard & codeBit(c)) names += (names.empty() ? "" : ", ") + std::to_string(c) + " (" + std::to_string(codeHz(c)) + " Hz)";
    }
    snprintf(line, sizeof line, "heard: %s%s", names.empty() ? "-" : ("code " + names).c_str(), eol);
    frame += line;
    frame += ansi ? "\x1b[K\n" : "\n";
    outf("%s", frame.c_str());
}

int runMonitor(const CommonOptions& common, const MonitorOptions& o) {
    const DecoderKind kind = o.decoder;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    SoundMeter_vir& meter = session.meter();
    Hearing hearing(session.device(), kind);
    Outcome outcome = hearing.applyLevel(o.level);
    // Redraw in place on a terminal; elsewhere (a pipe, a file) frames follow each other.
    bool ansi = hostOutputIsTerminal();
    if (ansi) outf("\x1b[?25l");  // no blinking cursor over the bars

    float levels[korvo::kSpectrumBins] = {};
    int64_t start = monotonicMs();
    int64_t end = o.seconds > 0 ? start + static_cast<int64_t>(o.seconds * 1000.0) : INT64_MAX;
    int64_t nextDraw = start;
    bool first = true;
    for (int64_t now = start; outcome == Outcome::Done && now < end && !fileEnded(now); now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        hearing.step();
        if (now >= nextDraw) {
            const int bins = meter.getSpectrumData(levels);
            drawFrame(ansi, first, meter, levels, bins, hearing.heardNow(), (now - start) / 1000.0);
            first = false;
            nextDraw = now + kRefreshMs;
        }
    }
    if (ansi) outf("\x1b[?25h");
    session.close();
    return exitStatusOf(outcome);
}

}  // namespace

Command addMonitorCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<MonitorOptions>();
    CLI::App* sub = app.add_subcommand(
        "monitor",
        "Live view of the read-out: the level of each code's own bin as a bar, the detection level and the "
        "codes heard; Ctrl-C ends it.");
    addLevelOption(sub, &options->level, "detection level: spectrum levels at or below it count as silence");
    addDecoderOption(sub, &options->decoder);
    sub->add_option("--seconds", options->seconds, "stop after this many seconds; 0: until Ctrl-C (or the file's end)")
        ->check(finiteRange(0.0, 86400.0))
        ->capture_default_str();
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runMonitor(common, *options); }};
}

}  // namespace host
}  // namespace korvo
