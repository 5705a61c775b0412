// Shared memory buffer handle; the library never passes one (always null).
#pragma once
#include <utils/RefBase.h>

namespace android {

class KORVO_PLATFORM_API IMemory : public RefBase {
public:
    ~IMemory() override;
};

}  // namespace android
