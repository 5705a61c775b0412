// The envelope's jobs, run on every core (each job writes only its own result), and the CSV
// files their results go to.
#pragma once
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

namespace korvo {
namespace envelope {

void runAll(std::vector<std::function<void()>>& jobs, unsigned threads);

// `folder`/`name`, opened for writing with its header line; exits the program when it cannot.
FILE* openCsv(const std::string& folder, const char* name, const char* header);

}  // namespace envelope
}  // namespace korvo
