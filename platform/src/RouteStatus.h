// The process's route status: what the microphone and speaker streams report about
// their routes, for hosts to ask (korvo::platform::microphoneStatus/speakerStatus).
#pragma once
#include <string>

#include <korvo/platform/Routes.h>

namespace korvo {
namespace platform {
namespace detail {

enum class Stream { Microphone, Speaker };

// A stream took this route: a fresh status, nothing failed.
void noteRoute(Stream stream, const std::string& route);
// The route failed; `reason` names the route and the cause. The first reason stays
// until the stream takes a route again.
void noteFailure(Stream stream, const std::string& reason);
void noteProgress(const SourceProgress& progress);

}  // namespace detail
}  // namespace platform
}  // namespace korvo
