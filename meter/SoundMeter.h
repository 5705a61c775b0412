// The meter object: the one concrete class behind SoundMeter_vir. It holds the
// capture settings and five-frame ring, the capture stream, the tone generator
// and the handshake state. The analysis thread is process-wide (WF_Thread).
// Capture stays in capture/ (the ring is a field of this object); every other
// member is defined in meter/, in the file each group below names.
#pragma once
#include <atomic>
#include <cstdint>

#include <media/AudioRecord.h>
#include <utils/StrongPointer.h>

#include "interface/SoundMeterConstants.h"
#include "interface/SoundMeter_vir.h"

namespace android {
class MiniToneGenerator;
}

class SoundMeter : public SoundMeter_vir {
public:
    SoundMeter();
    ~SoundMeter() override;

    // Tone generator ownership: meter/ToneGeneratorOwnership.cpp.
    void makeToneGenerator(audio_stream_type_t streamType) override;
    void releaseToneGenerator() override;
    // Capture: capture/CaptureStream.cpp and capture/CaptureLoop.cpp.
    void processAudio() override;
    void stopAudio() override;
    int getRecordState() override;
    void startRecord() override;
    void stopRecord() override;
    // Analysis thread ownership and its forwarders: meter/AnalysisThreadOwnership.cpp.
    void setActive(bool on) override;
    int getDetectionLevel() override;
    void setDetectionLevel(int level) override;
    void start_wf_thread() override;
    void end_wf_thread() override;
    bool getStateWFthread() override;
    int getSpectrumData(float* out) override;
    int getSpectrumData_zorv(float* out) override;
    // Construction and accessors: meter/SoundMeter.cpp.
    void setNeedAck(bool on) override;
    void setRole(int mask) override;
    int getRole() override;
    int getCount() override;
    // Handshake: meter/Handshake.cpp.
    void SayAllFreqIndex(int durationMs) override;
    void SayFreqIdx(int toneIndex, int durationMs) override;
    int SayString(char* text) override;
    int HearAndResponse() override;
    int HearFreqIdx(int toneIndex) override;
    void stopFreqTone() override;
    void setSpeakerState(int state) override;
    // Detection and voting, forwarded to detection/: meter/DetectionForwarders.cpp.
    float detectPeakFreq(float* spectrum, int start, int* index) override;
    float detectPeakFreq_zorv(float* spectrum, int start, int* index) override;
    float detectSecondPeakFreq_zorv(float* spectrum, int first, int* index) override;
    void detectTwoPeakFreq(float unused, float* spectrum, int* first, int* second) override;
    void detectTwoPeakFreq_zorv(float unused, float* spectrum, int* first, int* second) override;
    void detectTwoPeakFrame(int* frames, int* first, int* second) override;

    // Non-virtual members, also in meter/DetectionForwarders.cpp: code plan look-ups and the vote.
    void fixFreq(int* first, int* second);
    int getCodeFromTwoFreq(int first, int second);
    int getFreqCodeFromIndex(int index);
    int getFrequentIndex(int* frames, int row);

    // Fields, in the order of the meter object's data model. Public so that the
    // tests can check them; the host only ever sees SoundMeter_vir.
    int32_t sampleRate;
    int32_t bufferSize;
    int32_t frameSamples;
    int64_t sleep;
    int16_t pcmRing[korvo::kRingSamples];
    // Reset by stopRecord, possibly on another thread while a capture step runs: relaxed atomics.
    std::atomic<int32_t> ringIndex;
    std::atomic<int32_t> frameFill;
    int32_t prepareCountdown;
    int32_t count;
    int32_t need_ack;
    int32_t last_said;
    int32_t last_heard;
    int32_t listener_state;
    int32_t speaker_state;
    // Written by stopRecord on any thread while the capture step reads it: relaxed atomic.
    std::atomic<int32_t> recordState;
    int32_t fillAtRead;
    int32_t frameRemaining;
    int32_t role;
    android::sp<android::AudioRecord> audioRecord;
    android::MiniToneGenerator* toneGenerator;
    int32_t recordFrameCount;
};

// Process-wide values of the sweep, shared by every meter object.
extern int32_t play_sound;
extern int64_t last_play_time;
