// The envelope in the simulated room's presets: for every room and device preset, a peer's
// code heard through the room by the host's frame decoder at the demo's tone (64 ms, at the
// plug-in's level), and the room's background alone.
//
// A trial: a fresh room (its reverberation and background drawn anew), the listener's
// warm-up, 200..300 ms of the room, the peer's tone, then a second of the room, in which its
// reverberant tail dies away. The code heard after the tone began counts, with its latency
// from the tone's start at the loudspeaker (the path's delay included); the same code heard
// again is a repeat; any other code is a wrong code.
#pragma once
#include <string>

namespace korvo {
namespace envelope {

struct RoomSettings {
    std::string out;  // the folder the CSV files go to
    int trials = 100;  // per code and preset
    double quietMinutes = 10.0;  // of background alone, per preset
    unsigned threads = 1;
};

// Writes rooms-codes.csv (per preset and code) and rooms-summary.csv (per preset).
void measureRooms(const RoomSettings& settings);

}  // namespace envelope
}  // namespace korvo
