#include "routes/sim/SimRoomMembership.h"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "routes/sim/SimRoomConfig.h"

namespace korvo {
namespace platform {
namespace sim {

namespace {

// A joiner whose room keeps being removed under it gives up after this many tries.
constexpr int kJoinAttempts = 50;

std::string errnoText(int err) { return std::strerror(err); }

void lockFile(int fd) {
    while (flock(fd, LOCK_EX) == -1 && errno == EINTR) {
    }
}

void unlockFile(int fd) { flock(fd, LOCK_UN); }

// True while `path` still refers to the file open on fd.
bool stillNamed(int fd, const std::string& path) {
    struct stat a{}, b{};
    return fstat(fd, &a) == 0 && stat(path.c_str(), &b) == 0 && a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// Makes sure the user's room folder exists and is private to the user; false with a
// reason when it cannot be used (another user made it first, or it is not private).
bool privateFolder(std::string* error, bool create) {
    const std::string dir = roomFolder();
    if (create && mkdir(dir.c_str(), 0700) != 0 && errno != EEXIST) {
        if (error) *error = "cannot make the room folder " + dir + ": " + errnoText(errno);
        return false;
    }
    struct stat st{};
    if (lstat(dir.c_str(), &st) != 0) {
        if (errno == ENOENT && !create) return true;
        if (error) *error = "cannot use the room folder " + dir + ": " + errnoText(errno);
        return false;
    }
    if (!S_ISDIR(st.st_mode) || st.st_uid != geteuid()) {
        if (error) *error = "the room folder " + dir + " belongs to another user";
        return false;
    }
    if ((st.st_mode & 0077) != 0) {
        if (error) *error = "the room folder " + dir + " is open to other users";
        return false;
    }
    return true;
}

// Removes the room folder once its last room has gone (fails harmlessly otherwise).
void dropFolderIfEmpty() { rmdir(roomFolder().c_str()); }

RoomLayout* mapLayout(int fd) {
    void* p = mmap(nullptr, sizeof(RoomLayout), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    return p == MAP_FAILED ? nullptr : static_cast<RoomLayout*>(p);
}

void unmapLayout(RoomLayout* layout) {
    if (layout) munmap(layout, sizeof(RoomLayout));
}

bool compatible(const RoomHeader& h) {
    return h.magic.load(std::memory_order_acquire) == kRoomMagic && h.version == kRoomVersion &&
           h.sampleRate == kRoomRate && h.speakerSlots == kSpeakerSlots &&
           h.maxMembers == kMaxMembers && h.ringSamples == uint64_t(kRingSamples) &&
           h.layoutSize == sizeof(RoomLayout);
}

bool alive(uint64_t identity) {
    return identity != 0 && processIdentity(int(identity >> 32)) == identity;
}

// Frees the entries of processes that are gone; returns the members still there.
// Called with the room's lock held.
int forgetDeparted(RoomLayout& layout) {
    int live = 0;
    for (auto& member : layout.header.members) {
        const uint64_t id = member.load(std::memory_order_acquire);
        if (id == 0) continue;
        if (alive(id)) {
            ++live;
        } else {
            member.store(0, std::memory_order_release);
        }
    }
    for (auto& slot : layout.slots) {
        const uint64_t id = slot.owner.load(std::memory_order_acquire);
        if (id != 0 && !alive(id)) slot.owner.store(0, std::memory_order_release);
    }
    return live;
}

// Removes the room at `path` if nobody uses it any more. Never waits: a room whose
// lock is taken is in use.
void reclaimIfAbandoned(const std::string& path) {
    const int fd = open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0) return;
    if (flock(fd, LOCK_EX | LOCK_NB) == 0) {
        struct stat st{};
        if (fstat(fd, &st) == 0 && stillNamed(fd, path)) {
            bool abandoned = false;
            if (st.st_size == 0) {
                abandoned = true;  // its creator died before setting it up, or will retry
            } else if (size_t(st.st_size) == sizeof(RoomLayout)) {
                if (RoomLayout* layout = mapLayout(fd)) {
                    const uint64_t magic = layout->header.magic.load(std::memory_order_acquire);
                    abandoned = magic == 0 || (compatible(layout->header) && forgetDeparted(*layout) == 0);
                    unmapLayout(layout);
                }
            }
            if (abandoned) unlink(path.c_str());
        }
    }
    close(fd);  // also drops the lock
}

void reclaimAbandonedRooms(const std::string& except) {
    DIR* dir = opendir(roomFolder().c_str());
    if (!dir) return;
    while (const dirent* entry = readdir(dir)) {
        // Room names may begin with a dot: skip only the folder's own entries.
        if (std::strcmp(entry->d_name, ".") == 0 || std::strcmp(entry->d_name, "..") == 0) continue;
        const std::string path = roomFolder() + "/" + entry->d_name;
        if (path != except) reclaimIfAbandoned(path);
    }
    closedir(dir);
}

void setUp(RoomLayout& layout) {
    RoomHeader& h = layout.header;
    h.version = kRoomVersion;
    h.sampleRate = kRoomRate;
    h.speakerSlots = kSpeakerSlots;
    h.maxMembers = kMaxMembers;
    h.ringSamples = uint64_t(kRingSamples);
    h.layoutSize = sizeof(RoomLayout);
    h.magic.store(kRoomMagic, std::memory_order_release);
}

}  // namespace

uint64_t processIdentity(int pid) {
    if (pid <= 0) return 0;
    char path[64];
    // The main thread's record: the process's own, and one that a user-mode emulator passes
    // through as the kernel wrote it (it makes up /proc/PID/stat for the process it runs, so
    // a process would not know itself as others see it).
    std::snprintf(path, sizeof path, "/proc/%d/task/%d/stat", pid, pid);
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        // Without /proc, fall back to the pid alone.
        if (access("/proc/self/stat", R_OK) != 0 && (kill(pid, 0) == 0 || errno == EPERM)) {
            return uint64_t(pid) << 32;
        }
        return 0;
    }
    char buf[1024];
    const ssize_t n = read(fd, buf, sizeof buf - 1);
    close(fd);
    if (n <= 0) return 0;
    buf[n] = '\0';
    // Fields after the command name: state is field 3, start time field 22.
    const char* p = std::strrchr(buf, ')');
    if (!p) return 0;
    char state = 0;
    unsigned long long start = 0;
    if (std::sscanf(p + 1,
                    " %c %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %llu",
                    &state, &start) != 2) {
        return 0;
    }
    if (state == 'Z' || state == 'X') return 0;
    return (uint64_t(pid) << 32) | uint32_t(start);
}

std::unique_ptr<RoomMembership> RoomMembership::join(const std::string& room, Role role,
                                                     std::string* error) {
    auto fail = [&](const std::string& why) {
        if (error) *error = why;
        return std::unique_ptr<RoomMembership>();
    };
    if (!validateRoomName(room, error)) return nullptr;
    const std::string name = roomPath(room);
    const uint64_t self = processIdentity(getpid());
    if (self == 0) return fail("sim room '" + room + "': cannot identify this process");
    std::string folderError;
    if (!privateFolder(&folderError, false)) return fail(folderError);
    reclaimAbandonedRooms(name);

    for (int attempt = 0; attempt < kJoinAttempts; ++attempt) {
        if (!privateFolder(&folderError, true)) return fail(folderError);
        const int fd = open(name.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
        if (fd < 0 && errno == ENOENT) continue;  // the folder went with its last room meanwhile
        if (fd < 0) return fail("cannot open sim room '" + room + "': " + errnoText(errno));
        lockFile(fd);
        // Closing fd drops the lock on every path below.
        auto failClosed = [&](const std::string& why) {
            close(fd);
            return fail(why);
        };
        struct stat st{};
        if (fstat(fd, &st) != 0) return failClosed("cannot inspect sim room '" + room + "'");
        if (st.st_uid != geteuid()) return failClosed("sim room '" + room + "' belongs to another user");
        if (!stillNamed(fd, name)) {  // unlinked by its last leaver while we waited
            close(fd);
            continue;
        }
        if ((st.st_mode & 0777) != 0600) fchmod(fd, 0600);  // the umask may have narrowed it

        bool fresh = st.st_size == 0;
        if (!fresh && size_t(st.st_size) != sizeof(RoomLayout)) {
            return failClosed("sim room '" + room + "' was made by an incompatible build");
        }
        if (!fresh) {
            RoomLayout* probe = mapLayout(fd);
            if (!probe) return failClosed("cannot map sim room '" + room + "': " + errnoText(errno));
            const uint64_t magic = probe->header.magic.load(std::memory_order_acquire);
            const bool ok = compatible(probe->header);
            unmapLayout(probe);
            if (magic == 0) {
                fresh = ftruncate(fd, 0) == 0;  // its creator died half-way: start clean
            } else if (!ok) {
                return failClosed("sim room '" + room + "' was made by an incompatible build");
            }
        }
        if (fresh && ftruncate(fd, off_t(sizeof(RoomLayout))) != 0) {
            return failClosed("cannot size sim room '" + room + "': " + errnoText(errno));
        }
        RoomLayout* layout = mapLayout(fd);
        if (!layout) return failClosed("cannot map sim room '" + room + "': " + errnoText(errno));
        if (fresh) setUp(*layout);
        forgetDeparted(*layout);

        std::unique_ptr<RoomMembership> m(new RoomMembership());
        m->mObjectName = name;
        m->mFd = fd;
        m->mLayout = layout;
        for (int i = 0; i < kMaxMembers && m->mMember < 0; ++i) {
            if (layout->header.members[i].load(std::memory_order_acquire) == 0) {
                layout->header.members[i].store(self, std::memory_order_release);
                m->mMember = i;
            }
        }
        if (m->mMember < 0) {
            unlockFile(fd);
            m.reset();
            return fail("sim room '" + room + "' is full (" + std::to_string(kMaxMembers) +
                        " devices)");
        }
        if (role == Role::Speaker) {
            // The free slot written longest ago: a speaker that just left may still
            // have sound queued, and a newcomer in its slot would wait behind it.
            int64_t oldest = INT64_MAX;
            for (int i = 0; i < kSpeakerSlots; ++i) {
                const SpeakerSlot& slot = layout->slots[i];
                const int64_t end = slot.end.load(std::memory_order_acquire);
                if (slot.owner.load(std::memory_order_acquire) == 0 && end < oldest) {
                    oldest = end;
                    m->mSlot = i;
                }
            }
            if (m->mSlot >= 0) layout->slots[m->mSlot].owner.store(self, std::memory_order_release);
            if (m->mSlot < 0) {
                unlockFile(fd);
                m.reset();  // leaves again
                return fail("sim room '" + room + "' is full (" + std::to_string(kSpeakerSlots) +
                            " speakers)");
            }
        }
        unlockFile(fd);
        return m;
    }
    return fail("cannot join sim room '" + room + "': it keeps being removed");
}

RoomMembership::~RoomMembership() {
    if (mFd < 0) return;
    lockFile(mFd);
    if (mMember >= 0) mLayout->header.members[mMember].store(0, std::memory_order_release);
    if (mSlot >= 0) mLayout->slots[mSlot].owner.store(0, std::memory_order_release);
    if (forgetDeparted(*mLayout) == 0 && stillNamed(mFd, mObjectName)) unlink(mObjectName.c_str());
    unmapLayout(mLayout);
    close(mFd);  // drops the lock
    dropFolderIfEmpty();  // also when the room was removed under this member
}

bool RoomMembership::stillThere() const { return stillNamed(mFd, mObjectName); }

namespace {

struct Occupants {
    int members = 0;
    int speakers = 0;  // of processes other than `ours`
    std::vector<pid_t> ours;
};

// Counts the live members of a room under its lock, without joining it; a room not
// made yet is empty. False with a reason when the room cannot be read.
bool countOccupants(const std::string& room, Occupants* out, std::string* error) {
    if (!validateRoomName(room, error) || !privateFolder(error, false)) return false;
    const int fd = open(roomPath(room).c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0) {
        if (errno == ENOENT) return true;  // a new room: joining creates it
        if (error) *error = "cannot open sim room '" + room + "': " + errnoText(errno);
        return false;
    }
    lockFile(fd);
    std::string why;
    struct stat st{};
    RoomLayout* layout = nullptr;
    if (fstat(fd, &st) == 0 && size_t(st.st_size) == sizeof(RoomLayout) && (layout = mapLayout(fd)) != nullptr) {
        if (!compatible(layout->header)) {
            if (layout->header.magic.load(std::memory_order_acquire) != 0) why = "sim room '" + room + "' was made by an incompatible build";
        } else {
            forgetDeparted(*layout);
            for (const auto& m : layout->header.members) out->members += m.load(std::memory_order_acquire) != 0;
            for (const auto& slot : layout->slots) {
                const uint64_t owner = slot.owner.load(std::memory_order_acquire);
                const pid_t pid = pid_t(owner >> 32);
                out->speakers += owner != 0 && std::find(out->ours.begin(), out->ours.end(), pid) == out->ours.end();
            }
        }
        unmapLayout(layout);
    } else if (st.st_size != 0) {
        why = "sim room '" + room + "' was made by an incompatible build";
    }
    close(fd);
    if (!why.empty() && error) *error = why;
    return why.empty();
}

}  // namespace

bool RoomMembership::check(const std::string& room, Role role, std::string* error) {
    Occupants o;
    if (!countOccupants(room, &o, error)) return false;
    if (o.members >= kMaxMembers || (role == Role::Speaker && o.speakers >= kSpeakerSlots)) {
        if (error) *error = "sim room '" + room + "' is full";
        return false;
    }
    return true;
}

int RoomMembership::speakers(const std::string& room, const std::vector<pid_t>& ours, std::string* error) {
    Occupants o;
    o.ours = ours;
    return countOccupants(room, &o, error) ? o.speakers : -1;
}

}  // namespace sim
}  // namespace platform
}  // namespace korvo
