// What a simulated room looks like in shared memory. Every process of the room
// maps the same bytes, so everything here is fixed-size and made of lock-free
// atomics: a process may die at any instruction without leaving a lock behind.
#pragma once
#include <atomic>
#include <cstddef>
#include <cstdint>

namespace korvo {
namespace platform {
namespace sim {

constexpr uint32_t kRoomRate = 44100;
// Sound written now is heard this much later (a device's output plus input path).
constexpr int64_t kLatencySamples = kRoomRate * 20 / 1000;
constexpr int kSpeakerSlots = 16;
constexpr int kMaxMembers = 64;
// Each speaker keeps the last ~3 s it wrote, so a microphone may lag that much.
constexpr int64_t kRingSamples = int64_t(1) << 17;
constexpr int64_t kRingMask = kRingSamples - 1;

constexpr uint64_t kRoomMagic = 0x4d4f4f5256524f4bULL;  // "KORVROOM" in memory order
constexpr uint32_t kRoomVersion = 1;

static_assert(std::atomic<int64_t>::is_always_lock_free, "shared counters need lock-free atomics");
static_assert(std::atomic<uint64_t>::is_always_lock_free, "shared owners need lock-free atomics");
static_assert(std::atomic<int16_t>::is_always_lock_free, "shared samples need lock-free atomics");
static_assert(sizeof(std::atomic<int16_t>) == sizeof(int16_t), "samples are stored at their own width");

// One loudspeaker's recent output, indexed by timeline position. A single writer
// (the owner) fills [begin, end) contiguously; readers take only positions they
// can prove were not overwritten while they read.
struct alignas(64) SpeakerSlot {
    std::atomic<uint64_t> owner;  // process identity of the writer, 0 when free
    std::atomic<int64_t> begin;   // oldest position still held
    std::atomic<int64_t> end;     // one past the newest position written
    std::atomic<int16_t> ring[kRingSamples];
};

struct RoomHeader {
    std::atomic<uint64_t> magic;  // stored last when the room is set up
    uint32_t version;
    uint32_t sampleRate;
    uint32_t speakerSlots;
    uint32_t maxMembers;
    uint64_t ringSamples;
    uint64_t layoutSize;
    // Process identity of every route in the room (microphones and speakers), 0 when free.
    std::atomic<uint64_t> members[kMaxMembers];
};

struct RoomLayout {
    RoomHeader header;
    SpeakerSlot slots[kSpeakerSlots];
};

}  // namespace sim
}  // namespace platform
}  // namespace korvo
