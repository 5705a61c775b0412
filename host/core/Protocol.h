// The lines a handshake device prints on its standard output. They are meant for
// people and for a parent process alike (the demo reads them):
//   ready role=speaker ack=1 rounds=3 t=<ms>
//   said round=1 code=0 hz=2580 t=<ms>
//   heard round=1 code=1 hz=3440 t=<ms> waited=<ms>
//   timeout round=1 code=1 hz=3440 t=<ms> waited=<ms>
//   done completed=3 rounds=3 t=<ms>
// t is the monotonic clock in milliseconds, which all processes of a machine share.
#pragma once
#include <map>
#include <string>

namespace korvo {
namespace host {

struct ProtocolLine {
    std::string event;
    std::map<std::string, std::string> fields;

    // False when the line is not "event key=value ...".
    bool parse(const std::string& line);
    // The field as a number; `fallback` when it is missing or not a number.
    long long get(const std::string& key, long long fallback = -1) const;
};

}  // namespace host
}  // namespace korvo
