// How a listener decides which codes it hears: the host's own decision, or the one
// the plug-in's HearFreqIdx makes (kept for comparison). A decoder looks at one
// hearing step at a time, right after its capture step.
#pragma once
#include <cstdint>
#include <memory>

#include "host/hearing/Ear.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

enum class DecoderKind { Host, Builtin };

// "host" or "builtin", as --decoder takes it.
const char* decoderName(DecoderKind kind);

// Codes a decoder can report: their bins lie in the read-out it uses. The host's
// decision reads every bin (codes 0..22, bins 30..250); HearFreqIdx reads the masked
// read-out, whose bands end with code 17.
constexpr int kHostCodes = 23;
constexpr int kBuiltinCodes = 18;
constexpr int codesHeardBy(DecoderKind kind) { return kind == DecoderKind::Host ? kHostCodes : kBuiltinCodes; }
constexpr bool hears(DecoderKind kind, int code) { return code >= 0 && code < codesHeardBy(kind); }

// Bit c for code c.
using CodeSet = uint64_t;
constexpr CodeSet codeBit(int code) { return CodeSet{1} << code; }

class Decoder {
public:
    virtual ~Decoder() = default;
    // After a capture step: the codes heard now.
    virtual CodeSet hear(Ear& ear) = 0;
    // Forgets everything heard so far.
    virtual void reset() = 0;
};

std::unique_ptr<Decoder> makeDecoder(DecoderKind kind);

}  // namespace host
}  // namespace korvo
