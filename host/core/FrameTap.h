// Every frame the plug-in captured, read from its frame record after each capture step.
//
// A capture step completes at most one frame, in the ring slot after the previous one, and
// publishes the record only then. So a record whose slot or samples differ from the last
// one seen holds a new frame; a step that completed none (a short or failed read) leaves
// the record as it was, and gives no frame: nothing is invented.
#pragma once
#include <array>
#include <cstdint>

#include "interface/FrameRecord.h"

namespace korvo {
namespace host {

class FrameTap {
public:
    // Takes the record as it stands as seen: a frame of an earlier meter is not new.
    explicit FrameTap(read_write_audio_t read);

    // After a capture step: the samples of the frame it completed, or null.
    const int16_t* next();

private:
    read_write_audio_t mRead;
    Mmic_data_t mRecord{};
    int32_t mLastSlot = -1;
    std::array<int16_t, korvo::kFrameSamples> mLast{};
};

}  // namespace host
}  // namespace korvo
