// The plug-in and the platform stand-in read their settings from the environment;
// the host sets it before it loads the plug-in.
#pragma once
#include <string>

#include "host/core/Options.h"

namespace korvo {
namespace host {

// Sets KORVO_MIC, KORVO_SPEAKER and the platform log variables from the options,
// and checks the routes that the environment already names. False with a
// one-line reason when a route text is not valid.
bool applyEnvironment(const CommonOptions& common, std::string* error);
// Whether the settings every command reads from the environment are usable (a log level
// the platform knows); false with a one-line reason.
bool checkSettings(std::string* error);
// Only the platform log's part of it: stderr with -v, silent otherwise.
void applyLogSettings(int verbose);

}  // namespace host
}  // namespace korvo
