// Hears a recording offline, as fast as the processor allows, the way a live listener
// hears it: the recording's 512-sample frames from its first sample, fed to a decoder
// that hears frames alone, then the silence a live listener captures after the file's
// end. What scan and the spectrogram of a file share.
#pragma once
#include <functional>
#include <string>

#include <korvo/platform/Recording.h>

#include "host/core/Options.h"
#include "host/hearing/Decoder.h"

namespace korvo {
namespace host {

// Whether the options fit hearing a recording without the plug-in (no --plugin, a decoder
// of frames, --level only for a decoder that takes one); false after saying why (exit 2).
bool offlineOptionsApply(const CommonOptions& common, const char* command, DecoderKind decoder,
                         const LevelChoice& level);

// After the file's last sample a live listener goes on for 250 ms.
constexpr int kFileTailSteps = 22;

struct OfflineRun {
    double audioSeconds = 0.0;  // read from the file
    bool interrupted = false;   // Ctrl-C
};

// Feeds `decoder` the recording's frames (its first `maxSeconds`, 0 for all of it) and the
// tail, calling `afterFrame` with the count of frames heard so far and the codes that
// begin at that frame. False with the cause when the file cannot be decoded further.
bool hearRecording(korvo::platform::Recording& recording, Decoder& decoder, double maxSeconds,
                   const std::function<void(int64_t frames, CodeSet begun)>& afterFrame, OfflineRun* run,
                   std::string* cause);

}  // namespace host
}  // namespace korvo
