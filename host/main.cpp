// soundmeter: a host of the korvo_soundmeter plug-in. It loads the plug-in with
// dlopen and drives it only through its factory, its interface and its destroy
// function, as a product embedding the plug-in would.
#include <csignal>
#include <cstring>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "host/output/CodePlan.h"
#include "host/core/Environment.h"
#include "host/base/Interrupt.h"
#include "host/core/Options.h"
#include "host/output/Output.h"

using namespace korvo::host;

namespace {

void addCommonFlags(CLI::App* app, CommonOptions& common) {
    app->add_flag("-v,--verbose", common.verbose,
                  "platform log on stderr (-v: debug, -vv: verbose) and the plug-in's own stdout lines");
    app->add_flag("-q,--quiet", common.quiet, "print only results and errors");
    app->add_flag("--json", common.json, "print one JSON object per event (heard, said, exchange, summary, picture)");
    app->add_option("--plugin", common.plugin,
                    "plug-in to load (default: KORVO_PLUGIN, else ../lib/libkorvo_soundmeter.so next to "
                    "this program)");
}

}  // namespace

int main(int argc, char** argv) {
    initHostOutput();
    installInterruptHandlers();

    CLI::App app{"Exchanges small numeric tone codes by sound through the korvo_soundmeter plug-in.",
                 "soundmeter"};
    app.footer(kReachText);  // inherited by the subcommands added below
    app.set_version_flag("--version", std::string("soundmeter ") + KORVO_VERSION);
    app.require_subcommand(1);

    CommonOptions common;
    addCommonFlags(&app, common);
    std::vector<Command> commands = {
        addDemoCommand(app, common),   addListenCommand(app, common),    addSayCommand(app, common),
        addSweepCommand(app, common),  addHandshakeCommand(app, common), addMonitorCommand(app, common),
        addDevicesCommand(app, common), addScanCommand(app, common),    addCalibrateCommand(app, common),
        addSpectrogramCommand(app, common),
    };
    for (Command& c : commands) addCommonFlags(c.app, common);
    readWholeNumbersAsDecimal(app);

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
        if (e.get_exit_code() == 0) return app.exit(e);  // --help, --version
        // Bad usage: one line on stderr, status 2.
        std::vector<std::string> rest = app.remaining();
        if (app.get_subcommands().empty() && !rest.empty()) {
            if (rest.front().rfind("-", 0) == 0) {
                errf("unknown option '%s'", rest.front().c_str());
            } else {
                errf("unknown command '%s' (expected demo, listen, say, sweep, handshake, monitor, devices, scan, calibrate or spectrogram)",
                     rest.front().c_str());
            }
        } else {
            errf("%s", e.what());
        }
        return 2;
    }
    if (common.quiet && common.json) {
        errf("-q and --json cannot be used together");
        return 2;
    }
    std::string unusable;
    if (!checkSettings(&unusable)) {
        errf("%s", unusable.c_str());
        return 2;
    }
    setOutputMode(common.json ? OutputMode::Json : common.quiet ? OutputMode::Quiet : OutputMode::Normal);
    for (Command& c : commands) {
        if (!c.app->parsed()) continue;
        const int status = c.action();
        // Ctrl-C and SIGTERM end every command the same way, with one line.
        if (interrupted()) {
            const bool term = interruptSignal() == SIGTERM;
            if (!interruptionsLeftToParent()) interruptionLine(term ? "terminated" : "interrupted");
            return term ? 143 : 130;
        }
        // Results that never reached standard output are a failure, not a success.
        if (const int error = hostOutputError()) {
            errf("standard output: cannot write: %s", strerror(error));
            return status == 0 ? 1 : status;
        }
        return status;
    }
    return 2;
}
