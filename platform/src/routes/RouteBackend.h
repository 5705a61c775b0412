// One audio route backend as the route registry sees it: which ROUTE texts it takes, how it
// opens, checks and counts. Each backend folder (null/, wav/, sim/, card/) defines one record;
// RouteTable.cpp lists them, and Routes.cpp walks that list.
#pragma once
#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

#include <korvo/platform/Routes.h>

namespace korvo {
namespace platform {

struct RouteBackend {
    // The route's name: alone it is the bare route, followed by ':' the prefix of its argument.
    const char* name;
    // How the route is written in the list of expected ones ("wav:PATH").
    const char* usage;
    // Whether the name alone is a route (null, card).
    bool bare;
    // What must follow "name:", for the error of an empty argument; nullptr when the route
    // takes no argument at all (then "name:" is unknown).
    const char* needs;
    // arg: what follows the prefix (empty for a bare route). Null with a one-line reason.
    std::unique_ptr<CaptureRoute> (*openCapture)(const std::string& arg, std::string* error);
    std::unique_ptr<OutputRoute> (*openOutput)(const std::string& arg, std::string* error);
    // Whether the route could be used now as a loudspeaker or a microphone, leaving nothing
    // behind; false with the cause in a few words.
    bool (*check)(const std::string& arg, bool speaker, std::string* cause);
    // Checks of the argument made before anything opens; nullptr when any argument will do.
    bool (*validate)(const std::string& arg, std::string* error);
    // Loudspeakers of other processes (not in `ours`) in the route's room, -1 with a cause;
    // nullptr when the route has no room to share (then 0).
    int (*roomSpeakers)(const std::string& arg, const std::vector<pid_t>& ours, std::string* cause);
};

// The backends in the order the route parser tries them.
const std::vector<const RouteBackend*>& routeBackends();

}  // namespace platform
}  // namespace korvo
