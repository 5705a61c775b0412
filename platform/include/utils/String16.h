// Minimal UTF-16 string: the library only ever passes an empty package name.
#pragma once
#include <cstddef>
#include <string>

#include <korvo/platform/Export.h>

namespace android {

class KORVO_PLATFORM_API String16 {
public:
    String16();
    explicit String16(const char* utf8);
    size_t size() const;
    const char16_t* string() const;
    bool operator==(const String16& o) const { return mData == o.mData; }

private:
    std::u16string mData;
};

}  // namespace android
