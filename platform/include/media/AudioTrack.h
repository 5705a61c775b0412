// Loudspeaker output track. In callback mode a playback thread of the track
// calls the callback with EVENT_MORE_DATA and a Buffer at the pace of a real
// output; the samples go to the output route of the process (KORVO_SPEAKER,
// see korvo/platform/Routes.h).
#pragma once
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>

#include <binder/IMemory.h>
#include <korvo/platform/Export.h>
#include <system/audio.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>

namespace android {

class KORVO_PLATFORM_API AudioTrack : public RefBase {
public:
    enum event_type {
        EVENT_MORE_DATA = 0,
        EVENT_UNDERRUN = 1,
        EVENT_LOOP_END = 2,
        EVENT_MARKER = 3,
        EVENT_NEW_POS = 4,
        EVENT_BUFFER_END = 5,
    };
    enum transfer_type {
        TRANSFER_DEFAULT,
        TRANSFER_CALLBACK,
        TRANSFER_OBTAIN,
        TRANSFER_SYNC,
        TRANSFER_SHARED,
    };
    // What the callback fills: `size` bytes at `i16`. The callback may lower `size`
    // (0 means it produced nothing).
    class Buffer {
    public:
        size_t frameCount;
        size_t size;
        union {
            void* raw;
            short* i16;
            int8_t* i8;
        };
    };
    typedef void (*callback_t)(int event, void* user, void* info);

    AudioTrack();
    ~AudioTrack() override;

    status_t set(audio_stream_type_t streamType, uint32_t sampleRate, audio_format_t format,
                 audio_channel_mask_t channelMask, size_t frameCount = 0,
                 audio_output_flags_t flags = AUDIO_OUTPUT_FLAG_NONE, callback_t cbf = nullptr,
                 void* user = nullptr, int32_t notificationFrames = 0,
                 const sp<IMemory>& sharedBuffer = nullptr, bool threadCanCallJava = false,
                 audio_session_t sessionId = AUDIO_SESSION_ALLOCATE,
                 transfer_type transferType = TRANSFER_DEFAULT,
                 const audio_offload_info_t* offloadInfo = nullptr, int uid = -1, pid_t pid = -1,
                 const audio_attributes_t* pAttributes = nullptr, bool doNotReconnect = false,
                 float maxRequiredSpeed = 1.0f);
    status_t initCheck() const;
    status_t setVolume(float volume);
    float getVolume() const;
    // Starts the playback thread (callback mode).
    status_t start();
    // Marks the track stopped; never waits for a callback in progress, so it may be
    // called from the callback itself or while the callback waits for a lock.
    void stop();
    bool stopped() const;
    uint32_t getSampleRate() const;

    struct Impl;

private:
    std::unique_ptr<Impl> mImpl;
};

}  // namespace android
