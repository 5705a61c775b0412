// Audio types and constants of the device platform (numbering as on the device).
#pragma once
#include <cstdint>

typedef enum {
    AUDIO_STREAM_DEFAULT = -1,
    AUDIO_STREAM_VOICE_CALL = 0,
    AUDIO_STREAM_SYSTEM = 1,
    AUDIO_STREAM_RING = 2,
    AUDIO_STREAM_MUSIC = 3,
    AUDIO_STREAM_ALARM = 4,
    AUDIO_STREAM_NOTIFICATION = 5,
    AUDIO_STREAM_BLUETOOTH_SCO = 6,
    AUDIO_STREAM_ENFORCED_AUDIBLE = 7,
    AUDIO_STREAM_DTMF = 8,
    AUDIO_STREAM_TTS = 9,
    AUDIO_STREAM_ACCESSIBILITY = 10,
} audio_stream_type_t;

typedef enum {
    AUDIO_SOURCE_DEFAULT = 0,
    AUDIO_SOURCE_MIC = 1,
    AUDIO_SOURCE_VOICE_UPLINK = 2,
    AUDIO_SOURCE_VOICE_DOWNLINK = 3,
    AUDIO_SOURCE_VOICE_CALL = 4,
    AUDIO_SOURCE_CAMCORDER = 5,
    AUDIO_SOURCE_VOICE_RECOGNITION = 6,
    AUDIO_SOURCE_VOICE_COMMUNICATION = 7,
} audio_source_t;

typedef enum : uint32_t {
    AUDIO_FORMAT_INVALID = 0xFFFFFFFFu,
    AUDIO_FORMAT_DEFAULT = 0,
    AUDIO_FORMAT_PCM_16_BIT = 0x1,
    AUDIO_FORMAT_PCM_8_BIT = 0x2,
    AUDIO_FORMAT_PCM_32_BIT = 0x3,
    AUDIO_FORMAT_PCM_8_24_BIT = 0x4,
    AUDIO_FORMAT_PCM_FLOAT = 0x5,
    AUDIO_FORMAT_AMR_NB = 0x04000000u,
    AUDIO_FORMAT_AMR_WB = 0x05000000u,
} audio_format_t;

typedef uint32_t audio_channel_mask_t;
enum : uint32_t {
    AUDIO_CHANNEL_NONE = 0x0,
    AUDIO_CHANNEL_OUT_MONO = 0x1,
    AUDIO_CHANNEL_OUT_STEREO = 0x3,
    AUDIO_CHANNEL_IN_LEFT = 0x4,
    AUDIO_CHANNEL_IN_RIGHT = 0x8,
    AUDIO_CHANNEL_IN_STEREO = 0xC,
    AUDIO_CHANNEL_IN_MONO = 0x10,
    AUDIO_CHANNEL_INDEX_HDR = 0x80000000u,
};

typedef enum {
    AUDIO_INPUT_FLAG_NONE = 0x0,
    AUDIO_INPUT_FLAG_FAST = 0x1,
} audio_input_flags_t;

typedef enum {
    AUDIO_OUTPUT_FLAG_NONE = 0x0,
    AUDIO_OUTPUT_FLAG_DIRECT = 0x1,
    AUDIO_OUTPUT_FLAG_PRIMARY = 0x2,
    AUDIO_OUTPUT_FLAG_FAST = 0x4,
    AUDIO_OUTPUT_FLAG_DEEP_BUFFER = 0x8,
} audio_output_flags_t;

typedef enum {
    AUDIO_SESSION_ALLOCATE = 0,
    AUDIO_SESSION_NONE = 0,
} audio_session_t;

typedef struct {
    int32_t content_type;
    int32_t usage;
    int32_t source;
    uint32_t flags;
    char tags[256];
} audio_attributes_t;

typedef struct {
    uint16_t version;
    uint16_t size;
    uint32_t sample_rate;
    audio_channel_mask_t channel_mask;
    audio_format_t format;
    audio_stream_type_t stream_type;
    uint32_t bit_rate;
    int64_t duration_us;
    bool has_video;
    bool is_streaming;
} audio_offload_info_t;
