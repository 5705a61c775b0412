#include "host/core/OfflineRun.h"

#include <algorithm>
#include <vector>

#include "host/base/Interrupt.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

bool offlineOptionsApply(const CommonOptions& common, const char* command, DecoderKind decoder,
                         const LevelChoice& level) {
    if (!common.plugin.empty()) {
        errf("%s: --plugin does not apply: a recording is heard without the plug-in", command);
        return false;
    }
    if (!decoderInfo(decoder).offline) {
        errf("%s: the %s decoder hears only live, through the plug-in's read-outs (listen --mic wav:FILE)", command,
             decoderName(decoder));
        return false;
    }
    return levelApplies(command, level, decoder);
}

bool hearRecording(korvo::platform::Recording& recording, Decoder& decoder, double maxSeconds,
                   const std::function<void(int64_t frames, CodeSet begun)>& afterFrame, OfflineRun* run,
                   std::string* cause) {
    const long limit = maxSeconds > 0 ? static_cast<long>(maxSeconds * korvo::kSampleRate + 0.5) : -1;
    std::vector<int16_t> frame(korvo::kFrameSamples);
    long samples = 0;
    int64_t frames = 0;
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
        } else {
            // After the file a live microphone captures silence.
            std::fill(frame.begin(), frame.end(), int16_t{0});
        }
        if (ended) ++tail;
        const int16_t* one = frame.data();
        StepInput in;
        in.frames = &one;
        in.frameCount = 1;
        afterFrame(++frames, decoder.hear(in));
    }
    run->audioSeconds = static_cast<double>(samples) / korvo::kSampleRate;
    return true;
}

}  // namespace host
}  // namespace korvo
