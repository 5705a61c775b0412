// Turns the codes a decoder hears step by step into events: a code is reported when
// it begins to be heard, and again only after it has not been heard for kQuietSteps.
#pragma once
#include <array>
#include <cstdint>

#include "host/hearing/Decoder.h"

namespace korvo {
namespace host {

class CodeEvents {
public:
    // About 116 ms: the gap between two tones that makes them two events.
    static constexpr int64_t kQuietSteps = 10;

    // The codes heard at `step`; returns those that begin there.
    CodeSet update(int64_t step, CodeSet heard);

private:
    std::array<int64_t, korvo::kPlanCodes> mLastHeard = filled();
    static std::array<int64_t, korvo::kPlanCodes> filled() {
        std::array<int64_t, korvo::kPlanCodes> a{};
        a.fill(-kQuietSteps - 1);
        return a;
    }
};

}  // namespace host
}  // namespace korvo
