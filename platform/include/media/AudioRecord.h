// Microphone capture stream. Samples come from the capture route chosen for the
// process (KORVO_MIC, see korvo/platform/Routes.h) or from the test script.
#pragma once
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>

#include <korvo/platform/Export.h>
#include <media/AudioSystem.h>
#include <system/audio.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>

namespace android {

class KORVO_PLATFORM_API AudioRecord : public RefBase {
public:
    enum event_type {
        EVENT_MORE_DATA = 0,
        EVENT_OVERRUN = 1,
        EVENT_MARKER = 2,
        EVENT_NEW_POS = 3,
        EVENT_NEW_IAUDIORECORD = 4,
    };
    enum transfer_type {
        TRANSFER_DEFAULT,
        TRANSFER_CALLBACK,
        TRANSFER_OBTAIN,
        TRANSFER_SYNC,
    };
    typedef void (*callback_t)(int event, void* user, void* info);

    // Smallest frame count accepted for the configuration; 0 on success.
    static status_t getMinFrameCount(size_t* frameCount, uint32_t sampleRate, audio_format_t format,
                                     audio_channel_mask_t channelMask);

    explicit AudioRecord(const String16& opPackageName);
    ~AudioRecord() override;

    status_t set(audio_source_t inputSource, uint32_t sampleRate, audio_format_t format,
                 audio_channel_mask_t channelMask, size_t frameCount = 0, callback_t cbf = nullptr,
                 void* user = nullptr, uint32_t notificationFrames = 0, bool threadCanCallJava = false,
                 audio_session_t sessionId = AUDIO_SESSION_ALLOCATE,
                 transfer_type transferType = TRANSFER_DEFAULT,
                 audio_input_flags_t flags = AUDIO_INPUT_FLAG_NONE, int uid = -1, pid_t pid = -1,
                 const audio_attributes_t* pAttributes = nullptr);
    status_t initCheck() const;

    status_t start(AudioSystem::sync_event_t event = AudioSystem::SYNC_EVENT_NONE,
                   audio_session_t triggerSession = AUDIO_SESSION_NONE);
    // Makes a read blocked on another thread return at once.
    void stop();
    bool stopped() const;

    // Blocking: waits until `size` bytes are there, the stream is stopped, or an error occurs.
    // Returns the byte count delivered or a negative status. Reads are synchronous only:
    // a non-blocking read returns INVALID_OPERATION.
    ssize_t read(void* buffer, size_t size, bool blocking = true);

    size_t frameCount() const;
    size_t frameSize() const;
    uint32_t getSampleRate() const;

    struct Impl;

private:
    std::unique_ptr<Impl> mImpl;
};

}  // namespace android
