// The sound cards PortAudio offers and the choice of one by a DEVICE text: empty for
// the default device, a number for a device index, else a case-insensitive part of a
// device's name (a whole name wins over the names it is a part of). Callers hold a
// card::Session.
#pragma once
#include <portaudio.h>

#include <string>

namespace korvo {
namespace platform {
namespace card {

constexpr double kCardRate = 44100.0;  // every card route runs at it, mono 16-bit

// The device for input or output; paNoDevice with a one-line reason that lists the
// candidates when DEVICE names none or several.
PaDeviceIndex chooseDevice(const std::string& device, bool input, std::string* error);

// The stream parameters the routes open a device with.
PaStreamParameters streamParameters(PaDeviceIndex device, bool input);

// Whether the device runs 44100 Hz mono 16-bit; false with a one-line reason.
bool supportsCardFormat(PaDeviceIndex device, bool input, std::string* error);

}  // namespace card
}  // namespace platform
}  // namespace korvo
