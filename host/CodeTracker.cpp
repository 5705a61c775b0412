#include "host/CodeTracker.h"

namespace korvo {
namespace host {

uint64_t CodeTracker::update(int64_t nowMs, int codeA, int codeB) {
    uint64_t reported = 0;
    for (int c = 0; c < kCodeCount; ++c) {
        Track& t = mTracks[c];
        if (c == codeA || c == codeB) {
            if (t.firstSeen < 0) t.firstSeen = nowMs;
            t.lastSeen = nowMs;
            if (!t.sounding && nowMs - t.firstSeen >= kConfirmMs) {
                t.sounding = true;
                reported |= uint64_t{1} << c;
            }
        } else {
            t.firstSeen = -1;
            if (t.sounding && nowMs - t.lastSeen >= kReleaseMs) t.sounding = false;
        }
    }
    return reported;
}

int CodeTracker::current() const {
    int best = -1;
    int64_t newest = -1;
    for (int c = 0; c < kCodeCount; ++c) {
        const Track& t = mTracks[c];
        if (t.sounding && t.lastSeen > newest) {
            newest = t.lastSeen;
            best = c;
        }
    }
    return best;
}

}  // namespace host
}  // namespace korvo
