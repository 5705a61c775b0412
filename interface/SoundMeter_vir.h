// The plug-in's public interface. A host compiles against this header, gets a
// meter object from soundMeter_maker() and calls its operations through the
// virtual table; the order of the operations below is part of the interface.
#pragma once
#include <system/audio.h>

#include "Export.h"

class SoundMeter_vir {
public:
    SoundMeter_vir();           // writes "Created" to standard output
    virtual ~SoundMeter_vir();  // writes "deleted" to standard output

    virtual void makeToneGenerator(audio_stream_type_t streamType) = 0;  // 1
    virtual void releaseToneGenerator() = 0;                              // 2
    virtual void processAudio() = 0;                                      // 3
    virtual void setActive(bool on) = 0;                                  // 4
    virtual void setNeedAck(bool on) = 0;                                 // 5
    virtual void setRole(int mask) = 0;                                   // 6
    virtual int getRole() = 0;                                            // 7
    virtual void stopAudio() = 0;                                         // 8
    virtual void SayAllFreqIndex(int durationMs) = 0;                     // 9
    virtual void SayFreqIdx(int toneIndex, int durationMs) = 0;           // 10
    virtual int SayString(char* text) = 0;                                // 11
    virtual int HearAndResponse() = 0;                                    // 12
    virtual int HearFreqIdx(int toneIndex) = 0;                           // 13
    virtual int getCount() = 0;                                           // 14
    virtual int getDetectionLevel() = 0;                                  // 15
    virtual void setDetectionLevel(int level) = 0;                        // 16
    virtual int getSpectrumData(float* out) = 0;                          // 17
    virtual int getSpectrumData_zorv(float* out) = 0;                     // 18
    virtual float detectPeakFreq(float* spectrum, int start, int* index) = 0;             // 19
    virtual float detectPeakFreq_zorv(float* spectrum, int start, int* index) = 0;        // 20
    virtual float detectSecondPeakFreq_zorv(float* spectrum, int first, int* index) = 0;  // 21
    virtual void detectTwoPeakFreq(float unused, float* spectrum, int* first, int* second) = 0;       // 22
    virtual void detectTwoPeakFreq_zorv(float unused, float* spectrum, int* first, int* second) = 0;  // 23
    virtual void detectTwoPeakFrame(int* frames, int* first, int* second) = 0;  // 24
    virtual void start_wf_thread() = 0;                                        // 25
    virtual void end_wf_thread() = 0;                                          // 26
    virtual int getRecordState() = 0;                                          // 27
    virtual void startRecord() = 0;                                            // 28
    virtual void stopRecord() = 0;                                             // 29
    virtual bool getStateWFthread() = 0;                                       // 30
    virtual void stopFreqTone() = 0;                                           // 31
    virtual void setSpeakerState(int state) = 0;                               // 32
};

extern "C" {
// Creates a meter object. Never null (an allocation failure is the allocator's).
KORVO_EXPORT SoundMeter_vir* soundMeter_maker();
// Destroys a meter object made by soundMeter_maker; null does nothing. Does not
// release a tone generator that the host did not release. Ends the analysis thread,
// which every meter object of the process shares: a host that keeps another meter
// calls start_wf_thread() on it again.
KORVO_EXPORT void soundMeter_destroy(SoundMeter_vir* meter);
}

// The factory types, for hosts that look the functions up with dlsym.
typedef SoundMeter_vir* (*soundMeter_maker_t)();
typedef void (*soundMeter_destroy_t)(SoundMeter_vir*);
