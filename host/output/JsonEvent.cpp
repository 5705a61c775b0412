#include "host/output/JsonEvent.h"

#include <cmath>
#include <cstdio>

namespace korvo {
namespace host {
namespace {

std::string quoted(const std::string& s) {
    std::string out = "\"";
    for (unsigned char c : s) {
        if (c == '"' || c == '\\') {
            out += '\\';
            out += char(c);
        } else if (c < 0x20) {
            char esc[8];
            std::snprintf(esc, sizeof esc, "\\u%04x", c);
            out += esc;
        } else {
            out += char(c);
        }
    }
    return out + "\"";
}

}  // namespace

JsonEvent::JsonEvent(const char* name) : mText("{\"event\":" + quoted(name)) {}

JsonEvent& JsonEvent::raw(const char* key, const std::string& json) {
    mText += "," + quoted(key) + ":" + json;
    return *this;
}

JsonEvent& JsonEvent::integer(const char* key, long long value) { return raw(key, std::to_string(value)); }

JsonEvent& JsonEvent::add(const char* key, double value) {
    if (!std::isfinite(value)) return raw(key, "null");
    char text[64];
    std::snprintf(text, sizeof text, "%.6g", value);
    return raw(key, text);
}

JsonEvent& JsonEvent::add(const char* key, bool value) { return raw(key, value ? "true" : "false"); }

JsonEvent& JsonEvent::add(const char* key, const std::string& value) { return raw(key, quoted(value)); }

}  // namespace host
}  // namespace korvo
