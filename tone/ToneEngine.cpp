// Caller side of the tone engine: creation, the output track, startTone/stopTone.
// The playback callback (PlaybackCallback.cpp) drives the other half of the state
// machine; both meet under mLock and mWaitCbkCond.
#include <errno.h>
#include <time.h>

#include "tone/MiniToneGenerator.h"
#include "tone/ToneLog.h"

#include <media/AudioSystem.h>

namespace android {

namespace {

// The engine's one timed wait: once, 3 s on the realtime clock (the condition's
// default clock), no loop: any wake-up counts as signalled. Called with mLock held.
// Returns 0 or the negated error number.
int waitCallback(MiniToneGenerator* gen) {
    struct timespec deadline;
    clock_gettime(CLOCK_REALTIME, &deadline);
    deadline.tv_sec += 3;
    return -pthread_cond_timedwait(&gen->mWaitCbkCond, &gen->mLock, &deadline);
}

// Takes the output rate from the platform and derives what depends on it.
bool learnSamplingRate(MiniToneGenerator* gen) {
    uint32_t rate = 0;
    if (AudioSystem::getOutputSamplingRate(&rate, gen->mStreamType) != NO_ERROR || rate == 0) {
        return false;
    }
    gen->mSamplingRate = rate;
    gen->mProcessSize = (gen->mSamplingRate * 20) / 1000;
    gen->mMaxToneIndex = static_cast<uint32_t>(MiniToneGenerator::generateToneTable_ZORV());
    return true;
}

// Swaps the track under mLock (a callback may read mpAudioTrack) and returns the old
// one, which the caller drops after unlocking: a track is never destroyed under
// mLock, since its destructor waits for a callback that may be waiting for mLock.
sp<AudioTrack> swapTrack(MiniToneGenerator* gen, const sp<AudioTrack>& track) {
    pthread_mutex_lock(&gen->mLock);
    sp<AudioTrack> old = gen->mpAudioTrack;
    gen->mpAudioTrack = track;
    pthread_mutex_unlock(&gen->mLock);
    return old;
}

}  // namespace

MiniToneGenerator::MiniToneGenerator(audio_stream_type_t streamType, float volume,
                                     bool threadCanCallJava)
    // Every field gets a defined value even when the output rate stays unknown.
    : mMaxToneIndex(0),
      mThreadCanCallRuntime(threadCanCallJava),
      mTotalSmp(0),
      mNextSegSmp(0),
      mMaxSmp(0),
      mDurationMs(-1),
      mCurSegment(0),
      mState(TONE_IDLE),
      mpToneDesc(nullptr),
      mpNewToneDesc(nullptr),
      mLoopCounter(0),
      mSamplingRate(0),
      mpAudioTrack(nullptr),
      mVolume(volume),
      mStreamType(streamType),
      mProcessSize(0),
      mStartTime{0, 0} {
    pthread_mutex_init(&mLock, nullptr);
    pthread_cond_init(&mWaitCbkCond, nullptr);

    TONE_LOGE("MiniToneGenerator constructor: streamType=%d, volume=%f", streamType,
              static_cast<double>(volume));

    mState.store(TONE_IDLE, std::memory_order_relaxed);

    uint32_t rate = 0;
    if (AudioSystem::getOutputSamplingRate(&rate, streamType) != NO_ERROR) {
        TONE_LOGE("Unable to marshal AudioFlinger");
        return;
    }
    mSamplingRate = rate;

    mVolume = volume;
    mpToneDesc = nullptr;
    mpNewToneDesc = nullptr;
    mThreadCanCallRuntime = threadCanCallJava;
    mStreamType = streamType;
    mProcessSize = (mSamplingRate * 20) / 1000;

    mMaxToneIndex = static_cast<uint32_t>(generateToneTable_ZORV());

    if (initAudioTrack()) {
        TONE_LOGD("MiniToneGenerator INIT OK, time: %d", toneNowMs());
    } else {
        TONE_LOGE("!!!MiniToneGenerator INIT FAILED!!!");
    }
}

MiniToneGenerator::~MiniToneGenerator() {
    TONE_LOGE("MiniToneGenerator destructor");

    if (mpAudioTrack != nullptr) {
        stopTone();
        TONE_LOGE("zemla Delete Track: %p", static_cast<void*>(mpAudioTrack.get()));
        sp<AudioTrack> old = swapTrack(this, nullptr);
        old.clear();  // joins the playback thread: no callback runs after this
    }

    for (size_t i = 0; i < mWaveGens.size(); i++) {
        delete mWaveGens.valueAt(i);
    }
    mWaveGens.clear();

    pthread_cond_destroy(&mWaitCbkCond);
    pthread_mutex_destroy(&mLock);
}

bool MiniToneGenerator::initAudioTrack() {
    sp<AudioTrack> track = new AudioTrack();
    sp<AudioTrack> old = swapTrack(this, track);
    old.clear();
    TONE_LOGE("zemla Create Track: %p", static_cast<void*>(track.get()));

    status_t status = track->set(mStreamType,
                                 0,  // the output's own rate
                                 AUDIO_FORMAT_PCM_16_BIT, AUDIO_CHANNEL_OUT_MONO,
                                 0,  // default buffer size
                                 AUDIO_OUTPUT_FLAG_FAST, audioCallback, this,
                                 0,  // notification frames
                                 nullptr, mThreadCanCallRuntime, AUDIO_SESSION_ALLOCATE,
                                 AudioTrack::TRANSFER_CALLBACK, nullptr, -1, -1, nullptr, false,
                                 1.0f);

    if (status == NO_INIT) {
        // The track is kept; the next startTone creates another one.
        mState.store(TONE_REINIT, std::memory_order_relaxed);
        TONE_LOGE("Re-AudioTrack.....mState = TONE_REINIT");
        return false;
    }

    if (track->initCheck() != NO_ERROR) {
        TONE_LOGE("AudioTrack->initCheck failed");
        TONE_LOGE("zemla Init failed: %p", static_cast<void*>(track.get()));
        old = swapTrack(this, nullptr);
        old.clear();
        return false;
    }

    track->setVolume(mVolume);
    mState.store(TONE_INIT, std::memory_order_relaxed);
    return true;
}

bool MiniToneGenerator::startTone(int toneType, int durationMs) {
    bool lResult = false;
    int lStatus;

    if (toneType < 0 || toneType >= NUM_TONE_DESCRIPTORS) {
        TONE_LOGD("UNKNOWN TONE\n");
        return false;
    }

    // Without an output rate there are no block size, generators or tone table:
    // ask the platform again, and refuse the tone while it still cannot tell.
    if (mSamplingRate == 0 && !learnSamplingRate(this)) {
        TONE_LOGE("startTone: output sampling rate unknown, tone refused");
        return false;
    }
    // The wave generators take the rate in 16 bits: above it every tone would play at
    // a wrong pitch (96000 Hz would be taken as 30464 Hz).
    if (mSamplingRate > MAX_SAMPLING_RATE) {
        TONE_LOGE("startTone: output sampling rate %u Hz is above %u Hz, tone refused", mSamplingRate,
                  MAX_SAMPLING_RATE);
        return false;
    }

    uint16_t lState = mState.load(std::memory_order_relaxed);
    if (lState == TONE_IDLE || lState == TONE_REINIT) {
        TONE_LOGE("startTone: try to re-init AudioTrack");
        if (!initAudioTrack()) {
            return false;
        }
    }

    TONE_LOGE("startTone");

    pthread_mutex_lock(&mLock);

    mDurationMs = durationMs;
    mpNewToneDesc = &sToneDescriptors[toneType];

    if (mState.load(std::memory_order_relaxed) == TONE_STOPPED) {
        TONE_LOGE("Start waiting for previous tone to stop");
        lStatus = waitCallback(this);
        if (lStatus != 0) {
            TONE_LOGE("--- start wait for stop timed out, status %d", lStatus);
            mState.store(TONE_IDLE, std::memory_order_relaxed);
            pthread_mutex_unlock(&mLock);
            return false;
        }
    }

    if (mState.load(std::memory_order_relaxed) == TONE_INIT) {
        if (prepareWave()) {
            TONE_LOGE("Immediate start, time %d", toneNowMs());
            lResult = true;
            mState.store(TONE_STARTING, std::memory_order_relaxed);
            if (clock_gettime(CLOCK_MONOTONIC, &mStartTime) != 0) {
                mStartTime.tv_sec = 0;
            }
            pthread_mutex_unlock(&mLock);
            // Unlocked so that the first callback block can run.
            status_t lStartStatus = mpAudioTrack != nullptr ? mpAudioTrack->start() : NO_INIT;
            if (lStartStatus != NO_ERROR) {
                TONE_LOGE("zemla mpAudioTrack->start() error!: %d", lStartStatus);
                pthread_mutex_lock(&mLock);
                lResult = false;
                mState.store(TONE_IDLE, std::memory_order_relaxed);
            } else {
                pthread_mutex_lock(&mLock);
                if (mState.load(std::memory_order_relaxed) == TONE_STARTING) {
                    TONE_LOGE("Wait for start callback");
                    lStatus = waitCallback(this);
                    if (lStatus != 0) {
                        TONE_LOGE("--- Immediate start timed out, status %d", lStatus);
                        lResult = false;
                        mState.store(TONE_IDLE, std::memory_order_relaxed);
                    }
                }
            }
        } else {
            mState.store(TONE_IDLE, std::memory_order_relaxed);
        }
    } else {
        TONE_LOGE("Delayed start");
        mState.store(TONE_RESTARTING, std::memory_order_relaxed);
        mStartTime.tv_sec = 0;  // the callback takes the start time when it switches
        lStatus = waitCallback(this);
        if (lStatus == 0) {
            if (mState.load(std::memory_order_relaxed) != TONE_IDLE) {
                lResult = true;
            }
            TONE_LOGE("cond received");
        } else {
            TONE_LOGE("--- Delayed start timed out, status %d", lStatus);
            mState.store(TONE_IDLE, std::memory_order_relaxed);
        }
    }
    pthread_mutex_unlock(&mLock);

    if (lResult) {
        TONE_LOGE("Tone started, time %d", toneNowMs());
    } else {
        TONE_LOGW("Tone start failed!!!, time %d", toneNowMs());
    }
    return lResult;
}

void MiniToneGenerator::stopTone() {
    TONE_LOGE("stopTone");

    pthread_mutex_lock(&mLock);
    uint16_t lState = mState.load(std::memory_order_relaxed);
    if (lState == TONE_IDLE || lState == TONE_INIT || lState == TONE_REINIT) {
        pthread_mutex_unlock(&mLock);
        return;
    }

    if (lState == TONE_PLAYING || lState == TONE_STARTING || lState == TONE_RESTARTING) {
        // The tone lasts at least as long as it has been running: the output may
        // have started late, so the callback counts its samples up to there.
        struct timespec stopTime;
        if (mStartTime.tv_sec != 0 && clock_gettime(CLOCK_MONOTONIC, &stopTime) == 0) {
            time_t sec = stopTime.tv_sec - mStartTime.tv_sec;
            long nsec = stopTime.tv_nsec - mStartTime.tv_nsec;
            if (nsec < 0) {
                --sec;
                nsec += 1000000000;
            }
            if (sec >= static_cast<time_t>(0x7FFFFFFF / mSamplingRate)) {
                mMaxSmp = static_cast<uint32_t>(sec) * mSamplingRate;
            } else {
                mMaxSmp = static_cast<uint32_t>(
                    (static_cast<int64_t>(sec) * 1000 + nsec / 1000000) * mSamplingRate / 1000);
            }
        } else {
            mState.store(TONE_STOPPING, std::memory_order_relaxed);
        }
    }

    TONE_LOGE("waiting cond");
    int lStatus = waitCallback(this);
    if (lStatus == 0) {
        // A tone started meanwhile keeps its generators.
        if (mState.load(std::memory_order_relaxed) == TONE_INIT) {
            clearWaveGens();
        }
    } else {
        TONE_LOGE("--- Stop timed out");
        mState.store(TONE_IDLE, std::memory_order_relaxed);
        if (mpAudioTrack != nullptr) mpAudioTrack->stop();
        clearWaveGens();
    }

    pthread_mutex_unlock(&mLock);
}

void MiniToneGenerator::clearAudioTrack() {
    if (mpAudioTrack != nullptr) {
        stopTone();
        TONE_LOGD("zemla clearAudioTrack, Delete Track: %p", static_cast<void*>(mpAudioTrack.get()));
        sp<AudioTrack> old = swapTrack(this, nullptr);
        old.clear();
    }
}

}  // namespace android
