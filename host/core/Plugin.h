// Loading the plug-in: dlopen, and the exported functions looked up by name: the
// factory, the destroy function and the frame record's reader.
#pragma once
#include <string>

#include "interface/FrameRecord.h"
#include "interface/SoundMeter_vir.h"

namespace korvo {
namespace host {

class Plugin {
public:
    Plugin() = default;
    Plugin(const Plugin&) = delete;
    Plugin& operator=(const Plugin&) = delete;
    ~Plugin();

    // ../lib/libkorvo_soundmeter.so next to this executable.
    static std::string defaultPath();
    // --plugin, else KORVO_PLUGIN, else the default path.
    static std::string choosePath(const std::string& option);

    bool load(const std::string& path, std::string* error);
    // Unloads the plug-in; every meter object must be destroyed before.
    void unload();

    SoundMeter_vir* make() const { return mMaker ? mMaker() : nullptr; }
    void destroy(SoundMeter_vir* meter) const {
        if (mDestroy) mDestroy(meter);
    }

    // read_write_audio: copies the frame record the capture steps publish.
    read_write_audio_t frameRecordReader() const { return mReadRecord; }

private:
    void* mHandle = nullptr;
    read_write_audio_t mReadRecord = nullptr;
    soundMeter_maker_t mMaker = nullptr;
    soundMeter_destroy_t mDestroy = nullptr;
};

}  // namespace host
}  // namespace korvo
