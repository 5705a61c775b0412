// The null route: silence from the microphone, discarded output, both at real-time pace.
#include <cstring>

#include <utils/Errors.h>

#include "routes/RouteBackend.h"
#include "routes/common/Pacer.h"

namespace korvo {
namespace platform {

namespace {

class NullCaptureRoute : public CaptureRoute {
public:
    int open(uint32_t sampleRate) override {
        if (sampleRate == 0) return android::BAD_VALUE;
        mPacing.start(sampleRate);
        mOpened = true;
        return 0;
    }
    ssize_t read(int16_t* out, size_t count) override {
        if (!mOpened) return android::NO_INIT;
        const size_t n = mPacing.next(count);
        std::memset(out, 0, n * sizeof(int16_t));
        return static_cast<ssize_t>(n);
    }
    void stop() override { mPacing.stop(); }
    std::string failure() const override { return {}; }

private:
    CapturePacing mPacing;
    bool mOpened = false;
};

class NullOutputRoute : public OutputRoute {
public:
    int open(uint32_t sampleRate) override {
        if (sampleRate == 0) return android::BAD_VALUE;
        mPacing.start(sampleRate);
        return 0;
    }
    int write(const int16_t* /*samples*/, size_t count) override {
        mPacing.next(count);
        return 0;
    }
    void stop() override { mPacing.stop(); }
    std::string failure() const override { return {}; }

private:
    OutputPacing mPacing;
};

std::unique_ptr<CaptureRoute> openCapture(const std::string& /*arg*/, std::string* /*error*/) {
    return std::make_unique<NullCaptureRoute>();
}

std::unique_ptr<OutputRoute> openOutput(const std::string& /*arg*/, std::string* /*error*/) {
    return std::make_unique<NullOutputRoute>();
}

// Silence and discard are always there.
bool check(const std::string& /*arg*/, bool /*speaker*/, std::string* /*cause*/) { return true; }

}  // namespace

extern const RouteBackend kNullBackend;
const RouteBackend kNullBackend = {"null", "null", true, nullptr, openCapture, openOutput, check, nullptr, nullptr};

}  // namespace platform
}  // namespace korvo
