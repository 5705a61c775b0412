// soundmeter demo: two devices, each a process of its own running
// "soundmeter handshake", meet in a fresh simulated room and exchange codes. The
// parent reads their protocol lines and shows the exchange as it happens.
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
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
    int toneMs = 300;
    int timeoutMs = 8000;
};

// RMS of the tone engine's sine (peak 14744 of 32768) in dBFS, 0 dBFS being an RMS of 32768.
const double kToneDbfs = 20.0 * std::log10(14744.0 / 32768.0 / std::sqrt(2.0));

// Mean level of one spectrum bin under white noise of the given dBFS: each bin of
// the frame's transform of noise with RMS s (full scale 1) has an RMS magnitude of
// sqrt(frame length) * s, which the analyser divides by its magnitude divisor.
double noiseBinLevel(double noiseDbfs) {
    double magnitude = std::sqrt(double(korvo::kFrameSamples)) * std::pow(10.0, noiseDbfs / 20.0) /
                       double(korvo::kMagnitudeDivisor);
    return 100.0 * (1.0 + std::log10(magnitude) / 6.0);
}

// Detection level for that noise: 10 units (12 dB) above the mean bin level, where
// a noise bin almost never reaches, so noise alone is not taken for a code.
int detectionLevelFor(double noiseDbfs) { return static_cast<int>(std::ceil(noiseBinLevel(noiseDbfs) + 10.0)); }

std::string uniqueRoomName() {
    return "demo-" + std::to_string(getpid()) + "-" + std::to_string(monotonicMs() % 100000000);
}

enum Who { kListener = 0, kSpeaker = 1 };
const char* const kWhoName[2] = {"listener", "speaker"};

class DemoRun {
public:
    DemoRun(const CommonOptions& common, const DemoOptions& o) : mCommon(common), mOpt(o) {}

    int run() {
        applyLogSettings(mCommon.verbose);  // the demo itself only visits the room at the end
        mRoom = uniqueRoomName();
        // --mic / --speaker put both devices on the given routes (a named room that a monitor
        // can join, for instance); a route not given is the fresh room's.
        mMic = mCommon.mic.empty() ? "sim:" + mRoom : mCommon.mic;
        mSpeaker = mCommon.speaker.empty() ? "sim:" + mRoom : mCommon.speaker;
        const bool freshRoom = mCommon.mic.empty() || mCommon.speaker.empty();
        mStart = monotonicMs();
        std::string noise = "no noise";
        if (mOpt.snrGiven) {
            mNoiseDbfs = kToneDbfs - mOpt.snr;
            char text[128];
            snprintf(text, sizeof text, "noise %.1f dBFS (SNR %.1f dB), detection level %d", mNoiseDbfs, mOpt.snr,
                     detectionLevelFor(mNoiseDbfs));
            noise = text;
        }
        const std::string where = freshRoom ? "in room " + mRoom : "on mic " + mMic + ", speaker " + mSpeaker;
        outf("demo %s: %d round%s, acknowledgement %s, tones of %d ms, %s\n", where.c_str(), mOpt.rounds,
             mOpt.rounds == 1 ? "" : "s", mOpt.noAck ? "off" : "on", mOpt.toneMs, noise.c_str());

        bool started = startDevice(kListener);
        if (started) pump();
        int status[2] = {-1, -1};
        finish(status);
        if (freshRoom) removeRoom();
        return summarize(started, status);
    }

private:
    bool startDevice(Who who) {
        std::vector<std::string> args = {"soundmeter", "handshake", "--role", kWhoName[who],
                                         "--rounds", std::to_string(mOpt.rounds), "--tone-ms",
                                         std::to_string(mOpt.toneMs), "--timeout-ms", std::to_string(mOpt.timeoutMs),
                                         "--mic", mMic, "--speaker", mSpeaker};
        if (mOpt.noAck) args.push_back("--no-ack");
        if (mOpt.snrGiven) args.push_back("--level=" + std::to_string(detectionLevelFor(mNoiseDbfs)));
        for (int i = 0; i < mCommon.verbose; ++i) args.push_back("-v");
        if (!mCommon.plugin.empty()) args.push_back("--plugin=" + mCommon.plugin);
        EnvList env;
        // Each device's microphone hears noise of its own.
        env.emplace_back("KORVO_SIM_SEED", who == kListener ? "11" : "22");
        // The demo decides the noise: none unless --snr asks for it (an empty value is none).
        char level[32] = "";
        if (mOpt.snrGiven) snprintf(level, sizeof level, "%.2f", mNoiseDbfs);
        env.emplace_back("KORVO_SIM_NOISE", level);
        std::string error;
        if (!mChild[who].start(selfExecutable(), args, env, ChildProcess::Options{}, &error)) {
            errf("cannot start the %s: %s", kWhoName[who], error.c_str());
            return false;
        }
        mOpen[who] = true;
        return true;
    }

    // Reads both devices' lines until both have closed their output, or the demo is
    // stopped by Ctrl-C or by its own watchdog.
    void pump() {
        int64_t watchdog = mStart + 30000 + int64_t(mOpt.rounds) * (2 * mOpt.timeoutMs + mOpt.toneMs + 1000);
        bool stopping = false;
        int64_t killAt = 0;
        while (mOpen[kListener] || mOpen[kSpeaker]) {
            if (!stopping && (interrupted() || monotonicMs() >= watchdog)) {
                if (!interrupted()) errf("the demo took too long; stopping the devices");
                stopping = true;
                mAborted = true;
                killAt = monotonicMs() + 10000;
                for (ChildProcess& c : mChild) c.sendSignal(SIGTERM);
            }
            if (stopping && monotonicMs() >= killAt) {
                for (ChildProcess& c : mChild) c.sendSignal(SIGKILL);
                killAt = INT64_MAX;
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
            // The speaker starts once the listener is ready; a listener that ended
            // without getting ready ends the demo.
            if (!mOpen[kListener] && !mReady[kListener]) break;
        }
    }

    void onLine(Who who, const std::string& line) {
        ProtocolLine p;
        if (!p.parse(line)) return;  // not a protocol line: the device's business
        long long t = p.get("t", monotonicMs());
        int code = static_cast<int>(p.get("code"));
        int round = static_cast<int>(p.get("round"));
        char text[160];
        if (p.event == "ready") {
            mReady[who] = true;
            snprintf(text, sizeof text, "ready");
            show(t, who, text);
            if (who == kListener && !stoppingOrStarted()) startDevice(kSpeaker);
        } else if (p.event == "said") {
            mSaidAt[who][round] = t;
            snprintf(text, sizeof text, "says  code %2d (%5d Hz)", code, codeHz(code));
            show(t, who, text);
        } else if (p.event == "heard") {
            Who peer = who == kListener ? kSpeaker : kListener;
            long long latency = p.get("waited");
            auto said = mSaidAt[peer].find(round);
            if (said != mSaidAt[peer].end()) latency = t - said->second;
            snprintf(text, sizeof text, "hears code %2d (%5d Hz)  latency %lld ms", code, codeHz(code), latency);
            show(t, who, text);
            // The exchange is complete with the last hearing of its round.
            Who last = mOpt.noAck ? kListener : kSpeaker;
            auto started = mSaidAt[kSpeaker].find(round);
            if (who == last && started != mSaidAt[kSpeaker].end()) mLatencies.push_back(t - started->second);
        } else if (p.event == "timeout") {
            snprintf(text, sizeof text, "did not hear code %d (%d Hz) within %lld ms", code, codeHz(code),
                     p.get("waited"));
            show(t, who, text);
        } else if (p.event == "done") {
            snprintf(text, sizeof text, "finished, %lld of %lld rounds", p.get("completed"), p.get("rounds"));
            show(t, who, text);
        }
    }

    bool stoppingOrStarted() const { return mAborted || mChild[kSpeaker].running() || mOpen[kSpeaker]; }

    void show(long long t, Who who, const char* text) {
        outf("%8.3f s  %-8s  %s\n", (t - mStart) / 1000.0, kWhoName[who], text);
    }

    void finish(int status[2]) {
        for (int w = 0; w < 2; ++w) {
            if (!mChild[w].running()) continue;
            if (!mChild[w].wait(10000, &status[w])) {
                mChild[w].sendSignal(SIGKILL);
                mChild[w].wait(5000, &status[w]);
            }
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
        outf("room %s removed\n", mRoom.c_str());
    }

    int summarize(bool started, const int status[2]) {
        int completed = static_cast<int>(mLatencies.size());
        if (completed > 0) {
            std::vector<int64_t> sorted = mLatencies;
            std::sort(sorted.begin(), sorted.end());
            size_t mid = sorted.size() / 2;
            double median = sorted.size() % 2 ? double(sorted[mid]) : (sorted[mid - 1] + sorted[mid]) / 2.0;
            outf("%d of %d exchanges completed, latency median %.0f ms, worst %lld ms\n", completed, mOpt.rounds,
                 median, static_cast<long long>(sorted.back()));
        } else {
            outf("0 of %d exchanges completed\n", mOpt.rounds);
        }
        std::string failed;
        for (int w = 0; w < 2; ++w) {
            if (status[w] <= 0) continue;  // 0: finished well; -1: never started
            failed += std::string(failed.empty() ? "" : ", ") + kWhoName[w] + " exit " + std::to_string(status[w]);
        }
        if (!failed.empty() && !interrupted()) errf("a device failed (%s)", failed.c_str());
        bool allRan = status[kListener] == 0 && status[kSpeaker] == 0;
        return started && allRan && !mAborted && !interrupted() && completed == mOpt.rounds ? 0 : 1;
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
    bool mAborted = false;
    std::map<int, long long> mSaidAt[2];  // round -> when the device said its code
    std::vector<int64_t> mLatencies;       // per completed exchange, from the speaker's code
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
           "add white noise to both microphones, this many dB below the tone, and raise the detection level "
           "above it (default: no noise); below about 15 dB code 0 is lost first, its band catching only a "
           "leak of its tone")
        ->check(CLI::Range(-20.0, 120.0));
    sub->add_option("--tone-ms", options->toneMs, "duration of each tone in milliseconds")
        ->check(CLI::Range(50, 5000))
        ->capture_default_str();
    sub->add_option("--timeout-ms", options->timeoutMs, "how long a device waits for each code")
        ->check(CLI::Range(500, 600000))
        ->capture_default_str();
    // Both devices use these routes instead of the fresh room (e.g. sim:lab, which a monitor can join).
    addRouteOptions(sub, common, "the fresh room", "the fresh room");
    return {sub, [&common, options] {
                DemoRun demo(common, *options);
                return demo.run();
            }};
}

}  // namespace host
}  // namespace korvo
