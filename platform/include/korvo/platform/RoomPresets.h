// The simulated room's named situations, for hosts that offer them: rooms (KORVO_SIM_ROOM)
// and devices (KORVO_SIM_DEVICE). Their numbers live with the room's acoustics.
#pragma once
#include <string>
#include <vector>

#include <korvo/platform/Export.h>

namespace korvo {
namespace platform {

KORVO_PLATFORM_API std::vector<std::string> roomPresets();
KORVO_PLATFORM_API std::vector<std::string> devicePresets();
// How fast a device preset's clock runs against the room's, in ppm; 0 for an unknown name.
KORVO_PLATFORM_API double devicePresetClockPpm(const std::string& device);
// The highest frequency a device preset's loudspeaker carries a code at; 0 when it carries
// every code (or for an unknown name).
KORVO_PLATFORM_API double devicePresetTopHz(const std::string& device);

}  // namespace platform
}  // namespace korvo
