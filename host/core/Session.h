// Everything one device process needs around its meter object: the environment,
// the plug-in's standard output, the loaded plug-in and the device itself.
#pragma once
#include <memory>

#include "host/core/Device.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Plugin.h"

namespace korvo {
namespace host {

// On the null speaker route, says once (on stderr, in normal mode) that nothing is
// audible and how to play through the sound card.
void noteSilentSpeaker();

class Session {
public:
    explicit Session(const CommonOptions& common) : mCommon(common) {}
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;
    ~Session() { close(); }

    // Checks the routes the settings name, then brings the device up. 0 on success;
    // otherwise one line was printed and the result is the exit status (2 for an
    // unusable route, 1 when the plug-in or the device failed). Without a handler the
    // plug-in's stdout lines follow -v.
    int open(const DeviceSettings& settings, LibraryStdout::LineHandler handler = nullptr);
    // Tears down in order: device, plug-in, standard output.
    void close();

    Device& device() { return *mDevice; }
    SoundMeter_vir& meter() { return mDevice->meter(); }
    // Ctrl-C or a failed route (its line printed once), if either happened.
    Outcome interruption() { return mDevice->interruption(); }

private:
    CommonOptions mCommon;
    RouteWatch mWatch;
    LibraryStdout mStdout;
    Plugin mPlugin;
    std::unique_ptr<Device> mDevice;
};

}  // namespace host
}  // namespace korvo
