// soundmeter demo: two devices, each a process of its own running
// "soundmeter handshake", meet in a fresh simulated room and exchange codes. The
// parent reads their protocol lines and shows the exchange as it happens.
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cmath>
#include <map>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/ChildProcess.h"
#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/Environment.h"
#include "host/Interrupt.h"
#include "host/JsonEvent.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Protocol.h"

namespace korvo {
namespace host {
namespace {

struct DemoOptions {
    int rounds = 3;
    bool noAck = false;
    double snr = 0.0;
    bool snrGiven = false;
    int toneMs = 64;  // heard to -11 dB SNR; a longer tone only delays the answer it overlaps
    int timeoutMs = 8000;
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
};

// In noise the room carries the speakers to the microphones 20 dB down, so that the
// noise of the lowest SNR (-15 dB) stays at -15 dBFS, clear of clipping.
constexpr double kNoisyRoomGainDb = -20.0;
constexpr double kMinSnr = -15.0;
// A device that has not printed "ready" after this long is taken as stuck.
constexpr int64_t kStartupMs = 10000;

// RMS of the tone engine's sine (peak 14744 of 32768) in dBFS, 0 dBFS being an RMS of 32768.
const double kToneDbfs = 20.0 * std::log10(14744.0 / 32768.0 / std::sqrt(2.0));

std::string uniqueRoomName() {
    return "demo-" + std::to_string(getpid()) + "-" + std::to_string(monotonicMs() % 100000000);
}

enum Who { kListener = 0, kSpeaker = 1 };
const char* const kWhoName[2] = {"listener", "speaker"};

// What happened in one round, from both devices' lines.
struct Round {
    int said = -1, heard = -1, answered = -1, answerHeard = -1;  // codes
    long long saidAt = -1, answeredAt = -1;  // the latest attempts
    long long firstSaidAt = -1;
};

class DemoRun {
public:
    DemoRun(const CommonOptions& common, const DemoOptions& o) : mCommon(common), mOpt(o) {}

    int run() {
        applyLogSettings(mCommon.verbose);  // the demo itself only visits the room at the end
        if (!levelApplies("demo", mOpt.level, mOpt.decoder)) return 2;
        mRoom = uniqueRoomName();
        // --mic / --speaker put both devices on the given routes (a named room that a monitor
        // can join, for instance); a route not given is the fresh room's.
        mMic = mCommon.mic.empty() ? "sim:" + mRoom : mCommon.mic;
        mSpeaker = mCommon.speaker.empty() ? "sim:" + mRoom : mCommon.speaker;
        const bool freshRoom = mCommon.mic.empty() || mCommon.speaker.empty();
        std::string why;
        if (!korvo::platform::checkCaptureRoute(mMic, &why)) {
            errf("microphone %s", why.c_str());
            return 2;
        }
        if (!korvo::platform::checkOutputRoute(mSpeaker, &why)) {
            errf("speaker %s", why.c_str());
            return 2;
        }
        if (!roomsFree()) return 2;
        mStart = monotonicMs();
        std::string noise = "no noise";
        if (mOpt.snrGiven) {
            mNoiseDbfs = kToneDbfs + kNoisyRoomGainDb - mOpt.snr;
            char text[128];
            snprintf(text, sizeof text, "noise %.1f dBFS (SNR %.1f dB)", mNoiseDbfs, mOpt.snr);
            noise = text;
        }
        const std::string where = freshRoom ? "in room " + mRoom : "on mic " + mMic + ", speaker " + mSpeaker;
        infof("demo %s: %s, acknowledgement %s, tones of %d ms, %s, %s decision%s\n", where.c_str(),
              plural(mOpt.rounds, "round").c_str(), mOpt.noAck ? "off" : "on", mOpt.toneMs, noise.c_str(),
              decoderName(mOpt.decoder), levelArgument().empty() ? "" : (", " + levelArgument().substr(2)).c_str());

        // Both start together and calibrate at once; they begin when both are ready.
        const bool started = startDevice(kListener) && startDevice(kSpeaker);
        if (started) pump();
        int status[2] = {-1, -1};
        finish(status);
        if (freshRoom) removeRoom();
        if (mAborted) leaveNamedRooms();
        return summarize(started, status);
    }

private:
    // Speakers of another run in a room would mix their codes with this demo's, and both
    // runs would fail rounds without knowing why. A monitor only listens: it is welcome.
    bool roomsFree() {
        return roomFree(mSpeaker, "speaker") && (mMic == mSpeaker || roomFree(mMic, "microphone"));
    }

    bool roomFree(const std::string& route, const char* what) {
        std::vector<pid_t> devices;
        for (const ChildProcess& child : mChild) {
            if (child.running()) devices.push_back(child.pid());
        }
        std::string why;
        const int speakers = korvo::platform::routeRoomSpeakers(route, devices, &why);
        if (speakers < 0) {
            errf("%s %s", what, why.c_str());
            return false;
        }
        if (speakers > 0) {
            errf("%s %s: the room is in use (%s already in it would mix their codes with this demo's)", what,
                 route.c_str(), plural(speakers, "speaker").c_str());
            return false;
        }
        return true;
    }

    bool startDevice(Who who) {
        std::vector<std::string> args = {"soundmeter", "handshake", "--role", kWhoName[who],
                                         "--rounds", std::to_string(mOpt.rounds), "--tone-ms",
                                         std::to_string(mOpt.toneMs), "--timeout-ms", std::to_string(mOpt.timeoutMs),
                                         "--mic", mMic, "--speaker", mSpeaker};
        if (mOpt.noAck) args.push_back("--no-ack");
        args.push_back(std::string("--decoder=") + decoderName(mOpt.decoder));
        args.push_back("--start-on-stdin");
        if (!levelArgument().empty()) args.push_back(levelArgument());
        for (int i = 0; i < mCommon.verbose; ++i) args.push_back("-v");
        if (!mCommon.plugin.empty()) args.push_back("--plugin=" + mCommon.plugin);
        EnvList env;
        // Each device's microphone hears noise of its own, new in every run.
        env.emplace_back("KORVO_SIM_SEED", std::to_string(2 * (getpid() % 1000000) + who + 1));
        // The demo decides the noise: none unless --snr asks for it (an empty value is none).
        char level[32] = "";
        char gain[32] = "";
        if (mOpt.snrGiven) {
            snprintf(level, sizeof level, "%.2f", mNoiseDbfs);
            snprintf(gain, sizeof gain, "%.1f", kNoisyRoomGainDb);
        }
        env.emplace_back("KORVO_SIM_NOISE", level);
        env.emplace_back("KORVO_SIM_GAIN", gain);
        std::string error;
        ChildProcess::Options options;
        options.ownGroup = true;  // Ctrl-C reaches the demo, which stops its devices
        options.stdinPipe = true;  // the start line
        if (!mChild[who].start(selfExecutable(), args, env, options, &error)) {
            errf("cannot start the %s: %s", kWhoName[who], error.c_str());
            return false;
        }
        mOpen[who] = true;
        mQuietUntil[who] = monotonicMs() + kStartupMs;
        return true;
    }

    // --level for the devices: as given; in noise without one, calibrated on the room.
    std::string levelArgument() const {
        if (!decoderInfo(mOpt.decoder).takesLevel) return "";
        if (mOpt.level.given) return mOpt.level.automatic ? "--level=auto" : "--level=" + std::to_string(mOpt.level.value);
        return mOpt.snrGiven ? "--level=auto" : "";
    }

    // The longest a working device stays silent: its peer's hearing (one timeout), a tone,
    // and its own hearing (another timeout).
    int64_t silenceAllowedMs() const { return mOpt.toneMs + 2 * int64_t(mOpt.timeoutMs); }

    // Reads both devices' lines until both have closed their output, Ctrl-C, or a device
    // that stopped responding.
    void pump() {
        while (mOpen[kListener] || mOpen[kSpeaker]) {
            if (interrupted()) {
                stopDevices();
                break;
            }
            for (int w = 0; w < 2 && mStuck.empty(); ++w) {
                if (mOpen[w] && monotonicMs() >= mQuietUntil[w]) {
                    mStuck = kWhoName[w];
                    errf("the %s stopped responding (no word for %lld ms)", kWhoName[w],
                         static_cast<long long>(monotonicMs() - mQuietUntil[w] + silenceAllowedMs()));
                }
            }
            if (!mStuck.empty()) {
                stopDevices();
                break;
            }
            pollfd fds[2];
            int who[2];
            nfds_t n = 0;
            for (int w = 0; w < 2; ++w) {
                if (!mOpen[w]) continue;
                fds[n] = {mChild[w].stdoutFd(), POLLIN, 0};
                who[n++] = w;
            }
            if (poll(fds, n, 100) <= 0) continue;
            for (nfds_t i = 0; i < n; ++i) {
                if (fds[i].revents == 0) continue;
                ChildProcess& child = mChild[who[i]];
                if (!child.pump(0)) mOpen[who[i]] = false;
                for (const std::string& line : child.takeLines()) onLine(static_cast<Who>(who[i]), line);
            }
            // A device whose output ended before its last line ("done") died or gave up:
            // the demo ends at once instead of waiting for its peer's rounds to time out.
            for (int w = 0; w < 2; ++w) {
                if (!mOpen[w] && !mDone[w]) stopDevices();
            }
            if (mAborted) break;
        }
    }

    void begin() {
        // A run started at the same moment passed the check at the start; its devices are
        // in the room by now, as this demo's are: the later of the two is always told.
        if (!roomsFree()) {
            mCrowded = true;
            stopDevices();
            return;
        }
        mBegun = true;
        for (int w = 0; w < 2; ++w) {
            mChild[w].writeLine("go");
            mQuietUntil[w] = monotonicMs() + silenceAllowedMs();
        }
    }

    // A stopped (or frozen) process does not act on SIGTERM: the demo kills its devices.
    void stopDevices() {
        for (int w = 0; w < 2; ++w) {
            if (mChild[w].running() && mOpen[w]) mKilled[w] = true;
            mChild[w].sendSignal(interrupted() ? SIGTERM : SIGKILL);
        }
        mAborted = true;
    }

    void onLine(Who who, const std::string& line) {
        ProtocolLine p;
        if (!p.parse(line)) return;  // not a protocol line: the device's business
        mQuietUntil[who] = monotonicMs() + silenceAllowedMs();
        const long long t = p.get("t", monotonicMs());
        const int code = static_cast<int>(p.get("code"));
        const int round = static_cast<int>(p.get("round"));
        Round& r = mRounds[round];
        if (p.event == "ready") {
            mReady[who] = true;
            mQuietUntil[who] = monotonicMs() + kStartupMs;  // its peer may still be starting
            show(t, who, "ready");
            if (mReady[kListener] && mReady[kSpeaker] && !mAborted) begin();
        } else if (p.event == "said") {
            (who == kSpeaker ? r.said : r.answered) = code;
            (who == kSpeaker ? r.saidAt : r.answeredAt) = t;
            if (who == kSpeaker && r.firstSaidAt < 0) r.firstSaidAt = t;
            const long long attempt = p.get("attempt", 1);
            event(JsonEvent("said").add("device", kWhoName[who]).add("round", round).add("code", code).add("attempt", attempt),
                  t, who, "says  code %2d (%5d Hz)%s", code, codeHz(code), attempt > 1 ? " again" : "");
        } else if (p.event == "heard") {
            const long long toneAt = who == kListener ? r.saidAt : r.answeredAt;
            const long long oneWay = toneAt >= 0 ? t - toneAt : p.get("waited");
            (who == kListener ? r.heard : r.answerHeard) = code;
            event(JsonEvent("heard").add("device", kWhoName[who]).add("round", round).add("code", code).add("one_way_ms", oneWay),
                  t, who, "hears code %2d (%5d Hz), one way %lld ms", code, codeHz(code), oneWay);
            exchangeDone(round, t);
        } else if (p.event == "missed") {
            show(t, who, "missed code " + std::to_string(code) + " (" + std::to_string(codeHz(code)) + " Hz)");
        } else if (p.event == "timeout") {
            show(t, who, "did not hear code " + std::to_string(code) + " (" + std::to_string(codeHz(code)) + " Hz) within " +
                             std::to_string(p.get("waited")) + " ms");
        } else if (p.event == "done") {
            mDone[who] = true;
            show(t, who, "finished, " + std::to_string(p.get("completed")) + " of " + plural(p.get("rounds"), "round"));
        }
    }

    // An exchange counts once both devices did their part of the same round with the same codes.
    void exchangeDone(int round, long long t) {
        const Round& r = mRounds[round];
        const bool heard = r.said >= 0 && r.heard == r.said;
        const bool complete = mOpt.noAck ? heard : heard && r.answered == r.said + 1 && r.answerHeard == r.answered;
        if (!complete || mCounted.count(round)) return;
        mCounted.insert({round, true});
        const long long roundTrip = t - r.firstSaidAt;
        mLatencies.push_back(roundTrip);
        JsonEvent e("exchange");
        e.add("round", round).add("code", r.said).add("round_trip_ms", roundTrip);
        if (!mOpt.noAck) e.add("answer", r.answered);
        event(e, t, kSpeaker, mOpt.noAck ? "exchange %d complete, code said to code heard in %lld ms"
                                         : "exchange %d complete, round trip %lld ms (code first said to its answer heard)",
              round, roundTrip);
    }

    void event(const JsonEvent& e, long long t, Who who, const char* fmt, ...) __attribute__((format(printf, 5, 6))) {
        char text[200];
        va_list ap;
        va_start(ap, fmt);
        vsnprintf(text, sizeof text, fmt, ap);
        va_end(ap);
        progressf(e, "%8.3f s  %-8s  %s\n", (t - mStart) / 1000.0, kWhoName[who], text);
    }

    void show(long long t, Who who, const std::string& text) {
        infof("%8.3f s  %-8s  %s\n", (t - mStart) / 1000.0, kWhoName[who], text.c_str());
    }

    void finish(int status[2]) {
        for (int w = 0; w < 2; ++w) {
            if (!mChild[w].running()) continue;
            if (!mChild[w].wait(10000, &status[w])) {
                mChild[w].sendSignal(SIGKILL);
                mChild[w].wait(5000, &status[w]);
            }
            mSignal[w] = mChild[w].endSignal();
        }
    }

    // A room goes when its last member leaves. Joining and leaving once more after
    // both devices are gone also removes it when a device could not leave in order.
    void removeRoom() {
        std::string error;
        auto probe = korvo::platform::makeCaptureRoute("sim:" + mRoom, &error);
        if (!probe) {
            errf("cannot check room %s: %s", mRoom.c_str(), error.c_str());
            return;
        }
        probe.reset();
        infof("room %s removed\n", mRoom.c_str());
    }

    // Devices the demo stopped could not leave a named room. Joining and leaving once
    // more forgets them, and removes the room unless someone else is in it (a monitor).
    void leaveNamedRooms() {
        std::vector<std::string> routes = {mMic};
        if (mSpeaker != mMic) routes.push_back(mSpeaker);
        for (const std::string& route : routes) {
            // Joins and leaves at once.
            if (route.compare(0, 4, "sim:") == 0 && route != "sim:" + mRoom) korvo::platform::makeCaptureRoute(route, nullptr);
        }
    }

    int summarize(bool started, const int status[2]) {
        const int completed = static_cast<int>(mLatencies.size());
        JsonEvent summary("summary");
        summary.add("rounds", mOpt.rounds).add("completed", completed);
        if (completed > 0) {
            std::vector<long long> sorted = mLatencies;
            std::sort(sorted.begin(), sorted.end());
            const size_t mid = sorted.size() / 2;
            const double median = sorted.size() % 2 ? double(sorted[mid]) : (sorted[mid - 1] + sorted[mid]) / 2.0;
            summary.add("median_ms", median).add("worst_ms", sorted.back());
            resultf(summary, "%d of %s completed, %s median %.0f ms, worst %lld ms\n", completed,
                    plural(mOpt.rounds, "exchange").c_str(),
                    mOpt.noAck ? "one way" : "round trip", median, sorted.back());
        } else {
            resultf(summary, "0 of %s completed\n", plural(mOpt.rounds, "exchange").c_str());
        }
        if (interrupted()) return 130;
        if (!started) return 1;
        if (mCrowded) return 2;  // its line is out
        if (!mStuck.empty()) return 1;  // its line is out
        std::string failed;
        for (int w = 0; w < 2; ++w) {
            if (status[w] <= 0 || mKilled[w]) continue;  // 0: finished well; -1: never started
            failed += std::string(failed.empty() ? "" : ", ") + "the " + kWhoName[w] +
                      (mSignal[w] ? " was killed by signal " + std::to_string(mSignal[w])
                                  : " ended with status " + std::to_string(status[w]));
        }
        if (!failed.empty()) {
            errf("%s", failed.c_str());
            return 1;
        }
        if (completed != mOpt.rounds) {
            errf("%d of %s completed", completed, plural(mOpt.rounds, "exchange").c_str());
            return 1;
        }
        return 0;
    }

    const CommonOptions& mCommon;
    const DemoOptions& mOpt;
    std::string mRoom;
    std::string mMic;
    std::string mSpeaker;
    int64_t mStart = 0;
    double mNoiseDbfs = 0.0;
    ChildProcess mChild[2];
    bool mOpen[2] = {false, false};
    bool mReady[2] = {false, false};
    int64_t mQuietUntil[2] = {0, 0};  // a device silent past this has stopped responding
    std::string mStuck;               // the device that stopped responding
    bool mAborted = false;
    bool mBegun = false;               // both were ready and told to begin
    bool mCrowded = false;             // another run's speakers came into the room
    bool mKilled[2] = {false, false};  // stopped by the demo, its status not its own
    bool mDone[2] = {false, false};    // said its last line
    int mSignal[2] = {0, 0};           // the signal that ended it, 0 when it exited
    std::map<int, Round> mRounds;
    std::map<int, bool> mCounted;
    std::vector<long long> mLatencies;  // per completed exchange, from the speaker's code
};

}  // namespace

Command addDemoCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<DemoOptions>();
    CLI::App* sub = app.add_subcommand(
        "demo",
        "Run two devices, each a process of its own, in a fresh simulated room: the speaker says code k, the "
        "listener hears it and, with acknowledgement, answers k + 1, which the speaker hears. Shows each step "
        "with its latency and a summary; exit 0 only when every exchange completed.");
    sub->add_option("--rounds", options->rounds, "number of exchanges")
        ->check(CLI::Range(1, 1000))
        ->capture_default_str();
    sub->add_flag("--no-ack", options->noAck, "no acknowledgement: the listener only hears");
    sub->add_option_function<double>(
           "--snr",
           [options](const double& v) {
               options->snr = v;
               options->snrGiven = true;
           },
           "add white noise to both microphones: the tone's power over the noise's, in dB (default: no "
           "noise); the devices then calibrate their detection level on the room (--level auto)")
        ->check(finiteRange(kMinSnr, 120.0));
    sub->add_option("--tone-ms", options->toneMs, "duration of each tone in milliseconds")
        ->check(CLI::Range(50, 5000))
        ->capture_default_str();
    sub->add_option("--timeout-ms", options->timeoutMs,
                    "how long a round may take, its code said again as often as it needs")
        ->check(CLI::Range(500, 600000))
        ->capture_default_str();
    addLevelOption(sub, &options->level,
                   "the devices' detection level, for --decoder builtin (default: auto with --snr, else the plug-in's)");
    addDecoderOption(sub, &options->decoder);
    // Both devices use these routes instead of the fresh room (e.g. sim:lab, which a monitor can join).
    addRouteOptions(sub, common, "the fresh room", "the fresh room");
    return {sub, [&common, options] {
                DemoRun demo(common, *options);
                return demo.run();
            }};
}

}  // namespace host
}  // namespace korvo
