// A route's place in a room: the mapped shared memory, its member entry and,
// for a speaker, its slot.
//
// Rooms are files in shared memory, in a folder private to their user
// (/dev/shm/korvo-<uid>, 0700): no other user can read, join or take a name there.
// Joining and leaving take flock() on the room: the kernel drops that lock when a
// process dies, so a crash never wedges a room. Under the lock a joiner checks that
// the name still refers to the file it opened (a leaver may have removed it
// meanwhile), sets the room up if it is new, forgets members whose process is gone
// and takes free entries; the last leaver removes the room, and the folder with its
// last room. Joining also removes rooms of this user that every member has left or
// died in. Audio itself never takes the lock (see SimRoomSlot.h).
#pragma once
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "routes/sim/SimRoomLayout.h"

namespace korvo {
namespace platform {
namespace sim {

class RoomMembership {
public:
    enum class Role { Microphone, Speaker };

    // Null with a one-line reason when the room cannot be joined.
    static std::unique_ptr<RoomMembership> join(const std::string& room, Role role,
                                                std::string* error);
    ~RoomMembership();  // leaves the room
    // Whether the room could be joined now, without joining it or leaving anything behind.
    static bool check(const std::string& room, Role role, std::string* error);
    // The speakers that processes other than `ours` hold in the room now (0 when it is
    // not there); -1 with a reason when it cannot be read.
    static int speakers(const std::string& room, const std::vector<pid_t>& ours, std::string* error);
    // False once the room's file has been removed or replaced under this member.
    bool stillThere() const;

    RoomMembership(const RoomMembership&) = delete;
    RoomMembership& operator=(const RoomMembership&) = delete;

    RoomLayout& layout() { return *mLayout; }
    // The speaker's own slot (speakers only).
    SpeakerSlot& slot() { return mLayout->slots[mSlot]; }

private:
    RoomMembership() = default;

    std::string mObjectName;
    int mFd = -1;
    RoomLayout* mLayout = nullptr;
    int mMember = -1;
    int mSlot = -1;
};

// Identity of a running process: its pid and start time, so that a recycled pid
// does not pass for the member that died. 0 when the process is gone or a zombie.
uint64_t processIdentity(int pid);

}  // namespace sim
}  // namespace platform
}  // namespace korvo
