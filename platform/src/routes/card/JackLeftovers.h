// PortAudio's start-up asks the JACK library whether a JACK server runs. Before that
// library finds none, it opens its metadata database in /dev/shm/jack_db-UID (about
// 380 KB), and it leaves the folder there. This guard, wrapped around a Pa_Initialize,
// removes that folder when the start-up made it; processes starting at once take turns
// through a lock on /dev/shm, so that none mistakes another's fresh folder for one that
// was there before (a running JACK server's own).
#pragma once

namespace korvo {
namespace platform {
namespace card {

class JackLeftovers {
public:
    JackLeftovers();  // takes the lock and notes whether the folder is there
    ~JackLeftovers();  // releases the lock
    JackLeftovers(const JackLeftovers&) = delete;
    JackLeftovers& operator=(const JackLeftovers&) = delete;

    // After the start-up: removes the folder if it made it and JACK is not in use.
    void tidy(bool jackInUse);

private:
    int mShmFd = -1;  // holds the lock while open
    bool mLocked = false;
    bool mExisted = true;
};

}  // namespace card
}  // namespace platform
}  // namespace korvo
