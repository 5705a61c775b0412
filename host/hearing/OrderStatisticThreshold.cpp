#include "host/hearing/OrderStatisticThreshold.h"

#include <cmath>
#include <map>
#include <mutex>
#include <tuple>

namespace korvo {
namespace host {

double orderStatisticFalseAlarm(int count, int rank, double t) {
    double logP = 0.0;
    for (int i = 0; i < rank; ++i) logP += std::log((count - i) / (count - i + t));
    return std::exp(logP);
}

double orderStatisticThreshold(int count, int rank, double probability) {
    // Every decoder asks for the same few hundred thresholds, and a bisection costs
    // thousands of logarithms: each is computed once per process.
    static std::mutex lock;
    static std::map<std::tuple<int, int, double>, double> known;
    const std::lock_guard<std::mutex> hold(lock);
    const auto key = std::make_tuple(count, rank, probability);
    if (const auto it = known.find(key); it != known.end()) return it->second;
    // The chance falls monotonically with t: bisect on a logarithmic scale.
    double lo = 1.0, hi = 1e12;
    for (int i = 0; i < 200; ++i) {
        const double mid = std::sqrt(lo * hi);
        (orderStatisticFalseAlarm(count, rank, mid) > probability ? lo : hi) = mid;
    }
    known.emplace(key, hi);
    return hi;
}

}  // namespace host
}  // namespace korvo
