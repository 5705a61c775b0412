// Reference-counted base class: atomic strong count and the four lifecycle hooks.
#pragma once
#include <atomic>
#include <cstdint>

#include <korvo/platform/Export.h>
#include <utils/StrongPointer.h>

namespace android {

class KORVO_PLATFORM_API RefBase {
public:
    void incStrong(const void* id) const;
    void decStrong(const void* id) const;
    // Current number of strong references (the initial marker counts as 0).
    int32_t getStrongCount() const;

protected:
    RefBase();
    // Slot order of the virtual table: destructor (two entries), then the hooks.
    virtual ~RefBase();
    virtual void onFirstRef();
    virtual void onLastStrongRef(const void* id);
    virtual bool onIncStrongAttempted(uint32_t flags, const void* id);
    virtual void onLastWeakRef(const void* id);

private:
    RefBase(const RefBase&) = delete;
    RefBase& operator=(const RefBase&) = delete;

    mutable std::atomic<int32_t> mStrong;
};

}  // namespace android
