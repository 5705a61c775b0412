#include "host/hearing/CodeEvents.h"

namespace korvo {
namespace host {

CodeSet CodeEvents::update(int64_t step, CodeSet heard) {
    CodeSet begun = 0;
    for (int c = 0; c < korvo::kPlanCodes; ++c) {
        if (!(heard & codeBit(c))) continue;
        if (step - mLastHeard[static_cast<size_t>(c)] > kQuietSteps) begun |= codeBit(c);
        mLastHeard[static_cast<size_t>(c)] = step;
    }
    return begun;
}

}  // namespace host
}  // namespace korvo
