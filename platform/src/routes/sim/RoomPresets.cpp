#include <korvo/platform/RoomPresets.h>

#include "routes/sim/acoustics/Presets.h"

namespace korvo {
namespace platform {

std::vector<std::string> roomPresets() {
    std::vector<std::string> names;
    for (const acoustics::RoomPreset& p : acoustics::roomPresets()) names.emplace_back(p.name);
    return names;
}

std::vector<std::string> devicePresets() {
    std::vector<std::string> names;
    for (const acoustics::DevicePreset& p : acoustics::devicePresets()) names.emplace_back(p.name);
    return names;
}

double devicePresetClockPpm(const std::string& device) {
    const acoustics::DevicePreset* p = acoustics::findDevicePreset(device);
    return p ? p->clockPpm : 0.0;
}

double devicePresetTopHz(const std::string& device) {
    const acoustics::DevicePreset* p = acoustics::findDevicePreset(device);
    return p ? p->topHz : 0.0;
}

}  // namespace platform
}  // namespace korvo
