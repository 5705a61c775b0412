// The wav:PATH route: a sound file as the microphone, a recording as the loudspeaker.
#include "routes/RouteBackend.h"
#include "routes/wav/WavRoutes.h"

namespace korvo {
namespace platform {

namespace {

bool checkWav(const std::string& path, bool speaker, std::string* cause) {
    return speaker ? checkWavOutput(path, cause) : checkWavCapture(path, cause);
}

}  // namespace

extern const RouteBackend kWavBackend;
const RouteBackend kWavBackend = {"wav",
                                  "wav:PATH",
                                  false,
                                  "a file path (wav:PATH)",
                                  makeWavCaptureRoute,
                                  makeWavOutputRoute,
                                  checkWav,
                                  nullptr,
                                  nullptr};

}  // namespace platform
}  // namespace korvo
