// Playback side of the tone engine. audioCallback runs on the output track's
// playback thread. Real-time rules: no allocation (except prepareWave during a
// restart), no blocking beyond mLock, which is held for one block at a time so that
// startTone/stopTone can step in between the blocks of a buffer.
#include <string.h>
#include <time.h>

#include "tone/MiniToneGenerator.h"
#include "tone/ToneLog.h"

namespace android {

namespace {

typedef MiniToneGenerator::ToneDescriptor ToneDescriptor;
typedef MiniToneGenerator::ToneSegment ToneSegment;
typedef MiniToneGenerator::WaveGenerator WaveGenerator;

// The fourth waveFreq entry is the list's terminator: at most three frequencies.
const unsigned int kMaxFreqs = 3;

// Stands for a segment index past the descriptor's 13 segments (a loopIndex or a
// list without terminator, never in the plans): it ends the segment list.
const ToneSegment kEndSegment = {0, {0, 0, 0, 0}, 0, 0};
// Stands for a missing descriptor: an empty tone.
const ToneDescriptor kEmptyTone = {};

inline const ToneSegment& segmentOf(const ToneDescriptor* desc, unsigned int index) {
    return index < static_cast<unsigned int>(MiniToneGenerator::NUM_SEGMENTS) ? desc->segments[index]
                                                                            : kEndSegment;
}

inline unsigned int freqCount(const ToneSegment& seg) {
    unsigned int n = 0;
    while (n < kMaxFreqs && seg.waveFreq[n] != 0) n++;
    return n;
}

// A frequency without a generator (a loop into segments after the terminating one)
// is skipped rather than aborting the process.
inline WaveGenerator* findGenerator(const KeyedVector<unsigned short, WaveGenerator*>& gens,
                                    unsigned short freq) {
    ssize_t index = gens.indexOfKey(freq);
    return index < 0 ? nullptr : gens.valueAt(static_cast<size_t>(index));
}

inline void playSegment(const KeyedVector<unsigned short, WaveGenerator*>& gens,
                        const ToneSegment& seg, short* out, unsigned int count,
                        unsigned int command) {
    for (unsigned int i = 0; i < freqCount(seg); i++) {
        WaveGenerator* gen = findGenerator(gens, seg.waveFreq[i]);
        if (gen != nullptr) gen->getSamples(out, count, command);
    }
}

}  // namespace

void MiniToneGenerator::audioCallback(int event, void* user, void* info) {
    if (event != AudioTrack::EVENT_MORE_DATA) return;

    AudioTrack::Buffer* buffer = static_cast<AudioTrack::Buffer*>(info);
    MiniToneGenerator* lpToneGen = static_cast<MiniToneGenerator*>(user);
    short* lpOut = buffer->i16;
    unsigned int lNumSmp = static_cast<unsigned int>(buffer->size / sizeof(short));
    const ToneDescriptor* lpToneDesc = lpToneGen->mpToneDesc;
    if (lpToneDesc == nullptr) lpToneDesc = &kEmptyTone;

    if (buffer->size == 0) return;

    // The generators add into the buffer.
    memset(lpOut, 0, buffer->size);

    // mProcessSize is 0 only while no track exists; one block per buffer then.
    const unsigned int lProcessSize =
        lpToneGen->mProcessSize != 0 ? lpToneGen->mProcessSize : lNumSmp;

    while (lNumSmp) {
        // A remainder shorter than two blocks is done as one block.
        unsigned int lReqSmp = lNumSmp < 2 * lProcessSize ? lNumSmp : lProcessSize;
        unsigned int lGenSmp;
        unsigned int lWaveCmd = WaveGenerator::WAVEGEN_CONT;
        bool lSignal = false;

        pthread_mutex_lock(&lpToneGen->mLock);

        lpToneGen->mTotalSmp += lReqSmp;

        switch (lpToneGen->mState.load(std::memory_order_relaxed)) {
        case TONE_STARTING:
            TONE_LOGE("Starting Cbk");
            lWaveCmd = WaveGenerator::WAVEGEN_START;
            break;
        case TONE_PLAYING:
            lWaveCmd = WaveGenerator::WAVEGEN_CONT;
            break;
        case TONE_STOPPING:
        case TONE_RESTARTING:
            TONE_LOGE("Stop/restart Cbk");
            lWaveCmd = WaveGenerator::WAVEGEN_STOP;
            lpToneGen->mNextSegSmp = TONEGEN_INF;  // no segment change in this block
            break;
        case TONE_STOPPED:
            TONE_LOGE("Stopped Cbk");
            goto audioCallback_EndLoop;
        default:
            TONE_LOGE("Extra Cbk");
            goto audioCallback_EndLoop;
        }

        {
            const ToneSegment& lSeg = segmentOf(lpToneDesc, lpToneGen->mCurSegment);

            // End of the tone: end of the segment list, or the duration limit passed.
            if (lSeg.duration == 0 || lpToneGen->mTotalSmp > lpToneGen->mMaxSmp) {
                if (lpToneGen->mState.load(std::memory_order_relaxed) == TONE_PLAYING) {
                    lpToneGen->mState.store(TONE_STOPPING, std::memory_order_relaxed);
                }
                if (lSeg.duration == 0) {
                    goto audioCallback_EndLoop;
                }
                lWaveCmd = WaveGenerator::WAVEGEN_STOP;
                lpToneGen->mNextSegSmp = TONEGEN_INF;
            }

            if (lpToneGen->mTotalSmp > lpToneGen->mNextSegSmp) {
                TONE_LOGE("End Segment, time: %d", toneNowMs());
                lGenSmp = lReqSmp;

                // ON -> OFF: fade the waves of the ending segment.
                if (lSeg.waveFreq[0] != 0) {
                    playSegment(lpToneGen->mWaveGens, lSeg, lpOut, lReqSmp,
                                WaveGenerator::WAVEGEN_STOP);
                    TONE_LOGE("ON->OFF, lGenSmp: %d, lReqSmp: %d", lGenSmp, lReqSmp);
                    lWaveCmd = WaveGenerator::WAVEGEN_STOP;
                }

                if (lSeg.loopCnt != 0) {
                    if (lpToneGen->mLoopCounter < lSeg.loopCnt) {
                        TONE_LOGE("in if loop loopCnt(%d) loopctr(%d), CurSeg(%d)", lSeg.loopCnt,
                                  lpToneGen->mLoopCounter, lpToneGen->mCurSegment);
                        lpToneGen->mCurSegment = lSeg.loopIndex;
                        ++lpToneGen->mLoopCounter;
                    } else {
                        lpToneGen->mLoopCounter = 0;
                        lpToneGen->mCurSegment++;
                        TONE_LOGE("in else loop loopCnt(%d) loopctr(%d), CurSeg(%d)",
                                  segmentOf(lpToneDesc, lpToneGen->mCurSegment).loopCnt,
                                  lpToneGen->mLoopCounter, lpToneGen->mCurSegment);
                    }
                } else {
                    lpToneGen->mCurSegment++;
                    TONE_LOGE("Goto next seg loopCnt(%d) loopctr(%d), CurSeg(%d)",
                              segmentOf(lpToneDesc, lpToneGen->mCurSegment).loopCnt,
                              lpToneGen->mLoopCounter, lpToneGen->mCurSegment);
                }

                const ToneSegment& lNewSeg = segmentOf(lpToneDesc, lpToneGen->mCurSegment);
                if (lNewSeg.duration == 0) {
                    // The terminating segment has no waves: the next block ends the tone.
                    TONE_LOGE("Last Seg: %d", lpToneGen->mCurSegment);
                } else {
                    TONE_LOGE("New segment %d, Next Time: %d", lpToneGen->mCurSegment,
                              (lpToneGen->mNextSegSmp * 1000) / lpToneGen->mSamplingRate);
                    if (lNewSeg.waveFreq[0] != 0) {
                        // OFF -> ON, or ON -> ON: the new waves start on the same samples.
                        lWaveCmd = WaveGenerator::WAVEGEN_START;
                        TONE_LOGE("OFF->ON, lGenSmp: %d, lReqSmp: %d", lReqSmp, lReqSmp);
                        lGenSmp = lReqSmp;
                    } else {
                        lGenSmp = 0;
                    }
                }
                lpToneGen->mNextSegSmp += (lNewSeg.duration * lpToneGen->mSamplingRate) / 1000;
            } else {
                lGenSmp = lSeg.waveFreq[0] != 0 ? lReqSmp : 0;
            }

            const ToneSegment& lCurSeg = segmentOf(lpToneDesc, lpToneGen->mCurSegment);
            if (lGenSmp != 0 && lCurSeg.waveFreq[0] != 0) {
                playSegment(lpToneGen->mWaveGens, lCurSeg, lpOut, lGenSmp, lWaveCmd);
            }
            lNumSmp -= lReqSmp;
            lpOut += lReqSmp;
        }

    audioCallback_EndLoop:
        switch (lpToneGen->mState.load(std::memory_order_relaxed)) {
        case TONE_RESTARTING:
            TONE_LOGE("Cbk restarting track");
            if (lpToneGen->prepareWave()) {
                lpToneGen->mState.store(TONE_STARTING, std::memory_order_relaxed);
                if (clock_gettime(CLOCK_MONOTONIC, &lpToneGen->mStartTime) != 0) {
                    lpToneGen->mStartTime.tv_sec = 0;
                }
                // The rest of the buffer plays the new tone.
                lpToneDesc = lpToneGen->mpToneDesc;
            } else {
                TONE_LOGW("Cbk restarting prepareWave() failed");
                lpToneGen->mState.store(TONE_IDLE, std::memory_order_relaxed);
                if (lpToneGen->mpAudioTrack != nullptr) lpToneGen->mpAudioTrack->stop();
                lNumSmp = 0;
            }
            lSignal = true;
            break;
        case TONE_STOPPING:
            TONE_LOGE("Cbk Stopping");
            lpToneGen->mState.store(TONE_STOPPED, std::memory_order_relaxed);
            // The rest of the buffer stays silent; the next call stops the track.
            pthread_mutex_unlock(&lpToneGen->mLock);
            return;
        case TONE_STOPPED:
            lpToneGen->mState.store(TONE_INIT, std::memory_order_relaxed);
            TONE_LOGE("Cbk Stopped track");
            if (lpToneGen->mpAudioTrack != nullptr) lpToneGen->mpAudioTrack->stop();
            lNumSmp = 0;
            buffer->size = 0;
            lSignal = true;
            break;
        case TONE_STARTING:
            TONE_LOGE("Cbk starting track");
            lpToneGen->mState.store(TONE_PLAYING, std::memory_order_relaxed);
            lSignal = true;
            break;
        case TONE_PLAYING:
            break;
        default:
            lNumSmp = 0;
            buffer->size = 0;
            pthread_mutex_unlock(&lpToneGen->mLock);
            return;
        }

        if (lSignal) pthread_cond_broadcast(&lpToneGen->mWaitCbkCond);
        pthread_mutex_unlock(&lpToneGen->mLock);
    }
}

bool MiniToneGenerator::prepareWave() {
    if (mpNewToneDesc == nullptr) {
        return false;
    }

    clearWaveGens();

    mpToneDesc = mpNewToneDesc;

    if (mDurationMs == -1) {
        mMaxSmp = TONEGEN_INF;
    } else {
        // Long durations are limited to whole seconds so that the product fits.
        if (mDurationMs > static_cast<int32_t>(0xFFFFFFFFu / mSamplingRate)) {
            mMaxSmp = static_cast<uint32_t>(mDurationMs / 1000) * mSamplingRate;
        } else {
            mMaxSmp = (static_cast<uint32_t>(mDurationMs) * mSamplingRate) / 1000;
        }
        TONE_LOGE("prepareWave, duration limited to %d ms", mDurationMs);
    }

    // One generator per frequency of the tone, with the gain of the first segment
    // that uses it; the callback only looks them up.
    unsigned int segmentIdx = 0;
    while (segmentOf(mpToneDesc, segmentIdx).duration != 0) {
        const ToneSegment& seg = segmentOf(mpToneDesc, segmentIdx);
        unsigned int numWave = numWaves(segmentIdx);
        for (unsigned int freqIdx = 0; freqIdx < freqCount(seg); freqIdx++) {
            unsigned short frequency = seg.waveFreq[freqIdx];
            if (mWaveGens.indexOfKey(frequency) < 0) {
                mWaveGens.add(frequency,
                              new WaveGenerator(static_cast<unsigned short>(mSamplingRate), frequency,
                                                0.9f / static_cast<float>(numWave)));
            }
        }
        segmentIdx++;
    }

    mTotalSmp = 0;
    mCurSegment = 0;
    mLoopCounter = 0;

    if (mpToneDesc->segments[0].duration == TONEGEN_INF) {
        mNextSegSmp = TONEGEN_INF;
    } else {
        mNextSegSmp = (mpToneDesc->segments[0].duration * mSamplingRate) / 1000;
    }

    return true;
}

void MiniToneGenerator::clearWaveGens() {
    TONE_LOGE("Clearing mWaveGens:");

    for (size_t lIdx = 0; lIdx < mWaveGens.size(); lIdx++) {
        delete mWaveGens.valueAt(lIdx);
    }
    mWaveGens.clear();
}

unsigned int MiniToneGenerator::numWaves(unsigned int segmentIdx) {
    if (mpToneDesc == nullptr) return 0;
    const ToneSegment& seg = segmentOf(mpToneDesc, segmentIdx);
    if (seg.duration == 0) return 0;
    // One more than the number of waves: the gain 0.9/n keeps their sum in range.
    return freqCount(seg) + 1;
}

}  // namespace android
