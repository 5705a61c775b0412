#include "host/output/FileWatch.h"

#include <korvo/platform/Routes.h>

#include "host/output/Output.h"

namespace korvo {
namespace host {

namespace {
constexpr int64_t kProgressEveryMs = 200;
}

FileWatch::FileWatch(bool showProgress)
    : mTerminal(showProgress && hostOutputIsTerminal() && outputMode() == OutputMode::Normal) {}

bool FileWatch::over(int64_t now) {
    const korvo::platform::SourceProgress p = korvo::platform::microphoneStatus().progress;
    if (!p.finite) return false;
    if (p.ended && mEndedAt < 0) mEndedAt = now;
    if (mTerminal && now >= mNextShow) {
        mNextShow = now + kProgressEveryMs;
        if (p.totalSeconds > 0) {
            outf("\r  %.1f s of %.1f s in the file, %.1f s left\x1b[K", p.seconds, p.totalSeconds,
                 p.totalSeconds > p.seconds ? p.totalSeconds - p.seconds : 0.0);
        } else {
            outf("\r  %.1f s of the stream\x1b[K", p.seconds);
        }
        mShown = true;
    }
    return mEndedAt >= 0 && now >= mEndedAt + kFileTailMs;
}

void FileWatch::clear() {
    if (mShown) outf("\r\x1b[K");
    mShown = false;
}

}  // namespace host
}  // namespace korvo
