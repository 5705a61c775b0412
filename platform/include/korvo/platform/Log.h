// Control of the platform log's destination (see log/log.h for the environment it reads).
#pragma once
#include <string>

#include <korvo/platform/Export.h>

namespace korvo {
namespace platform {

// Reads KORVO_LOG and KORVO_LOG_LEVEL again; hosts call it after changing them with setenv.
KORVO_PLATFORM_API void reloadLogConfig();

// Sends the log to `target` ("off", "stderr" or a file path, appended) from priority `level`
// on ('V', 'D', 'I', 'W', 'E' or 'F'), whatever the environment says.
KORVO_PLATFORM_API void setLogTarget(const std::string& target, char level);

}  // namespace platform
}  // namespace korvo
