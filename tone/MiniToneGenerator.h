// Tone generator engine: plays one tone of the tone table at a time on an
// output track, through a state machine shared by the caller's thread and the
// track's playback callback. The tone table and the code plan look-ups are
// static members of the same class.
#pragma once
#include <pthread.h>
#include <time.h>

#include <atomic>
#include <cstddef>
#include <cstdint>

#include <media/AudioTrack.h>
#include <system/audio.h>
#include <utils/KeyedVector.h>
#include <utils/StrongPointer.h>

#include "detection/ToneCodePlan.h"
#include "interface/Export.h"

namespace android {

class MiniToneGenerator {
public:
    static constexpr unsigned int TONEGEN_INF = korvo::plan::kToneForever;
    static constexpr unsigned int TONE_CODE_END = korvo::plan::kEndCode;
    static constexpr int FREQ_CODE_END = korvo::plan::kEndFreqCode;
    static constexpr int NUM_TONE_DESCRIPTORS = korvo::plan::kTableRecords;
    static constexpr int NUM_SEGMENTS = korvo::plan::kSegments;
    // Output rates the wave generators can take: they hold the rate in 16 bits.
    static constexpr uint32_t MAX_SAMPLING_RATE = 65535;

    enum tone_state {
        TONE_IDLE = 0,
        TONE_INIT = 1,
        TONE_STARTING = 2,
        TONE_PLAYING = 3,
        TONE_STOPPING = 4,
        TONE_STOPPED = 5,
        TONE_RESTARTING = 6,
        TONE_REINIT = 7,
    };

    // The tone table's records (the code plan's own types).
    using ToneSegment = android::ToneSegment;
    using ToneDescriptor = android::ToneDescriptor;

    // Sine oscillator in fixed point; adds its samples into a 16-bit buffer.
    class WaveGenerator {
    public:
        enum gen_command {
            WAVEGEN_START = 0,
            WAVEGEN_CONT = 1,
            WAVEGEN_STOP = 2,
        };
        WaveGenerator(unsigned short samplingRate, unsigned short frequency, float volume);
        ~WaveGenerator();
        // Real-time: no allocation, no locking.
        void getSamples(short* outBuffer, unsigned int count, unsigned int command);

        short mA1_Q14;
        short mS1;
        short mS2;
        short mS2_0;
        short mAmplitude_Q15;
    };

    MiniToneGenerator(audio_stream_type_t streamType, float volume, bool threadCanCallJava);
    ~MiniToneGenerator();

    bool startTone(int toneType, int durationMs = -1);
    void stopTone();
    void clearAudioTrack();
    bool initAudioTrack();

    // The tone table and the code plan (ToneCodePlanMembers.cpp forwards to the plan's functions).
    static KORVO_EXPORT ToneDescriptor sToneDescriptors[NUM_TONE_DESCRIPTORS];
    static int generateToneTable_ZORV();
    static int generateToneTable();
    static int getFreqTableSize();
    int getMaxToneIndex();
    static int getFreqCodeFromIndex(int index);
    static int getCodeFromTwoFreq(int first, int second);
    static void fixFreq(int* first, int* second);

    // Playback callback side. audioCallback runs on the track's playback thread:
    // it must not allocate (except in prepareWave during a restart) and holds mLock
    // only for one block at a time.
    static void audioCallback(int event, void* user, void* info);
    bool prepareWave();
    void clearWaveGens();
    unsigned int numWaves(unsigned int segmentIdx);

    // Fields, in the order of the engine's data model.
    uint32_t mMaxToneIndex;
    bool mThreadCanCallRuntime;
    uint32_t mTotalSmp;
    uint32_t mNextSegSmp;
    uint32_t mMaxSmp;
    int32_t mDurationMs;
    uint16_t mCurSegment;
    // Read without mLock by startTone's re-init test: relaxed atomic of the same width.
    std::atomic<uint16_t> mState;
    const ToneDescriptor* mpToneDesc;
    const ToneDescriptor* mpNewToneDesc;
    uint16_t mLoopCounter;
    uint32_t mSamplingRate;
    sp<AudioTrack> mpAudioTrack;
    pthread_mutex_t mLock;
    pthread_cond_t mWaitCbkCond;
    float mVolume;
    audio_stream_type_t mStreamType;
    uint32_t mProcessSize;
    struct timespec mStartTime;
    KeyedVector<unsigned short, WaveGenerator*> mWaveGens;
};

static_assert(offsetof(MiniToneGenerator::ToneDescriptor, code) == 208, "ToneDescriptor layout");
static_assert(offsetof(MiniToneGenerator::ToneDescriptor, freq_code) == 212, "ToneDescriptor layout");

}  // namespace android
