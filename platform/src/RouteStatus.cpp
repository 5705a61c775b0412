#include "RouteStatus.h"

#include <mutex>

namespace korvo {
namespace platform {

namespace {

struct Registry {
    std::mutex lock;
    RouteStatus status[2];
};

// Never destroyed: streams may report while the process exits.
Registry& registry() {
    static Registry* r = new Registry;
    return *r;
}

RouteStatus copyOf(detail::Stream stream) {
    Registry& r = registry();
    std::lock_guard<std::mutex> lock(r.lock);
    return r.status[static_cast<int>(stream)];
}

}  // namespace

namespace detail {

void noteRoute(Stream stream, const std::string& route) {
    Registry& r = registry();
    std::lock_guard<std::mutex> lock(r.lock);
    r.status[static_cast<int>(stream)] = RouteStatus{};
    r.status[static_cast<int>(stream)].route = route;
}

void noteFailure(Stream stream, const std::string& reason) {
    Registry& r = registry();
    std::lock_guard<std::mutex> lock(r.lock);
    RouteStatus& s = r.status[static_cast<int>(stream)];
    if (s.failed) return;
    s.failed = true;
    s.reason = reason.empty() ? s.route + ": failed" : reason;
}

void noteProgress(const SourceProgress& progress) {
    Registry& r = registry();
    std::lock_guard<std::mutex> lock(r.lock);
    r.status[static_cast<int>(Stream::Microphone)].progress = progress;
}

}  // namespace detail

RouteStatus microphoneStatus() { return copyOf(detail::Stream::Microphone); }

RouteStatus speakerStatus() { return copyOf(detail::Stream::Speaker); }

}  // namespace platform
}  // namespace korvo
