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

void addRouteOptions(CLI::App* sub, CommonOptions& common) {
    sub->add_option("--mic", common.mic,
                    "microphone ROUTE: null, wav:PATH, sim:ROOM or card[:DEVICE] (default: KORVO_MIC, else null)")
        ->check(routeValidator());
    sub->add_option("--speaker", common.speaker,
                    "speaker ROUTE: null, wav:PATH, sim:ROOM or card[:DEVICE] (default: KORVO_SPEAKER, else null)")
        ->check(routeValidator());
}

}  // namespace host
}  // namespace korvo
