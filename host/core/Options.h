// Options shared by every command, and the hooks by which commands register.
#pragma once
#include <functional>
#include <string>

#include "host/hearing/Decoder.h"
#include "host/hearing/LevelPower.h"

namespace CLI {
class App;
class Option;
class Validator;
}  // namespace CLI

namespace korvo {
namespace host {

struct CommonOptions {
    std::string plugin;   // --plugin; empty: KORVO_PLUGIN or the default path
    int verbose = 0;      // -v: platform log at D on stderr, -vv: at V
    bool quiet = false;   // -q: only results and errors
    bool json = false;    // --json: one JSON object per event
    std::string mic;      // --mic; empty: KORVO_MIC as the environment has it
    std::string speaker;  // --speaker; empty: KORVO_SPEAKER as the environment has it
};

// Runs the parsed command; returns the exit status:
// 0 success, 1 the job failed, 2 bad usage or an unusable route, 130 after Ctrl-C.
using Action = std::function<int()>;

struct Command {
    CLI::App* app = nullptr;
    Action action;
};

// --level as given: a number, "auto" (calibrate on the room first), or nothing (the
// plug-in's own level stays).
struct LevelChoice {
    bool given = false;
    bool automatic = false;
    int value = 0;
};

// Codes LO..HI of the handshake's 0..17, at least three of them (a code, its answer, the next).
struct CodeRange {
    int lo = 0;
    int hi = kBuiltinCodes - 1;
    int count() const { return hi - lo + 1; }
    std::string text() const { return std::to_string(lo) + ".." + std::to_string(hi); }
};
// --codes LO..HI.
CLI::Option* addCodesOption(CLI::App* sub, CodeRange* codes, const char* help);

// Every whole-number option of every command reads its text as decimal; call once
// the commands are added.
void readWholeNumbersAsDecimal(CLI::App& app);
// Whether --level applies to `decoder`: false after saying why, for exit status 2.
bool levelApplies(const char* command, const LevelChoice& level, DecoderKind decoder);
// A number that is finite and within [lo, hi] ("nan", "inf" and the like are refused).
CLI::Validator finiteRange(double lo, double hi);
// --level L (and "auto" where `allowAuto`).
void addLevelOption(CLI::App* sub, LevelChoice* level, const char* help, bool allowAuto = true);
// --decoder host|builtin.
void addDecoderOption(CLI::App* sub, DecoderKind* decoder);
// Adds --mic and --speaker, checked as ROUTE texts; the defaults are named in their help.
void addRouteOptions(CLI::App* sub, CommonOptions& common, const char* micDefault = "KORVO_MIC, else null",
                     const char* speakerDefault = "KORVO_SPEAKER, else null");

Command addDemoCommand(CLI::App& app, CommonOptions& common);
Command addListenCommand(CLI::App& app, CommonOptions& common);
Command addSayCommand(CLI::App& app, CommonOptions& common);
Command addSweepCommand(CLI::App& app, CommonOptions& common);
Command addHandshakeCommand(CLI::App& app, CommonOptions& common);
Command addMonitorCommand(CLI::App& app, CommonOptions& common);
Command addDevicesCommand(CLI::App& app, CommonOptions& common);
Command addScanCommand(CLI::App& app, CommonOptions& common);
Command addCalibrateCommand(CLI::App& app, CommonOptions& common);
Command addSpectrogramCommand(CLI::App& app, CommonOptions& common);

}  // namespace host
}  // namespace korvo
