#include "host/Options.h"

#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

namespace korvo {
namespace host {
namespace {

// A ROUTE text as the platform understands it; CLI11 turns the reason into the error line.
CLI::Validator routeValidator() {
    return CLI::Validator(
        [](std::string& text) -> std::string {
            std::string why;
            if (korvo::platform::validateRoute(text, &why)) return {};
            return why.empty() ? "not a valid ROUTE" : why;
        },
        "ROUTE", "route");
}

}  // namespace

void addRouteOptions(CLI::App* sub, CommonOptions& common, const char* micDefault, const char* speakerDefault) {
    sub->add_option("--mic", common.mic,
                    std::string("microphone ROUTE: null, wav:PATH, sim:ROOM or card[:DEVICE] (default: ") +
                        micDefault + ")")
        ->check(routeValidator());
    sub->add_option("--speaker", common.speaker,
                    std::string("speaker ROUTE: null, wav:PATH, sim:ROOM or card[:DEVICE] (default: ") +
                        speakerDefault + ")")
        ->check(routeValidator());
}

}  // namespace host
}  // namespace korvo
