#include "host/picture/PictureFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <random>

namespace korvo {
namespace host {
namespace {

std::string writeCause(int error) { return std::string("cannot write: ") + std::strerror(error); }

std::string folderOf(const std::string& path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
}

// The place a path names once its symbolic links are followed; `st` describes it when
// `exists`. A dangling link names the file that writing through it would make.
bool placeOf(const std::string& path, std::string* place, struct stat* st, bool* exists, int* error) {
    std::string p = path;
    for (int hops = 0; hops < 40; ++hops) {
        if (lstat(p.c_str(), st) != 0) {
            if (errno != ENOENT) return *error = errno, false;
            *place = p;
            *exists = false;
            return true;
        }
        if (!S_ISLNK(st->st_mode)) {
            *place = p;
            *exists = true;
            return true;
        }
        char target[PATH_MAX];
        const ssize_t n = readlink(p.c_str(), target, sizeof target - 1);
        if (n < 0) return *error = errno, false;
        target[n] = '\0';
        p = target[0] == '/' ? std::string(target) : folderOf(p) + "/" + target;
    }
    *error = ELOOP;
    return false;
}

// A new file of our own in `folder`, made with the mode that the process's umask gives.
int createBeside(const std::string& folder, std::string* name) {
    static std::mt19937_64 random(std::random_device{}());
    for (int tries = 0; tries < 100; ++tries) {
        char suffix[32];
        snprintf(suffix, sizeof suffix, "%012llx", static_cast<unsigned long long>(random() & 0xffffffffffffULL));
        *name = folder + "/.soundmeter-" + suffix + ".part";
        const int fd = ::open(name->c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
        if (fd >= 0 || errno != EEXIST) return fd;
    }
    errno = EEXIST;
    return -1;
}

bool placeCheck(const std::string& path, std::string* place, struct stat* st, bool* exists, std::string* cause) {
    int error = 0;
    if (!placeOf(path, place, st, exists, &error)) {
        *cause = writeCause(error);
        return false;
    }
    if (*exists && S_ISDIR(st->st_mode)) error = EISDIR;
    // A device or a pipe is no place for a picture, and renaming over it would replace it.
    if (*exists && !S_ISDIR(st->st_mode) && !S_ISREG(st->st_mode)) {
        *cause = "cannot write: not a regular file";
        return false;
    }
    if (error == 0 && *exists && access(place->c_str(), W_OK) != 0) error = errno;
    const std::string folder = folderOf(*place);
    const std::string name = place->substr(place->rfind('/') == std::string::npos ? 0 : place->rfind('/') + 1);
    if (error == 0) {
        errno = 0;
        const long longest = pathconf(folder.c_str(), _PC_NAME_MAX);
        if (longest < 0 && errno != 0) error = errno;
        if (longest > 0 && static_cast<long>(name.size()) > longest) error = ENAMETOOLONG;
    }
    if (error != 0) {
        *cause = writeCause(error);
        return false;
    }
    return true;
}

}  // namespace

bool checkPictureFile(const std::string& path, std::string* cause) {
    std::string place;
    struct stat st {};
    bool exists = false;
    if (!placeCheck(path, &place, &st, &exists, cause)) return false;
    // A block written and thrown away: the folder takes a new file and has room for it.
    std::string probe;
    const int fd = createBeside(folderOf(place), &probe);
    if (fd < 0) {
        *cause = writeCause(errno);
        return false;
    }
    static const char kBlock[4096] = {};
    errno = 0;
    const bool wrote = ::write(fd, kBlock, sizeof kBlock) == static_cast<ssize_t>(sizeof kBlock);
    const int error = errno != 0 ? errno : ENOSPC;
    ::close(fd);
    unlink(probe.c_str());
    if (!wrote) *cause = writeCause(error);
    return wrote;
}

PictureFile::~PictureFile() { discard(); }

bool PictureFile::open(const std::string& path, std::string* cause) {
    discard();
    struct stat st {};
    bool exists = false;
    if (!placeCheck(path, &mPlace, &st, &exists, cause)) return false;
    mReplaces = exists;
    mMode = st.st_mode & 07777;
    mOwner = st.st_uid;
    mGroup = st.st_gid;
    const int fd = createBeside(folderOf(mPlace), &mTemporary);
    if (fd < 0) {
        *cause = writeCause(errno);
        mTemporary.clear();
        return false;
    }
    mStream = fdopen(fd, "wb");
    if (mStream == nullptr) {
        *cause = writeCause(errno);
        ::close(fd);
        discard();
        return false;
    }
    return true;
}

bool PictureFile::commit(std::string* cause) {
    if (mStream == nullptr) {
        *cause = writeCause(EBADF);
        return false;
    }
    const int fd = fileno(mStream);
    int error = 0;
    if (fflush(mStream) != 0 || ferror(mStream)) error = errno != 0 ? errno : EIO;
    if (error == 0 && mReplaces) {
        // The new file takes the old one's mode and, where allowed, its owner.
        if (fchown(fd, mOwner, mGroup) != 0) errno = 0;
        if (fchmod(fd, mMode) != 0) error = errno;
    }
    if (error == 0 && fsync(fd) != 0 && errno != EINVAL) error = errno;
    if (fclose(mStream) != 0 && error == 0) error = errno;
    mStream = nullptr;
    if (error == 0 && rename(mTemporary.c_str(), mPlace.c_str()) != 0) error = errno;
    if (error != 0) {
        *cause = writeCause(error);
        discard();
        return false;
    }
    mTemporary.clear();
    return true;
}

void PictureFile::discard() {
    if (mStream != nullptr) fclose(mStream);
    mStream = nullptr;
    // Only the file this object made is ever removed.
    if (!mTemporary.empty()) unlink(mTemporary.c_str());
    mTemporary.clear();
}

}  // namespace host
}  // namespace korvo
