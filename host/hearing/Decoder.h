// How a listener decides which codes it hears. Every decoder is one entry of the table in
// Decoder.cpp: its name for --decoder, the codes it hears, whether it takes a detection
// level and whether it can hear a recording offline, and how one is made. A new decoder is
// a class and a row there.
//
// After each capture step a decoder gets the frames that step completed (the plug-in's
// frame record, or a recording's frames offline) and, live, the plug-in's read-outs.
#pragma once
#include <cstdint>
#include <memory>

#include "host/hearing/Ear.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

enum class DecoderKind { Host, Builtin };

// Codes a decoder can report. The host's decoder hears every code below half the
// capture rate (0..22); HearFreqIdx reads the masked read-out, whose bands end with code 17.
constexpr int kHostCodes = 23;
constexpr int kBuiltinCodes = 18;
constexpr int codesHeardBy(DecoderKind kind) { return kind == DecoderKind::Host ? kHostCodes : kBuiltinCodes; }
constexpr bool hears(DecoderKind kind, int code) { return code >= 0 && code < codesHeardBy(kind); }

// Bit c for code c.
using CodeSet = uint64_t;
constexpr CodeSet codeBit(int code) { return CodeSet{1} << code; }

// What a decoder hears after one capture step.
struct StepInput {
    const int16_t* const* frames = nullptr;  // the frames the step completed, oldest first
    int frameCount = 0;
    Ear* ear = nullptr;  // the plug-in's read-outs; null offline
};

class Decoder {
public:
    virtual ~Decoder() = default;
    // After a capture step: the codes that begin to be heard (each sounding once).
    virtual CodeSet hear(const StepInput& in) = 0;
    // The codes heard now.
    virtual CodeSet sounding() const = 0;
    // Forgets everything heard so far.
    virtual void reset() = 0;
    // The spectrum it heard last, as read-out levels of bins 0..255; false when it hears
    // through the plug-in's read-out and has none of its own.
    virtual bool spectrum(float* out) const {
        (void)out;
        return false;
    }
};

struct DecoderInfo {
    DecoderKind kind;
    const char* name;  // as --decoder takes it
    const char* help;  // what it does, for --help
    bool takesLevel;   // --level and calibration apply to it
    bool offline;      // hears frames alone: a recording without the plug-in
    std::unique_ptr<Decoder> (*make)();
};

const DecoderInfo& decoderInfo(DecoderKind kind);
// Every decoder, the default first.
const DecoderInfo* decoderTable(int* count);
// "host" or "builtin", as --decoder takes it.
inline const char* decoderName(DecoderKind kind) { return decoderInfo(kind).name; }
inline std::unique_ptr<Decoder> makeDecoder(DecoderKind kind) { return decoderInfo(kind).make(); }

}  // namespace host
}  // namespace korvo
