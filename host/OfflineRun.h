// Hears a recording through an offline listener, frame by frame, as fast as the
// processor allows: what scan and the spectrogram of a file share.
#pragma once
#include <functional>
#include <string>

#include <korvo/platform/Recording.h>

#include "host/hearing/OfflineListener.h"

namespace korvo {
namespace host {

// After the file's last sample a live listener goes on for 250 ms: its ring and the
// analysis hold a few more frames.
constexpr int kFileTailSteps = 22;

struct OfflineRun {
    double audioSeconds = 0.0;  // read from the file
    bool interrupted = false;   // Ctrl-C
};

// Steps `listener` through the recording (its first `maxSeconds`, 0 for all of it) and the
// tail, calling `afterStep` with the codes that begin at each step. False with the cause
// when the file cannot be decoded further.
bool hearRecording(korvo::platform::Recording& recording, OfflineListener& listener, double maxSeconds,
                   const std::function<void(CodeSet begun)>& afterStep, OfflineRun* run, std::string* cause);

}  // namespace host
}  // namespace korvo
