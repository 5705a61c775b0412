// Audio system queries of the stand-in.
#include <media/AudioSystem.h>

#include <korvo/platform/Routes.h>

#include "TrackShared.h"

namespace android {

status_t AudioSystem::getOutputSamplingRate(uint32_t* samplingRate, audio_stream_type_t stream) {
    if (samplingRate == nullptr) return BAD_VALUE;
    korvo::platform::detail::TrackControl& tc = korvo::platform::detail::trackControl();
    status_t forced = tc.failRate.load(std::memory_order_relaxed);
    if (forced != OK) return forced;
    uint32_t rate = tc.outputRate.load(std::memory_order_relaxed);
    // Every stream type is served by the one speaker route.
    *samplingRate = rate != 0 ? rate : korvo::platform::outputRateOf(korvo::platform::speakerRoute());
    return OK;
}

}  // namespace android
