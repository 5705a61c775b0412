// The card[:DEVICE] routes: a real sound card through PortAudio, 44100 Hz mono
// 16-bit. DEVICE chooses the device (CardDevices.h); CardStream moves the samples.
#include <utils/Errors.h>

#include <memory>

#include "routes/RouteBackend.h"
#include "routes/card/CardDevices.h"
#include "routes/card/CardSession.h"
#include "routes/card/CardStream.h"

namespace korvo {
namespace platform {

namespace {

class CardCaptureRoute : public CaptureRoute {
public:
    CardCaptureRoute(std::unique_ptr<card::Session> session, PaDeviceIndex device)
        : mSession(std::move(session)), mStream(device, true) {}

    int open(uint32_t sampleRate) override { return mStream.open(sampleRate) ? android::OK : android::NO_INIT; }

    ssize_t read(int16_t* out, size_t count) override {
        size_t moved = 0;
        if (!mStream.read(out, count, &moved)) return ssize_t(android::UNKNOWN_ERROR);
        return ssize_t(moved);
    }

    void stop() override { mStream.stop(); }
    std::string failure() const override { return mStream.failure(); }

private:
    std::unique_ptr<card::Session> mSession;  // outlives the stream
    card::CardStream mStream;
};

class CardOutputRoute : public OutputRoute {
public:
    CardOutputRoute(std::unique_ptr<card::Session> session, PaDeviceIndex device)
        : mSession(std::move(session)), mStream(device, false) {}

    int open(uint32_t sampleRate) override { return mStream.open(sampleRate) ? android::OK : android::NO_INIT; }

    int write(const int16_t* samples, size_t count) override {
        return mStream.write(samples, count) ? android::OK : android::UNKNOWN_ERROR;
    }

    void stop() override { mStream.stop(); }
    std::string failure() const override { return mStream.failure(); }

private:
    std::unique_ptr<card::Session> mSession;
    card::CardStream mStream;
};

// Starts PortAudio and chooses a device that runs the card format; null with a
// one-line reason.
std::unique_ptr<card::Session> prepare(const std::string& device, bool input, PaDeviceIndex* index,
                                       std::string* error) {
    auto session = std::make_unique<card::Session>();
    if (!session->ok()) {
        if (error) *error = "no sound card: " + session->error();
        return nullptr;
    }
    *index = card::chooseDevice(device, input, error);
    if (*index == paNoDevice || !card::supportsCardFormat(*index, input, error)) return nullptr;
    return session;
}

bool checkCardRoute(const std::string& device, bool speaker, std::string* reason) {
    PaDeviceIndex index = paNoDevice;
    return prepare(device, !speaker, &index, reason) != nullptr;
}

std::unique_ptr<CaptureRoute> makeCardCaptureRoute(const std::string& device, std::string* error) {
    PaDeviceIndex index = paNoDevice;
    auto session = prepare(device, true, &index, error);
    if (!session) return nullptr;
    return std::make_unique<CardCaptureRoute>(std::move(session), index);
}

std::unique_ptr<OutputRoute> makeCardOutputRoute(const std::string& device, std::string* error) {
    PaDeviceIndex index = paNoDevice;
    auto session = prepare(device, false, &index, error);
    if (!session) return nullptr;
    return std::make_unique<CardOutputRoute>(std::move(session), index);
}

}  // namespace

extern const RouteBackend kCardBackend;
const RouteBackend kCardBackend = {"card",
                                   "card[:DEVICE]",
                                   true,
                                   "a device after 'card:' (or plain card for the default one)",
                                   makeCardCaptureRoute,
                                   makeCardOutputRoute,
                                   checkCardRoute,
                                   nullptr,
                                   nullptr};

}  // namespace platform
}  // namespace korvo
