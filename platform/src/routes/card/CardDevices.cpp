#include "routes/card/CardDevices.h"

#include <korvo/platform/Routes.h>

#include <algorithm>
#include <cctype>
#include <vector>

#include "routes/card/CardSession.h"

namespace korvo {
namespace platform {
namespace card {

namespace {

// Error texts stay on one line whatever the user typed or a driver named.
std::string printable(std::string s) {
    for (char& c : s) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
    }
    return s;
}

std::string lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return char(std::tolower(c)); });
    return s;
}

int channelsOf(const PaDeviceInfo* info, bool input) {
    return info ? (input ? info->maxInputChannels : info->maxOutputChannels) : 0;
}

std::string nameOf(PaDeviceIndex i) {
    const PaDeviceInfo* info = Pa_GetDeviceInfo(i);
    return info && info->name ? info->name : "";
}

std::string shown(PaDeviceIndex i) { return std::to_string(i) + " '" + printable(nameOf(i)) + "'"; }

std::string listed(const std::vector<PaDeviceIndex>& devices) {
    std::string text;
    for (PaDeviceIndex i : devices) text += (text.empty() ? "" : ", ") + shown(i);
    return text;
}

}  // namespace

PaDeviceIndex chooseDevice(const std::string& device, bool input, std::string* error) {
    std::lock_guard<std::mutex> lock(paLock());
    const std::string dir = input ? "input" : "output";
    auto fail = [&](const std::string& why) {
        if (error) *error = why;
        return paNoDevice;
    };
    // Named when asked for by name, so that the one line says what was looked for.
    const std::string wanted = device.empty() ? "" : " for " + dir + " device '" + printable(device) + "'";
    const PaDeviceIndex count = Pa_GetDeviceCount();
    if (count < 0) return fail("no sound card" + wanted + ": the sound system cannot list devices: " + errorText(count));
    if (count == 0) return fail("no sound card found" + wanted);
    std::vector<PaDeviceIndex> all, candidates;
    for (PaDeviceIndex i = 0; i < count; ++i) {
        all.push_back(i);
        if (channelsOf(Pa_GetDeviceInfo(i), input) >= 1) candidates.push_back(i);
    }
    if (candidates.empty()) return fail("no sound card has " + dir + " channels; devices: " + listed(all));
    const std::string choices = listed(candidates);
    if (device.empty()) {
        const PaDeviceIndex d = input ? Pa_GetDefaultInputDevice() : Pa_GetDefaultOutputDevice();
        if (d == paNoDevice) return fail("no default " + dir + " device; devices: " + choices);
        return d;
    }
    if (std::all_of(device.begin(), device.end(), [](unsigned char c) { return std::isdigit(c); })) {
        const long index = device.size() > 9 ? -1 : std::stol(device);
        if (index < 0 || index >= count) return fail("no " + dir + " device number " + device + "; devices: " + choices);
        const auto d = PaDeviceIndex(index);
        if (std::find(candidates.begin(), candidates.end(), d) == candidates.end()) {
            return fail("device " + shown(d) + " has no " + dir + " channels; " + dir + " devices: " + choices);
        }
        return d;
    }
    const std::string part = lower(device);
    std::vector<PaDeviceIndex> matches;
    for (PaDeviceIndex i : candidates) {
        const std::string name = lower(nameOf(i));
        if (name == part) return i;
        if (name.find(part) != std::string::npos) matches.push_back(i);
    }
    if (matches.size() == 1) return matches.front();
    if (matches.empty()) return fail("no " + dir + " device matches '" + printable(device) + "'; devices: " + choices);
    return fail("'" + printable(device) + "' matches several " + dir + " devices: " + listed(matches));
}

PaStreamParameters streamParameters(PaDeviceIndex device, bool input) {
    const PaDeviceInfo* info = Pa_GetDeviceInfo(device);
    PaStreamParameters p{};
    p.device = device;
    p.channelCount = 1;
    p.sampleFormat = paInt16;
    // The device's safe latency rather than its lowest: a code takes a few hundred
    // milliseconds to be heard anyway, while buffers of a few milliseconds run dry
    // whenever the machine is busy.
    p.suggestedLatency = info ? (input ? info->defaultHighInputLatency : info->defaultHighOutputLatency) : 0.05;
    return p;
}

bool supportsCardFormat(PaDeviceIndex device, bool input, std::string* error) {
    std::lock_guard<std::mutex> lock(paLock());
    const PaStreamParameters p = streamParameters(device, input);
    const PaError err = Pa_IsFormatSupported(input ? &p : nullptr, input ? nullptr : &p, kCardRate);
    if (err == paFormatIsSupported) return true;
    if (error) {
        *error = std::string(input ? "input" : "output") + " device " + shown(device) +
                 " cannot run 44100 Hz mono 16-bit: " + errorText(err);
    }
    return false;
}

}  // namespace card

bool listCardDevices(std::vector<CardDevice>* devices, std::string* error) {
    card::Session session;
    if (!session.ok()) {
        if (error) *error = session.error();
        return false;
    }
    std::lock_guard<std::mutex> lock(card::paLock());
    const PaDeviceIndex count = Pa_GetDeviceCount();
    if (count < 0) {
        if (error) *error = "the sound system cannot list devices: " + card::errorText(count);
        return false;
    }
    devices->clear();
    for (PaDeviceIndex i = 0; i < count; ++i) {
        const PaDeviceInfo* info = Pa_GetDeviceInfo(i);
        if (!info) continue;
        CardDevice d;
        d.index = i;
        d.name = info->name ? info->name : "";
        d.inputChannels = info->maxInputChannels;
        d.outputChannels = info->maxOutputChannels;
        d.defaultRate = info->defaultSampleRate;
        d.defaultInput = i == Pa_GetDefaultInputDevice();
        d.defaultOutput = i == Pa_GetDefaultOutputDevice();
        devices->push_back(d);
    }
    return true;
}

}  // namespace platform
}  // namespace korvo
