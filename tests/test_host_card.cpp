// The card route for real: a private sound server with a null sink, whose monitor is
// the default source, stands in for a sound card; the soundmeter processes reach it
// through ALSA's default device (the pulse plug-in) and only through their environment.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/base/Clock.h"
#include "support/HostProcess.h"

namespace {

using korvo::host::monotonicMs;
using korvo::testing::EnvList;
using korvo::testing::HostProcess;
using korvo::testing::ProcessResult;

const std::string kHost = KORVO_HOST_PATH;
const std::string kServer = "/usr/bin/pulseaudio";

bool present(const std::string& path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0;
}

// The JACK folder, looked at between the card routes' start-ups, which hold /dev/shm's lock.
bool jackFolderPresent() {
    const int shm = open("/dev/shm", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    flock(shm, LOCK_EX);
    const bool there = present("/dev/shm/jack_db-" + std::to_string(getuid()));
    close(shm);
    return there;
}

class HostCard : public ::testing::Test {
protected:
    void SetUp() override {
        if (access(kServer.c_str(), X_OK) != 0) GTEST_SKIP() << kServer << " is not installed";
        char dir[] = "/tmp/korvo-card-XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        mDir = dir;
        const std::string run = mDir + "/run", socket = run + "/native";
        ASSERT_EQ(mkdir(run.c_str(), 0700), 0);
        ASSERT_EQ(mkdir((mDir + "/home").c_str(), 0700), 0);
        // Root gets no autospawn from the client library, and PULSE_SERVER names ours:
        // nothing reaches the machine's own server, D-Bus or display.
        mEnv = {{"PULSE_SERVER", "unix:" + socket}, {"PULSE_RUNTIME_PATH", run + "/pulse"},
                {"XDG_RUNTIME_DIR", run},          {"HOME", mDir + "/home"},
                {"DISPLAY", ""},                   {"DBUS_SESSION_BUS_ADDRESS", ""}};
        mJackDbWasThere = jackFolderPresent();
        // No shared memory (nothing left in /dev/shm), no default script, never idle out.
        const std::vector<std::string> args = {
            kServer, "-n", "--daemonize=no", "--use-pid-file=no", "--exit-idle-time=-1", "--disable-shm=yes",
            "--realtime=no", "--high-priority=no", "--no-cpu-limit=yes", "--log-level=error",
            "--log-target=stderr", "-L", "module-null-sink sink_name=korvo rate=44100 channels=1",
            "-L", "module-native-protocol-unix socket=" + socket + " auth-anonymous=1"};
        std::string error;
        korvo::host::ChildProcess::Options options;
        options.captureStderr = options.nullStdin = true;
        ASSERT_TRUE(mServer.start(kServer, args, mEnv, options, &error)) << error;
        // The socket comes with the last module: the server is ready once it is there.
        const int64_t deadline = monotonicMs() + 10000;
        while (!present(socket) && mServer.pump(20) && monotonicMs() < deadline) {
        }
        int status = -1;
        if (!present(socket) && mServer.wait(100, &status)) {
            GTEST_SKIP() << "the sound server refused to run (status " << status << "): " << mServer.err();
        }
        if (!present(socket)) GTEST_SKIP() << "the sound server did not start within 10 s: " << mServer.err();
    }

    void TearDown() override {
        int status = -1;
        if (mServer.running()) {
            mServer.sendSignal(SIGTERM);
            EXPECT_TRUE(mServer.wait(5000, &status)) << "the sound server did not stop";
        }
        if (!mDir.empty()) std::filesystem::remove_all(mDir);
        if (!mJackDbWasThere) {
            EXPECT_FALSE(jackFolderPresent()) << "the JACK probe's folder is left";
        }
    }

    std::string mDir;
    EnvList mEnv;
    korvo::host::ChildProcess mServer;
    bool mJackDbWasThere = true;
};

TEST_F(HostCard, CodeSaidIntoTheCardIsHeardFromItSoonAfterItsToneStarts) {
    HostProcess listener(kHost), speaker(kHost);
    ASSERT_TRUE(listener.start({"listen", "--code", "5", "--mic", "card", "--seconds", "10"}, mEnv));
    ASSERT_TRUE(listener.waitForOutput("listening for code 5", 15000)) << listener.finish(0).err;
    ASSERT_TRUE(speaker.start({"say", "5", "--speaker", "card"}, mEnv));
    ASSERT_TRUE(speaker.waitForOutput("saying code 5", 15000)) << speaker.finish(0).err;
    const int64_t toneStart = monotonicMs();
    ASSERT_TRUE(listener.waitForOutput("heard code 5", 10000)) << listener.finish(0).err;
    EXPECT_LE(monotonicMs() - toneStart, 500) << "the first code came late";
    const ProcessResult said = speaker.finish(15000), heard = listener.finish(15000);
    EXPECT_EQ(said.status, 0) << said.err;
    EXPECT_NE(said.out.find("said code 5 (6880 Hz)"), std::string::npos) << said.out;
    EXPECT_EQ(heard.status, 0) << heard.err;
}

TEST_F(HostCard, DemoThroughTheCardCompletesEveryExchange) {
    const ProcessResult r =
        korvo::testing::runHost(kHost, {"demo", "--mic", "card", "--speaker", "card", "--rounds", "2"}, 60000, mEnv);
    EXPECT_EQ(r.status, 0) << r.out << r.err;
    EXPECT_NE(r.out.find("2 of 2 exchanges completed"), std::string::npos) << r.out;
}

}  // namespace
