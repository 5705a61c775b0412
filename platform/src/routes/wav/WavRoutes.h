// The wav route's two halves (WavRoute.cpp reads a recording, WavRecording.cpp writes one),
// joined into one backend record by WavBackend.cpp.
#pragma once
#include <cstdint>
#include <memory>
#include <string>

#include <korvo/platform/Routes.h>

namespace korvo {
namespace platform {

std::unique_ptr<CaptureRoute> makeWavCaptureRoute(const std::string& path, std::string* error);
std::unique_ptr<OutputRoute> makeWavOutputRoute(const std::string& path, std::string* error);

// Whether a route could be used now, leaving nothing behind; false with the cause.
bool checkWavCapture(const std::string& path, std::string* reason);
bool checkWavOutput(const std::string& path, std::string* reason);
// The checks every reader of a recording makes first: it opens, decodes and can be
// converted to `rate`; false with the cause in a few words.
bool checkRecording(const std::string& path, uint32_t rate, std::string* reason);

}  // namespace platform
}  // namespace korvo
