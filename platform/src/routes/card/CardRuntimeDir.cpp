#include "routes/card/CardRuntimeDir.h"

#include <dirent.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

namespace korvo {
namespace platform {
namespace card {

namespace {
int gSessions = 0;      // card sessions alive
std::string gOwnDir;    // the private folder while in use, empty when the environment has one

bool set(const char* name) {
    const char* v = std::getenv(name);
    return v != nullptr && *v != '\0';
}

void removeTree(const std::string& dir) {
    if (DIR* d = opendir(dir.c_str())) {
        while (const dirent* e = readdir(d)) {
            const std::string name = e->d_name;
            if (name != "." && name != "..") unlink((dir + "/" + name).c_str());
        }
        closedir(d);
    }
    rmdir(dir.c_str());
}
}  // namespace

void acquireRuntimeDir() {
    if (gSessions++ > 0 || set("XDG_RUNTIME_DIR") || set("PULSE_RUNTIME_PATH")) return;
    char dir[] = "/tmp/korvo-sound-XXXXXX";
    if (mkdtemp(dir) == nullptr) return;
    gOwnDir = dir;
    setenv("PULSE_RUNTIME_PATH", dir, 1);
}

void releaseRuntimeDir() {
    if (--gSessions > 0 || gOwnDir.empty()) return;
    unsetenv("PULSE_RUNTIME_PATH");
    removeTree(gOwnDir);
    gOwnDir.clear();
}

}  // namespace card
}  // namespace platform
}  // namespace korvo
