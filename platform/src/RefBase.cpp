// Atomic strong reference counting with the lifecycle hooks.
#include <utils/RefBase.h>

namespace android {

namespace {
// A fresh object carries this marker instead of 0, so the first incStrong can be told
// apart from a later one that brings the count back up from 0.
constexpr int32_t kInitialStrong = 1 << 28;
}  // namespace

RefBase::RefBase() : mStrong(kInitialStrong) {}

RefBase::~RefBase() = default;

void RefBase::incStrong(const void* /*id*/) const {
    const int32_t before = mStrong.fetch_add(1, std::memory_order_relaxed);
    if (before != kInitialStrong) return;
    mStrong.fetch_sub(kInitialStrong, std::memory_order_relaxed);
    const_cast<RefBase*>(this)->onFirstRef();
}

void RefBase::decStrong(const void* id) const {
    // acq_rel: the deleting thread must see every write made under the other references.
    const int32_t before = mStrong.fetch_sub(1, std::memory_order_acq_rel);
    if (before != 1) return;
    RefBase* self = const_cast<RefBase*>(this);
    self->onLastStrongRef(id);
    delete self;
}

int32_t RefBase::getStrongCount() const {
    const int32_t c = mStrong.load(std::memory_order_relaxed);
    return c >= kInitialStrong ? c - kInitialStrong : c;
}

void RefBase::onFirstRef() {}

void RefBase::onLastStrongRef(const void* /*id*/) {}

bool RefBase::onIncStrongAttempted(uint32_t /*flags*/, const void* /*id*/) { return true; }

void RefBase::onLastWeakRef(const void* /*id*/) {}

}  // namespace android
