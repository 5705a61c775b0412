// Thresholds of an order-statistic noise estimate: a bin's power is compared with the
// `rank`-th smallest of `count` reference bins. In noise alone every bin's power is
// exponential with the same mean, so the chance that a bin exceeds t times the estimate
// does not depend on how loud the noise is: prod_{i<rank} (count-i) / (count-i+t).
#pragma once

namespace korvo {
namespace host {

// The chance that noise alone passes factor t.
double orderStatisticFalseAlarm(int count, int rank, double t);

// The factor that noise alone passes with chance `probability`.
double orderStatisticThreshold(int count, int rank, double probability);

}  // namespace host
}  // namespace korvo
