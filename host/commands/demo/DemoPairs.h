// Several pairs of devices in one simulated room: each pair is a demo of its own, a child
// process on the shared room with its share of the codes. Their lines are shown with the
// pair's number (a "pair" field in each JSON object), and a summary counts the pairs that
// completed every exchange and the codes a device heard before its own peer said them:
// another pair's code taken for its own.
#pragma once
#include <string>
#include <vector>

namespace korvo {
namespace host {

struct PairsPlan {
    std::string room;                             // the simulated room they share
    std::vector<std::vector<std::string>> demos;  // each pair's demo command line (args[0] included)
};

// Runs the pairs to their end; the exit status: 0 when every pair completed every exchange,
// 1 when one did not, 130 after Ctrl-C.
int runPairs(const PairsPlan& plan);

}  // namespace host
}  // namespace korvo
