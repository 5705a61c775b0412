#include "routes/card/JackLeftovers.h"

#include <fcntl.h>
#include <log/log.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <thread>

namespace korvo {
namespace platform {
namespace card {

namespace {

constexpr const char* kTag = "SoundCard";
constexpr const char* kShm = "/dev/shm";
// What the JACK library's metadata start-up writes into its folder.
constexpr const char* kFiles[] = {"__db.001", "__db.002", "__db.003", "metadata.db"};
// A start-up takes well under a second; a holder stuck longer is not waited for.
constexpr auto kLockWait = std::chrono::seconds(5);

std::string folder() { return std::string(kShm) + "/jack_db-" + std::to_string(getuid()); }

bool present(const std::string& path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0;
}

}  // namespace

JackLeftovers::JackLeftovers() {
    mShmFd = open(kShm, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (mShmFd < 0) return;  // no /dev/shm: nothing can be left there
    const auto deadline = std::chrono::steady_clock::now() + kLockWait;
    while (!(mLocked = flock(mShmFd, LOCK_EX | LOCK_NB) == 0) && errno == EWOULDBLOCK &&
           std::chrono::steady_clock::now() < deadline) {
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    if (!mLocked) {
        __android_log_print(ANDROID_LOG_WARN, kTag, "no turn at %s; its JACK folder is left alone", kShm);
        return;
    }
    mExisted = present(folder());
}

JackLeftovers::~JackLeftovers() {
    if (mShmFd >= 0) close(mShmFd);  // closing releases the lock
}

void JackLeftovers::tidy(bool jackInUse) {
    if (!mLocked || mExisted || jackInUse) return;
    const std::string dir = folder();
    if (!present(dir)) return;
    // Only the names it writes, then the folder if nothing else is in it.
    for (const char* name : kFiles) unlink((dir + "/" + name).c_str());
    if (rmdir(dir.c_str()) != 0) {
        __android_log_print(ANDROID_LOG_WARN, kTag, "cannot remove %s: errno %d", dir.c_str(), errno);
    }
}

}  // namespace card
}  // namespace platform
}  // namespace korvo
