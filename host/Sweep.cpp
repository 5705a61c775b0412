// soundmeter sweep: a speaker saying the codes of the plan in turn (SayAllFreqIndex)
// for a given time.
//
// The sweep chooses its codes inside the plug-in and tells only through the lines
// it prints to standard output ("... TONE PLAYING[code:key] ..."). The host reads
// them from the pipe it keeps on standard output, reports each code said and, with
// acknowledgement, listens for the answer code + 1.
#include <condition_variable>
#include <cstdio>
#include <deque>
#include <mutex>

#include <CLI/CLI.hpp>

#include "host/Clock.h"
#include "host/CodePlan.h"
#include "host/JsonEvent.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Session.h"

namespace korvo {
namespace host {
namespace {

struct SweepOptions {
    int ms = 200;
    double seconds = 5.0;
    bool noAck = false;
};

// Between two SayAllFreqIndex calls; the plug-in's own pause decides when a call says.
constexpr int64_t kCallPeriodMs = 50;
// How long, after its tone, an answer may take before the sweep moves on.
constexpr int64_t kAnswerWaitMs = 1500;

// Codes the sweep reported having said, handed from the pipe's reader thread.
class SaidCodes {
public:
    LibraryStdout::LineHandler handler(bool verbose) {
        auto forward = libraryLinesToStderr(verbose);
        return [this, forward](const std::string& line) {
            forward(line);
            size_t at = line.find("TONE PLAYING[");
            int code = -1;
            int key = 0;
            if (at != std::string::npos && sscanf(line.c_str() + at, "TONE PLAYING[%d:%d]", &code, &key) == 2) {
                std::lock_guard<std::mutex> lock(mMutex);
                mCodes.push_back(code);
            }
        };
    }
    // The next code reported, or -1 when none is waiting.
    int take() {
        std::lock_guard<std::mutex> lock(mMutex);
        if (mCodes.empty()) return -1;
        int code = mCodes.front();
        mCodes.pop_front();
        return code;
    }

private:
    std::mutex mMutex;
    std::deque<int> mCodes;
};

int runSweep(const CommonOptions& common, const SweepOptions& o) {
    SaidCodes said;
    Session session(common);
    DeviceSettings settings;
    settings.role = 2;
    settings.needAck = !o.noAck;
    settings.routes.speaker = true;
    settings.routes.mic = !o.noAck;  // answers are heard
    if (int status = session.open(settings, said.handler(common.verbose > 0))) return status;
    noteSilentSpeaker();
    SoundMeter_vir& meter = session.meter();
    infof("sweeping for %.1f s, tones of %d ms, acknowledgement %s\n", o.seconds, o.ms, o.noAck ? "off" : "on");

    int saidCount = 0;
    int answered = 0;
    int awaiting = -1;  // the answer being listened for, -1 when none
    int64_t awaitUntil = 0;
    int64_t saidAt = 0;
    Outcome outcome = Outcome::Done;
    const int64_t start = monotonicMs();
    const int64_t end = start + static_cast<int64_t>(o.seconds * 1000.0);
    int64_t nextCall = start;
    for (int64_t now = start; now < end; now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        if (awaiting >= 0) {
            if (meter.HearFreqIdx(awaiting) == awaiting) {
                ++answered;
                const int64_t roundTrip = monotonicMs() - saidAt;
                progressf(JsonEvent("heard").add("code", awaiting).add("hz", codeHz(awaiting)).add("round_trip_ms", roundTrip),
                        "%8.3f s  heard answer code %d (%d Hz), round trip %lld ms\n", (monotonicMs() - start) / 1000.0,
                        awaiting, codeHz(awaiting), static_cast<long long>(roundTrip));
                awaiting = -1;
            } else if (now >= awaitUntil) {
                infof("%8.3f s  no answer code %d\n", (now - start) / 1000.0, awaiting);
                // As if answered: the sweep's pause then lets the next code be said.
                meter.setSpeakerState(10);
                awaiting = -1;
            }
        } else {
            if (now >= nextCall) {
                meter.SayAllFreqIndex(o.ms);
                nextCall = now + kCallPeriodMs;
            }
            meter.processAudio();
        }
        for (int code; (code = said.take()) >= 0;) {
            ++saidCount;
            saidAt = monotonicMs();
            const int hz = code < kCodeCount ? codeHz(code) : 0;
            progressf(JsonEvent("said").add("code", code).add("hz", hz).add("ms", o.ms).add("t_s", (saidAt - start) / 1000.0),
                    "%8.3f s  said code %d (%d Hz)%s\n", (saidAt - start) / 1000.0, code, hz,
                    codeHearable(code) ? "" : ", cannot be heard");
            if (!o.noAck) {
                awaiting = korvo::acknowledgementOf(code);
                awaitUntil = saidAt + o.ms + kAnswerWaitMs;
            }
        }
    }
    if (outcome == Outcome::Done) outcome = session.device().stepUntil(monotonicMs() + o.ms + kToneTailMs);
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);
    JsonEvent summary("summary");
    summary.add("said", saidCount);
    if (o.noAck) {
        resultf(summary, "said %s\n", plural(saidCount, "code").c_str());
    } else {
        resultf(summary.add("answered", answered), "said %s, %d answered\n", plural(saidCount, "code").c_str(), answered);
    }
    return 0;
}

}  // namespace

Command addSweepCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<SweepOptions>();
    CLI::App* sub = app.add_subcommand(
        "sweep",
        "Say the codes of the plan in turn (role speaker) for a while; with acknowledgement each code "
        "waits for its answer, code + 1, from a peer.");
    sub->add_option("--ms", options->ms, "tone duration in milliseconds")
        ->check(CLI::Range(20, 10000))
        ->capture_default_str();
    sub->add_option("--seconds", options->seconds, "how long to sweep")
        ->check(finiteRange(0.1, 86400.0))
        ->capture_default_str();
    sub->add_flag("--no-ack", options->noAck, "do not wait for answers");
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runSweep(common, *options); }};
}

}  // namespace host
}  // namespace korvo
