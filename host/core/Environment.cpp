#include "host/core/Environment.h"

#include "host/output/Output.h"

#include <cstdlib>

#include <korvo/platform/Log.h>
#include <korvo/platform/Routes.h>

namespace korvo {
namespace host {
namespace {

bool applyRoute(const char* variable, const std::string& option, std::string* error) {
    if (!option.empty()) setenv(variable, option.c_str(), 1);
    const char* text = getenv(variable);
    if (text == nullptr || *text == '\0') return true;  // the platform's default route
    std::string why;
    if (!korvo::platform::validateRoute(text, &why)) {
        if (error) *error = std::string(variable) + ": " + why;
        return false;
    }
    return true;
}

}  // namespace

void applyLogSettings(int verbose) {
    if (verbose > 0) {
        setenv("KORVO_LOG", "stderr", 1);
        setenv("KORVO_LOG_LEVEL", verbose > 1 ? "V" : "D", 1);
    } else {
        // Silent terminal without -v; a log file the user asked for is still written.
        const char* target = getenv("KORVO_LOG");
        bool toFile = target != nullptr && *target != '\0' && std::string(target) != "stderr" &&
                      std::string(target) != "off";
        if (!toFile) setenv("KORVO_LOG", "off", 1);
    }
    korvo::platform::reloadLogConfig();
}

bool checkSettings(std::string* error) {
    // The log's levels, as the platform reads them: a setting it would ignore is an error here.
    const char* level = getenv("KORVO_LOG_LEVEL");
    if (level != nullptr && *level != '\0' &&
        !(level[1] == '\0' && std::string("VDIWEFvdiwef").find(level[0]) != std::string::npos)) {
        *error = "KORVO_LOG_LEVEL: '" + std::string(level) + "' is not a log level (V, D, I, W, E or F)";
        return false;
    }
    return true;
}

bool applyEnvironment(const CommonOptions& common, std::string* error) {
    if (!applyRoute("KORVO_MIC", common.mic, error)) return false;
    if (!applyRoute("KORVO_SPEAKER", common.speaker, error)) return false;
    if (korvo::platform::speakerRoute() == "wav:-") moveHostOutputToStderr();
    applyLogSettings(common.verbose);
    return true;
}

}  // namespace host
}  // namespace korvo
