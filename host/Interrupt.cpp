#include "host/Interrupt.h"

#include <atomic>
#include <csignal>

namespace korvo {
namespace host {
namespace {

// Lock-free, so the handler may set it on whichever thread the signal lands on.
std::atomic<int> gSignal{0};
static_assert(std::atomic<int>::is_always_lock_free, "the handler needs a lock-free flag");

void onSignal(int sig) { gSignal.store(sig, std::memory_order_relaxed); }

}  // namespace

void installInterruptHandlers() {
    struct sigaction sa {};
    sa.sa_handler = onSignal;
    sigemptyset(&sa.sa_mask);
    sa.sa_flags = SA_RESTART;
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);
    // A reader that went away (a closed pipe) must not kill a device mid-teardown.
    signal(SIGPIPE, SIG_IGN);
}

bool interrupted() { return gSignal.load(std::memory_order_relaxed) != 0; }
int interruptSignal() { return gSignal.load(std::memory_order_relaxed); }

}  // namespace host
}  // namespace korvo
