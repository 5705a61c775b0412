#include "host/OfflineRun.h"

#include <algorithm>
#include <vector>

#include "host/Interrupt.h"

namespace korvo {
namespace host {

bool hearRecording(korvo::platform::Recording& recording, OfflineListener& listener, double maxSeconds,
                   const std::function<void(CodeSet begun)>& afterStep, OfflineRun* run, std::string* cause) {
    const long limit = maxSeconds > 0 ? static_cast<long>(maxSeconds * korvo::kSampleRate + 0.5) : -1;
    std::vector<int16_t> frame(korvo::kFrameSamples);
    long samples = 0;
    int tail = 0;
    bool ended = false;
    while (tail < kFileTailSteps) {
        if (interrupted()) {
            run->interrupted = true;
            return true;
        }
        if (!ended) {
            long want = korvo::kFrameSamples;
            if (limit >= 0) want = std::min(want, limit - samples);
            const long got = want > 0 ? recording.read(frame.data(), want, cause) : 0;
            if (got < 0) return false;
            samples += got;
            ended = got < korvo::kFrameSamples;
            std::fill(frame.begin() + got, frame.end(), int16_t{0});
        }
        if (ended) ++tail;
        afterStep(listener.step(frame.data()));
    }
    run->audioSeconds = static_cast<double>(samples) / korvo::kSampleRate;
    return true;
}

}  // namespace host
}  // namespace korvo
