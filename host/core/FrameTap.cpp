#include "host/core/FrameTap.h"

#include <algorithm>

namespace korvo {
namespace host {

namespace {

bool validSlot(int32_t slot) { return slot >= 0 && slot < korvo::kRingSlots; }

}  // namespace

FrameTap::FrameTap(read_write_audio_t read) : mRead(read) {
    int unused = 0;
    mRead(&unused, 0, &mRecord);
    // Before any capture of the process the record is all zeros with a count of 0.
    if (mRecord.count > 0 && validSlot(mRecord.index)) {
        mLastSlot = mRecord.index;
        const int16_t* frame = mRecord.data + mRecord.index * korvo::kFrameSamples;
        std::copy(frame, frame + korvo::kFrameSamples, mLast.begin());
    }
}

const int16_t* FrameTap::next() {
    int unused = 0;
    mRead(&unused, 0, &mRecord);
    if (mRecord.count <= 0 || !validSlot(mRecord.index)) return nullptr;
    const int16_t* frame = mRecord.data + mRecord.index * korvo::kFrameSamples;
    if (mRecord.index == mLastSlot && std::equal(frame, frame + korvo::kFrameSamples, mLast.begin())) return nullptr;
    mLastSlot = mRecord.index;
    std::copy(frame, frame + korvo::kFrameSamples, mLast.begin());
    return frame;
}

}  // namespace host
}  // namespace korvo
