// The handshake state machine: hearing and saying tones in turns, and the
// sweep through the tone codes.
#include <cstdio>
#include <cstring>

#include <utils/Timers.h>

#include "common/LogTags.h"
#include "interface/SoundMeterConstants.h"
#include "meter/Handshake.h"
#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

int32_t play_sound = 0;
int64_t last_play_time = 0;

namespace {

const char* const kSayFunc = "virtual void SoundMeter::SayFreqIdx(int, int)";
const int kListenerBit = 1;
const int kSpeakerBit = 2;
const int kTableSize = android::MiniToneGenerator::NUM_TONE_DESCRIPTORS;

long nowMs() { return static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000); }

}  // namespace

namespace korvo {

bool hearingGateOpen(const SoundMeter& m) {
    return ((m.role & kListenerBit) && (m.listener_state == 0 || m.listener_state == 10)) ||
           ((m.role & kSpeakerBit) && m.speaker_state == 1);
}

bool sayingGateOpen(const SoundMeter& m) {
    return ((m.role & kSpeakerBit) && m.speaker_state == 0) ||
           ((m.role & kListenerBit) && m.listener_state == 1 && m.need_ack == 1);
}

}  // namespace korvo

int SoundMeter::HearFreqIdx(int toneIndex) {
    count += 1;
    processAudio();
    if (!korvo::hearingGateOpen(*this)) return -1;

    float spectrum[korvo::kSpectrumBins];
    memset(spectrum, 0, sizeof(spectrum));
    if (getSpectrumData_zorv(spectrum) == 0) {
        METER_LOGD("[%s] PCM Analysis not prepared\n");
        return -1;
    }
    int first = -1;
    int second = -1;
    detectTwoPeakFreq_zorv(0.9f, spectrum, &first, &second);
    if (getCodeFromTwoFreq(first, 0) != toneIndex && getCodeFromTwoFreq(second, 0) != toneIndex) {
        return -1;
    }

    if ((role & kListenerBit) && listener_state == 0) {
        if (need_ack == 1) {
            listener_state = 1;
            last_heard = toneIndex;
        } else {
            listener_state = 10;
        }
        METER_LOGD("[%s:%d] TIME [%ld] Listener Transit To %d\n", 530,
                            nowMs(), listener_state);
    } else if ((role & kSpeakerBit) && speaker_state == 1) {
        if (toneIndex == korvo::acknowledgementOf(last_said)) {
            speaker_state = 10;
        }
        METER_LOGD("[%s:%d] TIME [%ld] Speaker Transit To %d.Heard [%d] last_said[%d]\n", 538,
                            nowMs(), speaker_state, toneIndex, last_said);
    }
    if (listener_state == 10 && speaker_state == 10) {
        listener_state = 0;
        speaker_state = 0;
        METER_LOGD("[%s:%d] TIME [%ld] Listener/Speaker Transit To %d/%d\n", 548, nowMs(), 0, 0);
    }
    return toneIndex;
}

int SoundMeter::HearAndResponse() {
    count += 1;
    processAudio();
    if (korvo::hearingGateOpen(*this)) {
        float spectrum[korvo::kSpectrumBins];
        memset(spectrum, 0, sizeof(spectrum));
        if (getSpectrumData(spectrum) == 0) {
            METER_LOGD("[%s] PCM Analysis not prepared\n");
        }
    }
    return -1;
}

void SoundMeter::SayFreqIdx(int toneIndex, int durationMs) {
    METER_LOGD("[%s][%s][START] speaker_state:%d listener_state:%d\n", kSayFunc, speaker_state, listener_state);
    if (!korvo::sayingGateOpen(*this)) {
        METER_LOGD("[%s] state ERROR!\n");
    } else {
        // Without a tone generator there is nothing to play; the states still move as after a tone.
        if (toneGenerator != nullptr) toneGenerator->startTone(toneIndex, durationMs);
        bool waitForAck = false;
        if ((role & kListenerBit) && listener_state == 1) listener_state = 10;
        if ((role & kSpeakerBit) && speaker_state == 0) {
            if (need_ack == 1) {
                speaker_state = 1;
                waitForAck = true;
            } else {
                speaker_state = 10;
            }
        }
        if (!waitForAck && speaker_state == 10 && listener_state == 10) {
            speaker_state = 0;
            listener_state = 0;
        }
    }
    METER_LOGD("[%s][%s][END] speaker_state = %d, listener_state = %d\n", kSayFunc, speaker_state, listener_state);
}

void SoundMeter::SayAllFreqIndex(int durationMs) {
    if (speaker_state == 1) return;
    if (role == 2 && last_play_time != 0) {
        const long elapsed = static_cast<long>((systemTime(SYSTEM_TIME_MONOTONIC) - last_play_time) / 1000000);
        printf("[%s] SoundMeter Works as Speaker Only, then it'll not say before sleeping saytime+50msec.[%ld]\n",
               korvo::kMeterWho, elapsed);
        if (elapsed < durationMs + 350 && speaker_state == 10) return;
        speaker_state = 0;
        play_sound += 1;
        printf("[%s:%d] TIME [%ld] Speaker Transit To %d\n", korvo::kMeterWho, 884, nowMs(), 0);
    }
    if (!korvo::sayingGateOpen(*this)) return;

    const nsecs_t t = systemTime(SYSTEM_TIME_MONOTONIC);
    // The table has 512 records: an index at or past its end (or negative) starts the sweep again.
    if (play_sound < 0 || play_sound >= kTableSize) play_sound = 0;
    int code = getFreqCodeFromIndex(play_sound);
    if (code == android::MiniToneGenerator::FREQ_CODE_END) {
        play_sound = 0;
        code = getFreqCodeFromIndex(0);
    }
    if (listener_state == 1 && need_ack == 1) {
        play_sound = korvo::acknowledgementOf(last_heard);
        printf("[%s:%d] TIME [%ld] Listener Transit To %d. last_heard[%d] play_sound[%d]\n", korvo::kMeterWho, 911, nowMs(),
               listener_state, last_heard, play_sound);
    }
    last_said = play_sound;
    if (toneGenerator != nullptr) toneGenerator->startTone(play_sound, durationMs);
    printf("[%s] CNT TIME TONE PLAYING[%d:%d]------------[%ld] From Prev Play [%ld]\n", korvo::kMeterWho, play_sound, code,
           static_cast<long>(t / 1000000), static_cast<long>((t - last_play_time) / 1000000));
    last_play_time = t;
    if ((role & kListenerBit) && listener_state == 1) {
        listener_state = 10;
        play_sound += 1;
        printf("[%s:%d] TIME [%ld] Listener Transit To %d\n", korvo::kMeterWho, 922, nowMs(), 10);
    }
    if ((role & kSpeakerBit) && speaker_state == 0) {
        speaker_state = need_ack == 1 ? 1 : 10;
        play_sound += 1;
        printf("[%s:%d] TIME [%ld] Speaker Transit To %d\n", korvo::kMeterWho, 937, nowMs(), speaker_state);
    }
}

void SoundMeter::setSpeakerState(int state) {
    METER_LOGD("[%s] set speaker state: %d", state);
    speaker_state = state;
}

void SoundMeter::stopFreqTone() {
    // Without a tone generator no tone can be playing.
    if (toneGenerator != nullptr) toneGenerator->stopTone();
}

int SoundMeter::SayString(char* /*text*/) { return 0; }
