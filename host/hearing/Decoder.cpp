#include "host/hearing/Decoder.h"

#include "host/hearing/BuiltinDecision.h"
#include "host/hearing/HostDecision.h"

namespace korvo {
namespace host {

const char* decoderName(DecoderKind kind) { return kind == DecoderKind::Host ? "host" : "builtin"; }

bool parseDecoder(const std::string& text, DecoderKind* kind) {
    if (text == "host") {
        *kind = DecoderKind::Host;
    } else if (text == "builtin") {
        *kind = DecoderKind::Builtin;
    } else {
        return false;
    }
    return true;
}

std::unique_ptr<Decoder> makeDecoder(DecoderKind kind) {
    if (kind == DecoderKind::Host) return std::make_unique<HostDecision>();
    return std::make_unique<BuiltinDecision>();
}

}  // namespace host
}  // namespace korvo
