// The command at the edges of use: what it was given is never destroyed, streams are read
// in bounded memory and end on time or on a signal, unusable recordings and settings are
// refused at the start, and every failure is one line a terminal can show.
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>

#include "support/HostProcess.h"
#include "support/LibraryTestSupport.h"

namespace {

namespace fs = std::filesystem;
using namespace korvo::testing;
using Args = std::vector<std::string>;

const std::string kHost = KORVO_HOST_PATH;
constexpr int kRunMs = 60000;  // generous: the machine may be busy with other tests

class HostEdges : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_NE(mkdtemp(&mDir[0]), nullptr); }
    void TearDown() override { fs::remove_all(mDir); }
    std::string path(const std::string& name) const { return mDir + "/" + name; }
    // A shell line, with $H the command and the test's folder as the working folder.
    ProcessResult shell(const std::string& line, int timeoutMs = kRunMs) {
        return runHost("/bin/bash", {"-c", "cd '" + mDir + "' && " + line}, timeoutMs, {{"H", kHost}});
    }
    std::string sox(const std::string& line) {
        const ProcessResult r = shell("sox " + line);
        EXPECT_EQ(r.status, 0) << r.err;
        return r.err;
    }
    std::string read(const std::string& name) const {
        std::ifstream in(path(name), std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(in), {});
    }
    size_t entries() const { return static_cast<size_t>(std::distance(fs::directory_iterator(mDir), {})); }

    std::string mDir = "/tmp/korvo-edges-XXXXXX";
};

// The single line a failure prints, for exact comparison.
std::string line(const std::string& text) { return "soundmeter: " + text + "\n"; }

TEST_F(HostEdges, APictureThatCannotBeWrittenLeavesWhatWasThere) {
    sox("-n -r 44100 -b 16 tone.wav synth 1 sine 2580 vol 0.3");
    std::ofstream(path("old.png")) << "old picture";
    fs::create_symlink("/dev/full", path("full.png"));
    const size_t before = entries();
    // The file may grow to 16 KiB only: the up-front check passes, the picture's write fails.
    ProcessResult r = shell("ulimit -f 16; trap '' XFSZ; exec \"$H\" spectrogram tone.wav --png old.png");
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.err, line("spectrogram old.png: cannot write: File too large"));
    EXPECT_EQ(read("old.png"), "old picture");
    // Places a picture cannot go are refused before anything is heard, and left as they were.
    const std::pair<std::string, std::string> refused[] = {
        {"full.png", "not a regular file"},
        {"/dev/full", "not a regular file"},
        {std::string(300, 'a') + ".png", "File name too long"},
        {"missing/x.png", "No such file or directory"},
    };
    for (const auto& [png, cause] : refused) {
        r = shell("\"$H\" spectrogram tone.wav --png " + png);
        EXPECT_EQ(r.status, 2) << png;
        EXPECT_EQ(r.err, line("spectrogram " + png + ": cannot write: " + cause));
        EXPECT_EQ(r.out, "") << png;
    }
    EXPECT_EQ(fs::read_symlink(path("full.png")), "/dev/full");
    EXPECT_TRUE(fs::is_character_file("/dev/full"));
    EXPECT_EQ(entries(), before);  // no half-written file beside them
    // A picture that can be written replaces the old one whole, keeping its mode.
    fs::permissions(path("old.png"), fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read);
    r = shell("\"$H\" spectrogram tone.wav --png old.png");
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(read("old.png").substr(1, 3), "PNG");
    EXPECT_EQ(fs::status(path("old.png")).permissions() & fs::perms::all,
              fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read);
    EXPECT_EQ(entries(), before);
}

TEST_F(HostEdges, StreamsEndOnTimeAndOnSignals) {
    // An endless recording on standard input: heard, and ended by --seconds.
    ProcessResult r = shell("sox -n -r 44100 -b 16 -t wav - synth 100000 sine 2580 vol 0.3 2>/dev/null | "
                            "\"$H\" listen --mic wav:- --seconds 2 -q");
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_NE(r.out.find("heard code 0 "), std::string::npos) << r.out;
    // Endless bytes that are no recording: refused at once.
    r = shell("cat /dev/zero | \"$H\" listen --mic wav:- --seconds 2");
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err, line("microphone wav:-: cannot decode: Format not recognised"));
    // A FIFO nobody writes: the wait ends on Ctrl-C and on SIGTERM, one line each.
    ASSERT_EQ(mkfifo(path("fifo").c_str(), 0600), 0);
    for (const auto& [sig, status, said] : {std::make_tuple(SIGINT, 130, "interrupted"),
                                            std::make_tuple(SIGTERM, 143, "terminated")}) {
        HostProcess p(kHost);
        ASSERT_TRUE(p.start({"scan", path("fifo")}));
        // Waiting once the FIFO is open among its descriptors.
        const std::string fds = "/proc/" + std::to_string(p.pid()) + "/fd";
        EXPECT_TRUE(waitFor([&] {
            std::error_code e;
            for (const auto& fd : fs::directory_iterator(fds, e)) {
                if (fs::read_symlink(fd.path(), e) == path("fifo")) return true;
            }
            return false;
        }, 20000));
        p.sendSignal(sig);
        r = p.finish(10000);
        EXPECT_FALSE(r.timedOut);
        EXPECT_EQ(r.status, status);
        EXPECT_EQ(r.err, line(said));
    }
}

TEST_F(HostEdges, UnusableRecordingsAreRefusedAtTheCheckByEveryCommand) {
    sox("-n -r 100 -b 16 slow.wav synth 3 sine 20");
    sox("-n -r 44100 tone.flac synth 1 sine 2580");
    sox("-n -r 44100 -c 2 short.ogg synth 0.3 sine 2580");
    sox("-n -r 44100 head.ogg synth 1 sine 2580");
    fs::resize_file(path("head.ogg"), 100);  // its decoder's setup cut off
    fs::resize_file(path("tone.flac"), 43);
    fs::resize_file(path("short.ogg"), fs::file_size(path("short.ogg")) - 7);
    const std::pair<std::string, std::string> files[] = {
        {"slow.wav", "cannot convert the rate: 100 Hz is outside 173..11289600 Hz"},
        {"tone.flac", "cannot decode: "},
        {"short.ogg", "has no samples"},
        {"head.ogg", "cannot decode: "},
    };
    for (const auto& [file, cause] : files) {
        const std::pair<std::string, std::string> commands[] = {
            {"scan " + file, "scan " + file + ": "},
            {"spectrogram " + file + " --png x.png", "spectrogram " + file + ": "},
            {"listen --seconds 1 --mic wav:" + file, "microphone wav:" + file + ": "},
        };
        for (const auto& [command, says] : commands) {
            const ProcessResult r = shell("\"$H\" " + command);
            EXPECT_EQ(r.status, 2) << command;
            EXPECT_EQ(r.err.rfind("soundmeter: " + says + cause, 0), 0u) << r.err;
            EXPECT_EQ(r.err.find('\n'), r.err.size() - 1) << r.err;
        }
    }
    EXPECT_FALSE(fs::exists(path("x.png")));
}

TEST_F(HostEdges, ResultsNumbersNamesAndSettingsAsAPersonMeansThem) {
    sox("-n -r 44100 -b 16 tone.wav synth 1 sine 2580 vol 0.3");
    // Results that never reached standard output are a failure.
    ProcessResult r = shell("\"$H\" scan tone.wav > /dev/full");
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.err, line("standard output: cannot write: No space left on device"));
    // Whole numbers are decimal, leading zeros and all.
    r = shell("\"$H\" say 010 --ms 40 --speaker null -q");
    EXPECT_EQ(r.out, "said code 10 (11180 Hz)\n");
    r = shell("\"$H\" listen --code 010 --seconds 0.1 --mic null");
    EXPECT_EQ(r.out.rfind("listening for code 10 (11180 Hz)\n", 0), 0u) << r.out;
    r = shell("\"$H\" say 0x10 --speaker null");
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err, line("CODE: '0x10' is not a whole number"));
    // A control character the user typed reaches the terminal escaped.
    r = shell("\"$H\" say 1 --mic $'\\e]0;x\\a'");
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err.find('\x1b'), std::string::npos);
    EXPECT_NE(r.err.find("'\\x1b]0;x\\x07'"), std::string::npos) << r.err;
    // Unusable settings are refused as such.
    r = shell("KORVO_PLUGIN=/nonexistent.so \"$H\" say 1 --speaker null");
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err.rfind("soundmeter: cannot load the plug-in /nonexistent.so: ", 0), 0u) << r.err;
    r = shell("KORVO_LOG_LEVEL=Z \"$H\" say 1 --speaker null");
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.err, line("KORVO_LOG_LEVEL: 'Z' is not a log level (V, D, I, W, E or F)"));
}

// Code 30 above half a 44.1 kHz speaker's rate folds back 1.55 % above code 15: `say` tells
// which code a listener will report, and the recording of what it played is heard so.
TEST_F(HostEdges, AFoldedCodeIsHeardAsTheCodeSayTells) {
    const ProcessResult said = shell("\"$H\" say 30 --ms 300 --speaker wav:folded.wav");
    ASSERT_EQ(said.status, 0) << said.err;
    EXPECT_NE(said.out.find("plays 15720 Hz instead, which the host's decoder hears as code 15 (15480 Hz"),
              std::string::npos) << said.out;
    sox("-n -r 44100 -b 16 noise.wav synth 1 whitenoise vol 0.001");  // a room's faint noise under it
    sox("-m folded.wav noise.wav noisy.wav");
    const ProcessResult heard = shell("\"$H\" scan noisy.wav -q");
    ASSERT_EQ(heard.status, 0) << heard.err;
    const size_t first = heard.out.find("heard code ");
    ASSERT_NE(first, std::string::npos) << heard.out;
    EXPECT_EQ(heard.out.compare(first, 25, "heard code 15 (15480 Hz)\n"), 0) << heard.out;
    EXPECT_EQ(heard.out.find("heard code ", first + 1), std::string::npos) << heard.out;  // once, and nothing else
}

}  // namespace
