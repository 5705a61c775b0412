#include "host/core/Options.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstdio>
#include <map>

#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/output/Output.h"

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

void readWholeNumbersAsDecimal(CLI::App& app) {
    // "010" is ten, as a person means it, not eight; a sign and digits only ("0x10" is refused).
    const CLI::Validator decimal(
        [](std::string& text) -> std::string {
            size_t at = text.size() > 1 && (text[0] == '-' || text[0] == '+') ? 1 : 0;
            if (at == text.size() || text.find_first_not_of("0123456789", at) != std::string::npos) {
                return "'" + text + "' is not a whole number";
            }
            const size_t first = std::min(text.find_first_not_of('0', at), text.size() - 1);
            text = (text[0] == '-' ? "-" : "") + text.substr(first);
            return {};
        },
        "", "decimal");
    for (CLI::App* sub : app.get_subcommands([](CLI::App*) { return true; })) {
        for (CLI::Option* option : sub->get_options([](CLI::Option*) { return true; })) {
            // "INT" or "UINT", followed by its checks' descriptions ("INT:INT in [0 - 39]").
            const std::string type = option->get_type_name();
            const size_t end = type.find(':');
            const std::string base = type.substr(0, end);
            if (base == "INT" || base == "UINT") option->transform(decimal);  // runs before the other checks
        }
    }
}

void addLevelOption(CLI::App* sub, LevelChoice* level, const char* help, bool allowAuto) {
    std::string text = help;
    if (allowAuto) text += "; auto: listen to the room first and take the level it proposes (as calibrate)";
    sub->add_option_function<std::string>(
           "--level",
           [level](const std::string& v) {
               level->given = true;
               level->automatic = v == "auto";
               if (!level->automatic) level->value = std::stoi(v);
           },
           text)
        ->type_name(allowAuto ? "LEVEL|auto" : "LEVEL")
        ->check(CLI::Validator(
            [allowAuto](std::string& v) -> std::string {
                if (allowAuto && v == "auto") return {};
                char* end = nullptr;
                const long n = std::strtol(v.c_str(), &end, 10);
                if (end == v.c_str() || *end != '\0') return "'" + v + "' is not a whole number" + (allowAuto ? " or auto" : "");
                if (n < kMinLevel || n > kMaxLevel) {
                    return "'" + v + "' is not within " + std::to_string(kMinLevel) + ".." + std::to_string(kMaxLevel);
                }
                return {};
            },
            "", "level"));
}

CLI::Option* addCodesOption(CLI::App* sub, CodeRange* codes, const char* help) {
    return sub->add_option_function<std::string>(
           "--codes",
           [codes](const std::string& v) {
               const size_t dots = v.find("..");
               codes->lo = std::stoi(v.substr(0, dots));
               codes->hi = std::stoi(v.substr(dots + 2));
           },
           help)
        ->type_name("LO..HI")
        ->default_str(CodeRange{}.text())
        ->check(CLI::Validator(
            [](std::string& v) -> std::string {
                const size_t dots = v.find("..");
                int lo = -1, hi = -1;
                char rest = 0;
                const bool form = dots != std::string::npos && std::sscanf(v.c_str(), "%d..%d%c", &lo, &hi, &rest) == 2 &&
                                  v.find_first_not_of("0123456789.") == std::string::npos;
                if (!form) return "'" + v + "' is not a range of codes LO..HI";
                if (lo < 0 || hi >= kBuiltinCodes || hi - lo + 1 < 3) {
                    return "'" + v + "' is not at least three codes within 0.." + std::to_string(kBuiltinCodes - 1);
                }
                return {};
            },
            "", "codes"));
}

void addDecoderOption(CLI::App* sub, DecoderKind* decoder) {
    std::map<std::string, DecoderKind> kinds;
    std::string help = "how codes are heard:";
    int count = 0;
    const DecoderInfo* table = decoderTable(&count);
    for (int i = 0; i < count; ++i) {
        kinds.emplace(table[i].name, table[i].kind);
        help += std::string(i == 0 ? " " : "; ") + table[i].name + " (" + table[i].help + ")";
    }
    sub->add_option("--decoder", *decoder, help)->transform(CLI::CheckedTransformer(kinds))->default_str(decoderName(*decoder));
}

bool levelApplies(const char* command, const LevelChoice& level, DecoderKind decoder) {
    if (!level.given || decoderInfo(decoder).takesLevel) return true;
    errf("%s: --level does not apply to the %s decoder: it compares each code with the noise around it and "
         "takes no detection level",
         command, decoderName(decoder));
    return false;
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
