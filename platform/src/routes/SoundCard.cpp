// Placeholder until the sound card route lands.
#include "routes/RouteFactories.h"

namespace korvo {
namespace platform {

std::unique_ptr<CaptureRoute> makeCardCaptureRoute(const std::string&, std::string* error) {
    if (error) *error = "the card route is not available in this build";
    return nullptr;
}
std::unique_ptr<OutputRoute> makeCardOutputRoute(const std::string&, std::string* error) {
    if (error) *error = "the card route is not available in this build";
    return nullptr;
}

}  // namespace platform
}  // namespace korvo
