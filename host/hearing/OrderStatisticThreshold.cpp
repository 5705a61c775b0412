#include "host/hearing/OrderStatisticThreshold.h"

#include <cmath>

namespace korvo {
namespace host {

double orderStatisticFalseAlarm(int count, int rank, double t) {
    double logP = 0.0;
    for (int i = 0; i < rank; ++i) logP += std::log((count - i) / (count - i + t));
    return std::exp(logP);
}

double orderStatisticThreshold(int count, int rank, double probability) {
    // The chance falls monotonically with t: bisect on a logarithmic scale.
    double lo = 1.0, hi = 1e12;
    for (int i = 0; i < 200; ++i) {
        const double mid = std::sqrt(lo * hi);
        (orderStatisticFalseAlarm(count, rank, mid) > probability ? lo : hi) = mid;
    }
    return hi;
}

}  // namespace host
}  // namespace korvo
