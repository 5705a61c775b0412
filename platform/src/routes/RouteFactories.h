// Factories of the individual routes, called by the route registry (Routes.cpp).
#pragma once
#include <memory>
#include <string>
#include <vector>

#include <korvo/platform/Routes.h>

namespace korvo {
namespace platform {

std::unique_ptr<CaptureRoute> makeNullCaptureRoute();
std::unique_ptr<OutputRoute> makeNullOutputRoute();
std::unique_ptr<CaptureRoute> makeWavCaptureRoute(const std::string& path, std::string* error);
std::unique_ptr<OutputRoute> makeWavOutputRoute(const std::string& path, std::string* error);
std::unique_ptr<CaptureRoute> makeSimCaptureRoute(const std::string& room, std::string* error);
std::unique_ptr<OutputRoute> makeSimOutputRoute(const std::string& room, std::string* error);
// device: empty for the default device, else a device index or a part of its name.
std::unique_ptr<CaptureRoute> makeCardCaptureRoute(const std::string& device, std::string* error);
std::unique_ptr<OutputRoute> makeCardOutputRoute(const std::string& device, std::string* error);

// Whether a route could be used now, leaving nothing behind; false with the cause.
bool checkWavCapture(const std::string& path, std::string* reason);
// The checks every reader of a recording makes first: it opens, decodes and can be
// converted to `rate`; false with the cause in a few words.
bool checkRecording(const std::string& path, uint32_t rate, std::string* reason);
bool checkWavOutput(const std::string& path, std::string* reason);
bool checkSimRoute(const std::string& room, bool speaker, std::string* reason);
bool checkCardRoute(const std::string& device, bool input, std::string* reason);
int simRoomSpeakers(const std::string& room, const std::vector<pid_t>& ours, std::string* reason);

}  // namespace platform
}  // namespace korvo
