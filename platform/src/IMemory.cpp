// Out-of-line destructor: anchors the class's virtual table in the platform library.
#include <binder/IMemory.h>

namespace android {

IMemory::~IMemory() = default;

}  // namespace android
