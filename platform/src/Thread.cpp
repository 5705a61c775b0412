// Looping thread on a pthread; see utils/Thread.h for the contract.
#include <utils/Thread.h>

#include <limits.h>

#include <cstring>
#include <new>

namespace android {

namespace {

struct StartInfo {
    Thread* self;
    char name[16];  // the kernel keeps at most 15 characters
};

// The object whose loop runs on this thread (null on other threads).
thread_local const Thread* tCurrent = nullptr;
// Set on a thread whose own object was destroyed from inside threadLoop: the loop must
// not touch the object again.
thread_local bool tOwnerGone = false;

}  // namespace

Thread::Thread(bool canCallJava) : mCanCallJava(canCallJava) {}

Thread::~Thread() {
    // Last resort only: owners stop the thread before dropping the last reference.
    requestExit();
    std::lock_guard<std::mutex> lock(mJoinLock);
    if (!mStarted) return;
    if (tCurrent == this) {
        // Destroyed from its own loop: nobody can join it, and the loop stops at once.
        tOwnerGone = true;
        pthread_detach(mThread);
    } else {
        pthread_join(mThread, nullptr);
    }
    mStarted = false;
}

status_t Thread::run(const char* name, int32_t /*priority*/, size_t stack) {
    std::lock_guard<std::mutex> lock(mJoinLock);
    if (mRunning.load(std::memory_order_acquire)) return INVALID_OPERATION;
    if (mStarted) {
        // The previous run has ended on its own; collect it before starting again.
        pthread_join(mThread, nullptr);
        mStarted = false;
    }

    (void)mCanCallJava;  // no managed runtime here to attach the thread to

    auto* info = new (std::nothrow) StartInfo{this, {}};
    if (!info) return NO_MEMORY;
    std::strncpy(info->name, name ? name : "Thread", sizeof(info->name) - 1);

    pthread_attr_t attr;
    pthread_attr_init(&attr);
    if (stack > 0) {
        const size_t minimum = static_cast<size_t>(PTHREAD_STACK_MIN);
        pthread_attr_setstacksize(&attr, stack < minimum ? minimum : stack);
    }
    mExitPending.store(false, std::memory_order_relaxed);
    mRunning.store(true, std::memory_order_release);
    const int err = pthread_create(&mThread, &attr, &Thread::trampoline, info);
    pthread_attr_destroy(&attr);
    if (err != 0) {
        mRunning.store(false, std::memory_order_release);
        delete info;
        return -err;
    }
    mStarted = true;
    return OK;
}

void* Thread::trampoline(void* arg) {
    StartInfo* info = static_cast<StartInfo*>(arg);
    Thread* self = info->self;
    tCurrent = self;
    pthread_setname_np(pthread_self(), info->name);
    delete info;

    if (self->readyToRun() == OK) {
        while (!self->exitPending()) {
            const bool again = self->threadLoop();
            if (tOwnerGone) return nullptr;
            if (!again) break;
        }
    }
    if (tOwnerGone) return nullptr;
    self->mRunning.store(false, std::memory_order_release);
    return nullptr;
}

void Thread::requestExit() { mExitPending.store(true, std::memory_order_release); }

status_t Thread::readyToRun() { return OK; }

status_t Thread::requestExitAndWait() {
    // Waiting for itself would never end; the call then has no effect at all.
    if (tCurrent == this) return WOULD_BLOCK;
    requestExit();
    return join();
}

status_t Thread::join() {
    if (tCurrent == this) return WOULD_BLOCK;
    std::lock_guard<std::mutex> lock(mJoinLock);
    if (!mStarted) return OK;
    pthread_join(mThread, nullptr);
    mStarted = false;
    return OK;
}

bool Thread::isRunning() const { return mRunning.load(std::memory_order_acquire); }

bool Thread::exitPending() const { return mExitPending.load(std::memory_order_acquire); }

}  // namespace android
