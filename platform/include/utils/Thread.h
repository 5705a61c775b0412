// Thread with a repeated loop body, as the device platform provides it.
//
// run() starts a thread that calls readyToRun() once and then threadLoop()
// again and again while it returns true and no exit has been requested.
// The running thread holds no reference to its object: the owner keeps the
// object alive and calls requestExitAndWait() before dropping the last
// reference (the destructor does it as a last resort).
#pragma once
#include <pthread.h>
#include <sys/types.h>

#include <atomic>
#include <mutex>

#include <korvo/platform/Export.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>

namespace android {

enum {
    PRIORITY_DEFAULT = 0,
};

class KORVO_PLATFORM_API Thread : virtual public RefBase {
public:
    explicit Thread(bool canCallJava = true);
    // Slot order of the virtual table: destructor, run, requestExit, readyToRun, threadLoop.
    ~Thread() override;
    virtual status_t run(const char* name, int32_t priority = PRIORITY_DEFAULT, size_t stack = 0);
    virtual void requestExit();
    virtual status_t readyToRun();

    // Asks the loop to end and waits until the thread has ended. WOULD_BLOCK on the thread itself.
    status_t requestExitAndWait();
    // Waits for the thread to end without asking it to.
    status_t join();
    bool isRunning() const;

protected:
    bool exitPending() const;

private:
    virtual bool threadLoop() = 0;

    static void* trampoline(void* self);

    std::mutex mJoinLock;  // serialises run/join
    pthread_t mThread{};
    bool mStarted = false;   // a pthread exists and was not joined yet
    std::atomic<bool> mExitPending{false};
    std::atomic<bool> mRunning{false};
    bool mCanCallJava;
};

}  // namespace android
