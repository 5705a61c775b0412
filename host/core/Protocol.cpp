#include "host/core/Protocol.h"

#include <cstdlib>
#include <sstream>

namespace korvo {
namespace host {

bool ProtocolLine::parse(const std::string& line) {
    event.clear();
    fields.clear();
    std::istringstream in(line);
    if (!(in >> event)) return false;
    for (std::string word; in >> word;) {
        size_t eq = word.find('=');
        if (eq == std::string::npos || eq == 0 || eq + 1 == word.size()) return false;
        fields[word.substr(0, eq)] = word.substr(eq + 1);
    }
    return true;
}

long long ProtocolLine::get(const std::string& key, long long fallback) const {
    auto it = fields.find(key);
    if (it == fields.end()) return fallback;
    const char* text = it->second.c_str();
    char* end = nullptr;
    long long value = strtoll(text, &end, 10);
    return (end == text || *end != '\0') ? fallback : value;
}

}  // namespace host
}  // namespace korvo
