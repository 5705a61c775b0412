#include "host/core/RouteGuard.h"

#include <korvo/platform/Routes.h>

#include "host/base/Clock.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

namespace {
constexpr int64_t kLookEveryMs = 100;
}  // namespace

int checkRoutes(RouteUse use) { return checkRouteTexts(use, korvo::platform::micRoute(), korvo::platform::speakerRoute()); }

int checkRouteTexts(RouteUse use, const std::string& mic, const std::string& speaker) {
    std::string reason;
    if (use.mic && !korvo::platform::checkCaptureRoute(mic, &reason)) {
        errf("microphone %s", reason.c_str());
        return 2;
    }
    if (use.speaker && !korvo::platform::checkOutputRoute(speaker, &reason)) {
        errf("speaker %s", reason.c_str());
        return 2;
    }
    return 0;
}

bool RouteWatch::failed() {
    if (mFailed) return true;
    const int64_t now = monotonicMs();
    if (now < mNextLookMs) return false;
    mNextLookMs = now + kLookEveryMs;
    const korvo::platform::RouteStatus mic = korvo::platform::microphoneStatus();
    const korvo::platform::RouteStatus speaker = korvo::platform::speakerStatus();
    if (mUse.mic && mic.failed) {
        errf("microphone %s", mic.reason.c_str());
        mFailed = true;
    } else if (mUse.speaker && speaker.failed) {
        errf("speaker %s", speaker.reason.c_str());
        mFailed = true;
    }
    return mFailed;
}

}  // namespace host
}  // namespace korvo
