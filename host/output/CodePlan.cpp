#include "host/output/CodePlan.h"

#include <algorithm>
#include <cmath>

#include "host/hearing/FrameDecoder.h"
#include "host/output/JsonEvent.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

int codeNear(int hz) {
    for (int c = 0; c < kHostCodes; ++c) {
        if (std::fabs(static_cast<double>(hz) / codeHz(c) - 1.0) <= FrameDecoder::kTolerance) return c;
    }
    return -1;
}

std::string codeTruth(int code, int outputRate) {
    const int hz = codeHz(code);
    char text[320];
    if (hears(DecoderKind::Builtin, code)) return "";
    if (hears(DecoderKind::Host, code)) {
        snprintf(text, sizeof text,
                 "code %d (%d Hz) is heard as code %d by listeners that use the host's decision; HearFreqIdx's "
                 "(--decoder builtin) reads a masked spectrum that ends at code 17 and reports nothing",
                 code, hz, code);
        return text;
    }
    if (2 * hz > outputRate) {
        const int folded = std::max(outputRate - hz, 0);
        const int near = codeNear(folded);
        if (near >= 0) {
            snprintf(text, sizeof text,
                     "code %d (%d Hz) lies above half the output rate (%d Hz): the speaker plays %d Hz instead, "
                     "which the host's decoder hears as code %d (%d Hz; it allows a sender %.1f %% off); "
                     "HearFreqIdx's decision reports nothing",
                     code, hz, outputRate / 2, folded, near, codeHz(near), 100.0 * FrameDecoder::kTolerance);
        } else {
            snprintf(text, sizeof text,
                     "code %d (%d Hz) lies above half the output rate (%d Hz): the speaker plays %d Hz instead, "
                     "which no code stands for, and no listener reports a code",
                     code, hz, outputRate / 2, folded);
        }
    } else {
        snprintf(text, sizeof text,
                 "code %d (%d Hz) lies above half the capture rate (%d Hz): a listener cannot capture it, and "
                 "none reports a code",
                 code, hz, korvo::kSampleRate / 2);
    }
    return text;
}

const char* codeReach(int code, DecoderKind decoder) {
    if (hears(decoder, code)) return "can be heard";
    if (hears(DecoderKind::Host, code)) return "is masked out of the read-out that --decoder builtin uses";
    return "lies above half the capture rate (22050 Hz) and cannot be heard";
}

const char* const kReachText =
    "Codes: code c (0..39) is a tone of 86*(30+10c) Hz. Codes 0..22 (2580..21500 Hz) lie in\n"
    "the spectrum's 256 bins and are heard by the host's decision; HearFreqIdx's decision\n"
    "(--decoder builtin) reads a masked spectrum whose bands end with code 17 (17200 Hz).\n"
    "Codes 23..39 (22360 Hz and up) lie above half the capture rate (22050 Hz): no\n"
    "listener reports them as themselves. (A 44.1 kHz speaker plays 23..36 folded back near\n"
    "code 45-c, which the host's decoder, allowing a sender 2.5 % off, hears as that code.)";

void printHeard(int code, double t) {
    resultf(JsonEvent("heard").add("code", code).add("hz", codeHz(code)).add("t_s", t), "%8.3f s  heard code %d (%d Hz)\n",
            t, code, codeHz(code));
}

}  // namespace host
}  // namespace korvo
