#include "host/core/Session.h"

#include <cstdio>

#include "host/core/Environment.h"

namespace korvo {
namespace host {

int Session::open(const DeviceSettings& settings, LibraryStdout::LineHandler handler) {
    std::string error;
    // Routes and log settings first: the platform reads them when the plug-in opens streams.
    if (!applyEnvironment(mCommon, &error)) {
        errf("%s", error.c_str());
        return 2;
    }
    if (int status = checkRoutes(settings.routes)) return status;
    mWatch = RouteWatch(settings.routes);
    if (!handler) handler = libraryLinesToStderr(mCommon.verbose > 0);
    if (!mStdout.start(std::move(handler), &error)) {
        errf("%s", error.c_str());
        return 1;
    }
    if (!mPlugin.load(Plugin::choosePath(mCommon.plugin), &error)) {
        close();
        errf("%s", error.c_str());
        return 2;  // --plugin or KORVO_PLUGIN: a setting that cannot be used
    }
    mDevice = std::make_unique<Device>(mPlugin, mWatch);
    if (!mDevice->open(settings, &error)) {
        close();
        errf("%s", error.c_str());
        return 1;
    }
    return 0;
}

void Session::close() {
    mDevice.reset();
    mPlugin.unload();
    fflush(stdout);  // "deleted" has no line end; push it through before the pipe closes
    mStdout.stop();
}

}  // namespace host
}  // namespace korvo
