// The table of audio route backends: adding a route is a folder and a line here.
#include "routes/RouteBackend.h"

namespace korvo {
namespace platform {

extern const RouteBackend kNullBackend;  // null/
extern const RouteBackend kWavBackend;   // wav/
extern const RouteBackend kSimBackend;   // sim/
extern const RouteBackend kCardBackend;  // card/

const std::vector<const RouteBackend*>& routeBackends() {
    static const std::vector<const RouteBackend*> kBackends = {&kNullBackend, &kWavBackend, &kSimBackend,
                                                               &kCardBackend};
    return kBackends;
}

}  // namespace platform
}  // namespace korvo
