// A runtime folder for the sound server's client library when the process has none.
//
// Without XDG_RUNTIME_DIR (CI, a bare root shell) that library makes /tmp/pulse-XXXX and a
// link to it in ~/.config/pulse, and leaves both behind. While a card session lives, it is
// given a private folder instead (PULSE_RUNTIME_PATH), removed with the last session. A
// folder the environment already names is left alone. Called under the PortAudio lock.
#pragma once

namespace korvo {
namespace platform {
namespace card {

void acquireRuntimeDir();
void releaseRuntimeDir();

}  // namespace card
}  // namespace platform
}  // namespace korvo
