// The route registry: ROUTE texts, their factories and the routes in force for the process.
#include <korvo/platform/Routes.h>

#include <cstdlib>

#include "routes/RouteFactories.h"
#include "routes/SimRoomConfig.h"

namespace korvo {
namespace platform {

CaptureRoute::~CaptureRoute() = default;
OutputRoute::~OutputRoute() = default;

namespace {

constexpr uint32_t kDefaultOutputRate = 44100;

enum class RouteKind { Null, Wav, Sim, Card };

struct RouteText {
    RouteKind kind = RouteKind::Null;
    std::string arg;  // PATH, ROOM or DEV; empty for null and a bare card
};

bool startsWith(const std::string& s, const char* prefix, std::string* rest) {
    const std::string p(prefix);
    if (s.compare(0, p.size(), p) != 0) return false;
    *rest = s.substr(p.size());
    return true;
}

bool parse(const std::string& route, RouteText* out, std::string* error) {
    std::string rest;
    const char* missing = nullptr;
    if (route == "null") {
        out->kind = RouteKind::Null;
    } else if (route == "card") {
        out->kind = RouteKind::Card;
    } else if (startsWith(route, "wav:", &rest)) {
        out->kind = RouteKind::Wav;
        missing = "a file path (wav:PATH)";
    } else if (startsWith(route, "sim:", &rest)) {
        out->kind = RouteKind::Sim;
        missing = "a room name (sim:ROOM)";
    } else if (startsWith(route, "card:", &rest)) {
        out->kind = RouteKind::Card;
        missing = "a device after 'card:' (or plain card for the default one)";
    } else {
        if (error) {
            *error = "unknown audio route '" + route +
                     "' (expected null, wav:PATH, sim:ROOM or card[:DEVICE])";
        }
        return false;
    }
    if (missing && rest.empty()) {
        if (error) *error = "audio route '" + route + "' needs " + missing;
        return false;
    }
    out->arg = rest;
    return true;
}

std::string envRoute(const char* name) {
    const char* v = std::getenv(name);
    return v && v[0] ? std::string(v) : std::string("null");
}

}  // namespace

std::unique_ptr<CaptureRoute> makeCaptureRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return nullptr;
    switch (t.kind) {
        case RouteKind::Null: return makeNullCaptureRoute();
        case RouteKind::Wav: return makeWavCaptureRoute(t.arg, error);
        case RouteKind::Sim: return makeSimCaptureRoute(t.arg, error);
        case RouteKind::Card: return makeCardCaptureRoute(t.arg, error);
    }
    return nullptr;
}

std::unique_ptr<OutputRoute> makeOutputRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return nullptr;
    switch (t.kind) {
        case RouteKind::Null: return makeNullOutputRoute();
        case RouteKind::Wav: return makeWavOutputRoute(t.arg, error);
        case RouteKind::Sim: return makeSimOutputRoute(t.arg, error);
        case RouteKind::Card: return makeCardOutputRoute(t.arg, error);
    }
    return nullptr;
}

namespace {

bool checkRoute(const std::string& route, bool speaker, std::string* reason) {
    RouteText t;
    if (!parse(route, &t, reason)) return false;
    std::string cause;
    bool ok = true;
    switch (t.kind) {
        case RouteKind::Null: break;
        case RouteKind::Wav: ok = speaker ? checkWavOutput(t.arg, &cause) : checkWavCapture(t.arg, &cause); break;
        case RouteKind::Sim: ok = checkSimRoute(t.arg, speaker, &cause); break;
        case RouteKind::Card: ok = checkCardRoute(t.arg, !speaker, &cause); break;
    }
    if (!ok && reason) *reason = route + ": " + cause;
    return ok;
}

}  // namespace

bool checkCaptureRoute(const std::string& route, std::string* reason) { return checkRoute(route, false, reason); }

bool checkOutputRoute(const std::string& route, std::string* reason) { return checkRoute(route, true, reason); }

int routeRoomSpeakers(const std::string& route, const std::vector<pid_t>& ours, std::string* reason) {
    RouteText t;
    if (!parse(route, &t, reason)) return -1;
    if (t.kind != RouteKind::Sim) return 0;
    std::string cause;
    const int speakers = simRoomSpeakers(t.arg, ours, &cause);
    if (speakers < 0 && reason) *reason = route + ": " + cause;
    return speakers;
}

bool validateRoute(const std::string& route, std::string* error) {
    RouteText t;
    if (!parse(route, &t, error)) return false;
    // A room name is checked here too, so that a host refuses it before anything opens.
    if (t.kind == RouteKind::Sim) return sim::validateRoomName(t.arg, error);
    return true;
}

std::string micRoute() { return envRoute("KORVO_MIC"); }

std::string speakerRoute() { return envRoute("KORVO_SPEAKER"); }

// Every route runs at 44100 Hz: a wav file takes the track's rate, the room and the card
// are opened at 44100.
uint32_t outputRateOf(const std::string& /*route*/) { return kDefaultOutputRate; }

}  // namespace platform
}  // namespace korvo
