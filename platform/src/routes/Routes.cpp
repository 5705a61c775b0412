// The route registry: parses ROUTE texts against the backend table and keeps the routes in
// force for the process.
#include <korvo/platform/Routes.h>

#include <cstdlib>

#include "routes/RouteBackend.h"

namespace korvo {
namespace platform {

CaptureRoute::~CaptureRoute() = default;
OutputRoute::~OutputRoute() = default;

namespace {

constexpr uint32_t kDefaultOutputRate = 44100;

struct RouteText {
    const RouteBackend* backend = nullptr;
    std::string arg;  // what follows the backend's prefix; empty for a bare route
};

bool startsWith(const std::string& s, const std::string& prefix, std::string* rest) {
    if (s.compare(0, prefix.size(), prefix) != 0) return false;
    *rest = s.substr(prefix.size());
    return true;
}

// "null, wav:PATH, sim:ROOM or card[:DEVICE]"
std::string expectedRoutes() {
    const auto& backends = routeBackends();
    std::string list;
    for (size_t i = 0; i < backends.size(); ++i) {
        if (i > 0) list += i + 1 == backends.size() ? " or " : ", ";
        list += backends[i]->usage;
    }
    return list;
}

bool parse(const std::string& route, RouteText* out, std::string* error) {
    for (const RouteBackend* backend : routeBackends()) {
        std::string rest;
        if (backend->bare && route == backend->name) {
            out->backend = backend;
            out->arg.clear();
            return true;
        }
        if (backend->needs && startsWith(route, std::string(backend->name) + ":", &rest)) {
            if (rest.empty()) {
                if (error) *error = "audio route '" + route + "' needs " + backend->needs;
                return false;
            }
            out->backend = backend;
            out->arg = rest;
            return true;
        }
    }
    if (error) *error = "unknown audio route '" + route + "' (expected " + expectedRoutes() + ")";
    return false;
}

std::string envRoute(const char* name) {
    const char* v = std::getenv(name);
    return v && v[0] ? std::string(v) : std::string("null");
}

bool checkRoute(const std::string& route, bool speaker, std::string* reason) {
    RouteText t;
    if (!parse(route, &t, reason)) return false;
    std::string cause;
    const bool ok = t.backend->check(t.arg, speaker, &cause);
    if (!ok && reason) *reason = route + ": " + cause;
    return ok;
}

}  // namespace

std::unique_ptr<CaptureRoute> makeCaptureRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return nullptr;
    return t.backend->openCapture(t.arg, error);
}

std::unique_ptr<OutputRoute> makeOutputRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return nullptr;
    return t.backend->openOutput(t.arg, error);
}

bool checkCaptureRoute(const std::string& route, std::string* reason) { return checkRoute(route, false, reason); }

bool checkOutputRoute(const std::string& route, std::string* reason) { return checkRoute(route, true, reason); }

int routeRoomSpeakers(const std::string& route, const std::vector<pid_t>& ours, std::string* reason) {
    RouteText t;
    if (!parse(route, &t, reason)) return -1;
    if (!t.backend->roomSpeakers) return 0;
    std::string cause;
    const int speakers = t.backend->roomSpeakers(t.arg, ours, &cause);
    if (speakers < 0 && reason) *reason = route + ": " + cause;
    return speakers;
}

bool validateRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return false;
    // The argument is checked here too (a room name), so that a host refuses it before
    // anything opens.
    return t.backend->validate ? t.backend->validate(t.arg, error) : true;
}

std::string micRoute() { return envRoute("KORVO_MIC"); }

std::string speakerRoute() { return envRoute("KORVO_SPEAKER"); }

// Every route runs at 44100 Hz: a wav file takes the track's rate, the room and the card
// are opened at 44100.
uint32_t outputRateOf(const std::string& /*route*/) { return kDefaultOutputRate; }

}  // namespace platform
}  // namespace korvo
