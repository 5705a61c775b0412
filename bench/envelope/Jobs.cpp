#include "envelope/Jobs.h"

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <thread>

namespace korvo {
namespace envelope {

void runAll(std::vector<std::function<void()>>& jobs, unsigned threads) {
    std::atomic<size_t> next{0};
    std::atomic<size_t> done{0};
    std::vector<std::thread> pool;
    for (unsigned t = 0; t < threads; ++t) {
        pool.emplace_back([&] {
            for (size_t i; (i = next++) < jobs.size();) {
                jobs[i]();
                const size_t d = ++done;
                if (d % 50 == 0 || d == jobs.size()) fprintf(stderr, "\r  %zu of %zu", d, jobs.size());
            }
        });
    }
    for (std::thread& t : pool) t.join();
    fprintf(stderr, "\n");
}

FILE* openCsv(const std::string& folder, const char* name, const char* header) {
    const std::string path = folder + "/" + name;
    FILE* f = fopen(path.c_str(), "w");
    if (!f) {
        fprintf(stderr, "korvo_envelope: cannot write %s: %s\n", path.c_str(), strerror(errno));
        exit(1);
    }
    fprintf(f, "%s\n", header);
    return f;
}

}  // namespace envelope
}  // namespace korvo
