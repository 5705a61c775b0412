// soundmeter monitor: a live view of the read-out in the terminal.
//
// It shows the spectrum the decoder heard: the host's decoder its own spectrum of every
// frame, the builtin decoder the meter's read-out at the open level (the decoder hears
// with the detection level applied by the host), so each band's noise floor shows.
#include <string>

#include <CLI/CLI.hpp>

#include "host/commands/BandMeter.h"
#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/output/FileWatch.h"
#include "host/core/LiveHearing.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

struct MonitorOptions {
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
    double seconds = 0.0;  // 0: until Ctrl-C
};

constexpr int64_t kRefreshMs = 150;
constexpr int kBarWidth = 50;  // two level units per character, level 100 = full scale
constexpr int kFrameLines = kHostCodes + 5;

int barPosition(float level) {
    if (!(level > 0.0f)) return 0;
    return std::min(kBarWidth, static_cast<int>(level / 2.0f));
}

// '#' up to the level now, '-' on to the noise floor where the level is under it, '>'
// where the peak is held, '|' at the detection level where nothing else is drawn.
std::string bar(const BandMeter::Band& b, int detection) {
    const int now = barPosition(b.now);
    std::string s(static_cast<size_t>(kBarWidth), '.');
    for (int p = 0; p < kBarWidth; ++p) {
        if (p < now) s[static_cast<size_t>(p)] = '#';
        else if (p < barPosition(b.floor)) s[static_cast<size_t>(p)] = '-';
    }
    const int peak = barPosition(b.peak);
    if (peak >= now && peak < kBarWidth && b.peak > 0.0f) s[static_cast<size_t>(peak)] = '>';
    const int mark = detection / 2;
    if (detection > 0 && mark < kBarWidth && s[static_cast<size_t>(mark)] != '#' && s[static_cast<size_t>(mark)] != '>') {
        s[static_cast<size_t>(mark)] = '|';
    }
    return s;
}

std::string heardLine(const HeardLog& log, CodeSet heardNow, int64_t nowMs) {
    std::string names;
    for (const HeardLog::Entry& e : log.entries()) {
        if (e.code < 0) break;
        char item[96];
        snprintf(item, sizeof item, "code %d (%d Hz) %.1f s ago%s", e.code, codeHz(e.code), (nowMs - e.atMs) / 1000.0,
                 (heardNow & codeBit(e.code)) ? ", sounding" : "");
        names += (names.empty() ? "" : "; ") + std::string(item);
    }
    return "heard: " + (names.empty() ? std::string("-") : names);
}

struct View {
    const BandMeter& bands;
    const HeardLog& log;
    CodeSet heardNow;
    int detection;
    bool hasLevel;  // the decoder takes a detection level
    int bins;
    double elapsed;
    int64_t nowMs;
};

void drawFrame(bool ansi, bool first, const View& v) {
    const char* eol = ansi ? "\x1b[K\n" : "\n";
    std::string frame;
    if (ansi && !first) frame += "\x1b[" + std::to_string(kFrameLines) + "F";  // back to the frame's top
    char line[256];
    const std::string level = v.hasLevel ? "detection level " + std::to_string(v.detection) : "no detection level";
    snprintf(line, sizeof line, "%6.1f s  %s  %s%s", v.elapsed, level.c_str(), v.bins == 0 ? "(nothing in the read-out)" : "",
             eol);
    frame += line;
    snprintf(line, sizeof line, "%-16s %-*s %5s %5s %5s%s", "", kBarWidth, "# now  - floor  > peak (2 s)  | detection",
             "now", "floor", "peak", eol);
    frame += line;
    for (int c = 0; c < kHostCodes; ++c) {
        const BandMeter::Band& b = v.bands.band(c);
        snprintf(line, sizeof line, "code %2d %5d Hz %s %5.1f %5.1f %5.1f%s", c, codeHz(c), bar(b, v.hasLevel ? v.detection : 0).c_str(),
                 b.now, b.floor, b.peak, eol);
        frame += line;
    }
    snprintf(line, sizeof line, "bars: each code's own bin, floor: its band's noise; codes 23..39 lie above the spectrum%s", eol);
    frame += line;
    frame += heardLine(v.log, v.heardNow, v.nowMs) + eol;
    frame += ansi ? "\x1b[K\n" : "\n";
    outf("%s", frame.c_str());
}

int runMonitor(const CommonOptions& common, const MonitorOptions& o) {
    if (!levelApplies("monitor", o.level, o.decoder)) return 2;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    LiveHearing hearing(session.device(), o.decoder, /*seeAll=*/true);
    Outcome outcome = hearing.applyLevel(o.level);
    // Redraw in place on a terminal; elsewhere (a pipe, a file) frames follow each other.
    bool ansi = hostOutputIsTerminal();
    if (ansi) outf("\x1b[?25l");  // no blinking cursor over the bars

    BandMeter bands;
    HeardLog log;
    FileWatch file(false);
    float levels[korvo::kSpectrumBins] = {};
    int64_t start = monotonicMs();
    int64_t end = o.seconds > 0 ? start + static_cast<int64_t>(o.seconds * 1000.0) : INT64_MAX;
    int64_t nextDraw = start;
    bool first = true;
    for (int64_t now = start; outcome == Outcome::Done && now < end && !file.over(now); now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        log.add(hearing.step(), now);
        const int bins = hearing.seenSpectrum(levels);
        bands.add(levels, now);
        if (now >= nextDraw) {
            drawFrame(ansi, first, {bands, log, hearing.heardNow(), hearing.level(), decoderInfo(o.decoder).takesLevel, bins,
                                       (now - start) / 1000.0, now});
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
        "Live view of the read-out: for each code, the level of its own bin as a bar with the peak held for 2 s "
        "and its band's noise floor, the detection level as a line, and the codes heard with their age; Ctrl-C "
        "ends it.");
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
