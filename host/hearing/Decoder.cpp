#include "host/hearing/Decoder.h"

#include "host/hearing/BuiltinDecision.h"
#include "host/hearing/HostDecision.h"

namespace korvo {
namespace host {

const char* decoderName(DecoderKind kind) { return kind == DecoderKind::Host ? "host" : "builtin"; }

std::unique_ptr<Decoder> makeDecoder(DecoderKind kind) {
    if (kind == DecoderKind::Host) return std::make_unique<HostDecision>();
    return std::make_unique<BuiltinDecision>();
}

}  // namespace host
}  // namespace korvo
