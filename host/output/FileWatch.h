// Where a file microphone (a wav: route) stands: its end, and a progress line on a terminal.
#pragma once
#include <cstdint>

namespace korvo {
namespace host {

// After a file's last sample, the capture ring and the analysis thread hold a few
// more frames (5 frames of 11.6 ms, one analysed per 20 ms turn).
constexpr int64_t kFileTailMs = 250;

class FileWatch {
public:
    // `showProgress`: a progress line on a terminal in normal mode.
    explicit FileWatch(bool showProgress = true);
    // True once the file has been delivered whole and its last frames analysed (never
    // for a microphone that is not a file).
    bool over(int64_t now);
    // Clears the progress line before a result is printed.
    void clear();

private:
    bool mTerminal;
    int64_t mEndedAt = -1;
    int64_t mNextShow = 0;
    bool mShown = false;
};

}  // namespace host
}  // namespace korvo
