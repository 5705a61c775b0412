// One event of a command as a JSON object on one line: {"event":"heard","code":5,...}.
#pragma once
#include <string>
#include <type_traits>

namespace korvo {
namespace host {

class JsonEvent {
public:
    explicit JsonEvent(const char* name);
    template <class T, std::enable_if_t<std::is_integral<T>::value && !std::is_same<T, bool>::value, int> = 0>
    JsonEvent& add(const char* key, T value) {
        return integer(key, static_cast<long long>(value));
    }
    JsonEvent& add(const char* key, double value);  // non-finite values become null
    JsonEvent& add(const char* key, bool value);
    JsonEvent& add(const char* key, const std::string& value);
    JsonEvent& add(const char* key, const char* value) { return add(key, std::string(value)); }
    std::string text() const { return mText + "}"; }

private:
    JsonEvent& integer(const char* key, long long value);
    JsonEvent& raw(const char* key, const std::string& json);
    std::string mText;
};

}  // namespace host
}  // namespace korvo
