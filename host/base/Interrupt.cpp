#include "host/base/Interrupt.h"

#include <atomic>
#include <csignal>

#include <korvo/platform/Recording.h>

namespace korvo {
namespace host {
namespace {

// Lock-free, so the handler may set it on whichever thread the signal lands on.
std::atomic<int> gSignal{0};
static_assert(std::atomic<int>::is_always_lock_free, "the handler needs a lock-free flag");

void onSignal(int sig) {
    gSignal.store(sig, std::memory_order_relaxed);
    korvo::platform::interruptRecordings();  // a read of standard input or a FIFO ends too
}

}  // namespace

void installInterruptHandlers() {
    struct sigaction sa {};
    sa.sa_handler = onSignal;
    sigemptyset(&sa.sa_mask);
    // No SA_RESTART: a blocking call (opening a FIFO, reading a pipe) returns EINTR, and
    // its loop sees the flag.
    sa.sa_flags = 0;
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);
    // A reader that went away (a closed pipe) must not kill a device mid-teardown.
    signal(SIGPIPE, SIG_IGN);
}

namespace {
bool gLeftToParent = false;
}  // namespace

void leaveInterruptionsToParent() { gLeftToParent = true; }
bool interruptionsLeftToParent() { return gLeftToParent; }

bool interrupted() { return gSignal.load(std::memory_order_relaxed) != 0; }
int interruptSignal() { return gSignal.load(std::memory_order_relaxed); }

}  // namespace host
}  // namespace korvo
