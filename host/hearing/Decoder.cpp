#include "host/hearing/Decoder.h"

#include "host/hearing/BuiltinDecoder.h"
#include "host/hearing/CodeEvents.h"
#include "host/hearing/FrameDecoder.h"

namespace korvo {
namespace host {
namespace {

// The host's decoder: every frame the plug-in captured, heard by the frame decoder.
class HostFrames : public Decoder {
public:
    CodeSet hear(const StepInput& in) override {
        CodeSet begun = 0;
        for (int i = 0; i < in.frameCount; ++i) begun |= mCore.addFrame(in.frames[i]);
        return begun;
    }
    CodeSet sounding() const override { return mCore.sounding(); }
    void reset() override { mCore.reset(); }
    bool spectrum(float* out) const override {
        mCore.levels(out);
        return true;
    }

private:
    FrameDecoder mCore;
};

// HearFreqIdx's decision on the plug-in's read-out after each step, a code reported when
// it begins to be heard.
class Builtin : public Decoder {
public:
    CodeSet hear(const StepInput& in) override {
        mHeard = in.ear ? mBuiltin.decide(*in.ear) : 0;
        return mEvents.update(++mSteps, mHeard);
    }
    CodeSet sounding() const override { return mHeard; }
    void reset() override {
        mEvents = CodeEvents();
        mHeard = 0;
    }

private:
    BuiltinDecoder mBuiltin;
    CodeEvents mEvents;
    int64_t mSteps = 0;
    CodeSet mHeard = 0;
};

template <class T>
std::unique_ptr<Decoder> make() {
    return std::make_unique<T>();
}

const DecoderInfo kDecoders[] = {
    {DecoderKind::Host, "host",
     "every captured frame, each code's line against the noise around it over windows of 12 ms to 280 ms "
     "(codes 0..22; no detection level)",
     false, true, make<HostFrames>},
    {DecoderKind::Builtin, "builtin",
     "the plug-in's HearFreqIdx decision: the two peaks of one masked read-out (codes 0..17; live only)", true,
     false, make<Builtin>},
};

}  // namespace

const DecoderInfo& decoderInfo(DecoderKind kind) {
    for (const DecoderInfo& d : kDecoders) {
        if (d.kind == kind) return d;
    }
    return kDecoders[0];
}

const DecoderInfo* decoderTable(int* count) {
    *count = static_cast<int>(sizeof kDecoders / sizeof kDecoders[0]);
    return kDecoders;
}

}  // namespace host
}  // namespace korvo
