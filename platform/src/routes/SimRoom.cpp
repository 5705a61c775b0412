// Placeholder until the simulated room lands.
#include "routes/RouteFactories.h"

namespace korvo {
namespace platform {

std::unique_ptr<CaptureRoute> makeSimCaptureRoute(const std::string&, std::string* error) {
    if (error) *error = "the sim route is not available in this build";
    return nullptr;
}
std::unique_ptr<OutputRoute> makeSimOutputRoute(const std::string&, std::string* error) {
    if (error) *error = "the sim route is not available in this build";
    return nullptr;
}

}  // namespace platform
}  // namespace korvo
