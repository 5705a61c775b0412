// Queries of the audio system.
#pragma once
#include <cstdint>

#include <korvo/platform/Export.h>
#include <system/audio.h>
#include <utils/Errors.h>

namespace android {

class KORVO_PLATFORM_API AudioSystem {
public:
    enum sync_event_t {
        SYNC_EVENT_SAME = -1,
        SYNC_EVENT_NONE = 0,
        SYNC_EVENT_PRESENTATION_COMPLETE,
    };
    // Sampling rate of the output that serves the stream type (the speaker route's rate).
    static status_t getOutputSamplingRate(uint32_t* samplingRate,
                                          audio_stream_type_t stream = AUDIO_STREAM_DEFAULT);
};

}  // namespace android
