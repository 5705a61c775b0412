// The routes a command uses: checked before it starts, watched while it runs.
#pragma once
#include <cstdint>
#include <string>

namespace korvo {
namespace host {

struct RouteUse {
    bool mic = false;
    bool speaker = false;
};

// Checks the routes in force (KORVO_MIC, KORVO_SPEAKER) that the command uses. 0 when
// they can be used; otherwise one line naming the route and the reason was printed
// and the result is 2.
int checkRoutes(RouteUse use);
// The same for routes given as texts (a command that hands them to devices of its own).
int checkRouteTexts(RouteUse use, const std::string& mic, const std::string& speaker);

// Watches the routes in use while a command runs.
class RouteWatch {
public:
    explicit RouteWatch(RouteUse use = {}) : mUse(use) {}
    // True once a route in use has failed, the line naming it printed once. Asks the
    // platform at most every 100 ms, so it may be called in every loop.
    bool failed();

private:
    RouteUse mUse;
    int64_t mNextLookMs = 0;
    bool mFailed = false;
};

}  // namespace host
}  // namespace korvo
