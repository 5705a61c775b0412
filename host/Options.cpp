#include "host/Options.h"

#include <cmath>
#include <cstdlib>

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

std::string number(double v) {
    char text[32];
    snprintf(text, sizeof text, "%g", v);
    return text;
}

}  // namespace

CLI::Validator finiteRange(double lo, double hi) {
    return CLI::Validator(
        [lo, hi](std::string& text) -> std::string {
            char* end = nullptr;
            const double v = std::strtod(text.c_str(), &end);
            if (end == text.c_str() || *end != '\0' || !std::isfinite(v)) return "'" + text + "' is not a number";
            if (v < lo || v > hi) return "'" + text + "' is not within " + number(lo) + ".." + number(hi);
            return {};
        },
        "NUMBER in [" + number(lo) + " - " + number(hi) + "]", "finite range");
}

void addLevelOption(CLI::App* sub, int* level, bool* given, const char* help) {
    sub->add_option_function<int>(
           "--level",
           [level, given](const int& v) {
               *level = v;
               *given = true;
           },
           help)
        ->check(CLI::Range(kMinLevel, kMaxLevel));
}

void addRouteOptions(CLI::App* sub, CommonOptions& common, const char* micDefault, const char* speakerDefault) {
    sub->add_option("--mic", common.mic,
                    std::string("microphone ROUTE: null, wav:PATH (- for stdin), sim:ROOM or card[:DEVICE] "
                                "(default: ") + micDefault + ")")
        ->check(routeValidator());
    sub->add_option("--speaker", common.speaker,
                    std::string("speaker ROUTE: null, wav:PATH (- for stdout), sim:ROOM or card[:DEVICE] "
                                "(default: ") + speakerDefault + ")")
        ->check(routeValidator());
}

}  // namespace host
}  // namespace korvo
