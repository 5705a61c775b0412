// soundmeter devices: what the card route can open.
#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/core/Environment.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {
namespace {

int runDevices(const CommonOptions& common) {
    applyLogSettings(common.verbose);
    std::vector<korvo::platform::CardDevice> devices;
    std::string error;
    if (!korvo::platform::listCardDevices(&devices, &error)) {
        errf("card: %s", error.c_str());
        return 1;
    }
    if (devices.empty()) infof("no sound card devices\n");
    infof("%5s  %-40s %5s %6s %8s  %s\n", "index", "name", "in", "out", "rate", "default");
    for (const auto& d : devices) {
        const std::string defaults = std::string(d.defaultInput ? "input " : "") + (d.defaultOutput ? "output" : "");
        resultf(JsonEvent("device")
                    .add("index", d.index)
                    .add("name", d.name)
                    .add("inputs", d.inputChannels)
                    .add("outputs", d.outputChannels)
                    .add("rate", d.defaultRate)
                    .add("default_input", d.defaultInput)
                    .add("default_output", d.defaultOutput),
                "%5d  %-40s %5d %6d %8.0f  %s\n", d.index, d.name.c_str(), d.inputChannels, d.outputChannels,
                d.defaultRate, defaults.c_str());
    }
    return 0;
}

}  // namespace

Command addDevicesCommand(CLI::App& app, CommonOptions& common) {
    CLI::App* sub = app.add_subcommand(
        "devices", "List the sound card devices that the card route can open (use card:NAME with a part of a name).");
    return {sub, [&common] { return runDevices(common); }};
}

}  // namespace host
}  // namespace korvo
