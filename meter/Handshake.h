// Gates and the acknowledgement rule of the handshake state machine.
#pragma once

class SoundMeter;

namespace korvo {

// (listener bit and listener state 0 or 10) or (speaker bit and speaker state 1).
bool hearingGateOpen(const SoundMeter& m);
// (speaker bit and speaker state 0) or (listener bit, listener state 1 and acknowledgement on).
bool sayingGateOpen(const SoundMeter& m);

}  // namespace korvo
