// A picture's file, written so that a failure never destroys what was at its path: the
// bytes go to a new file beside it, which is renamed into place only once it is whole.
// The path is checked before anything is heard, so a long capture never ends in a
// picture that cannot be written.
#pragma once
#include <cstdio>
#include <string>

namespace korvo {
namespace host {

// Whether a picture can be written at `path`: the place (a symbolic link is followed to
// the file it names) is a regular file that may be replaced, or a new name in a folder
// that takes a new file. False with the cause in a few words ("cannot write: ...").
bool checkPictureFile(const std::string& path, std::string* cause);

class PictureFile {
public:
    PictureFile() = default;
    PictureFile(const PictureFile&) = delete;
    PictureFile& operator=(const PictureFile&) = delete;
    // Removes the new file unless it was committed: nothing half-written stays behind.
    ~PictureFile();

    // Makes the new file beside the place of `path`; false with the cause.
    bool open(const std::string& path, std::string* cause);
    FILE* stream() const { return mStream; }
    // Writes it out and renames it into place; false with the cause, the old file untouched.
    bool commit(std::string* cause);

private:
    void discard();

    std::string mPlace;  // where the picture goes: the path, its links followed
    std::string mTemporary;
    FILE* mStream = nullptr;
    bool mReplaces = false;  // a file is at the place: its mode and owner carry over
    unsigned mMode = 0;
    unsigned mOwner = 0, mGroup = 0;
};

}  // namespace host
}  // namespace korvo
