// Options shared by every command, and the hooks by which commands register.
#pragma once
#include <functional>
#include <string>

namespace CLI {
class App;
}

namespace korvo {
namespace host {

struct CommonOptions {
    std::string plugin;   // --plugin; empty: KORVO_PLUGIN or the default path
    int verbose = 0;      // -v: platform log at D on stderr, -vv: at V
    std::string mic;      // --mic; empty: KORVO_MIC as the environment has it
    std::string speaker;  // --speaker; empty: KORVO_SPEAKER as the environment has it
};

// Runs the parsed command; returns the exit status.
using Action = std::function<int()>;

struct Command {
    CLI::App* app = nullptr;
    Action action;
};

// Adds --mic and --speaker, checked as ROUTE texts; the defaults are named in their help.
void addRouteOptions(CLI::App* sub, CommonOptions& common, const char* micDefault = "KORVO_MIC, else null",
                     const char* speakerDefault = "KORVO_SPEAKER, else null");

Command addDemoCommand(CLI::App& app, CommonOptions& common);
Command addListenCommand(CLI::App& app, CommonOptions& common);
Command addSayCommand(CLI::App& app, CommonOptions& common);
Command addSweepCommand(CLI::App& app, CommonOptions& common);
Command addHandshakeCommand(CLI::App& app, CommonOptions& common);
Command addMonitorCommand(CLI::App& app, CommonOptions& common);

}  // namespace host
}  // namespace korvo
