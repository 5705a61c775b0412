// soundmeter demo: two devices, each a process of its own running
// "soundmeter handshake", meet in a fresh simulated room and exchange codes. The
// parent reads their protocol lines and shows the exchange as it happens: the devices'
// supervision is DemoDevices, the report of rounds DemoRounds.
#include <unistd.h>

#include <cmath>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include <korvo/platform/RoomPresets.h>
#include <korvo/platform/Routes.h>

#include "host/base/Clock.h"
#include "host/base/Interrupt.h"
#include "host/commands/demo/DemoDevices.h"
#include "host/commands/demo/DemoPairs.h"
#include "host/commands/demo/DemoRounds.h"
#include "host/core/Environment.h"
#include "host/core/Options.h"
#include "host/core/Protocol.h"
#include "host/core/RouteGuard.h"
#include "host/output/CodePlan.h"
#include "host/output/Output.h"

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
    std::string room;     // a room preset of the simulated room; empty: the environment's
    std::string devices;  // a device preset for both devices; empty: the environment's
    CodeRange codes;
    bool codesGiven = false;
    int pairs = 1;
    bool sameCodes = false;   // every pair on the same codes (to measure why they are not)
    bool sharedRoom = false;  // a pair of several in one room: other pairs' speakers are welcome
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

class DemoRun {
public:
    DemoRun(const CommonOptions& common, const DemoOptions& o) : mCommon(common), mOpt(o), mRounds(o.rounds, o.noAck) {
        if (o.sharedRoom) mRounds.shareRoom();
    }

    int run() {
        applyLogSettings(mCommon.verbose);  // the demo itself only visits the room at the end
        if (!levelApplies("demo", mOpt.level, mOpt.decoder)) return 2;
        mRoom = uniqueRoomName();
        if (mOpt.pairs > 1) return runAllPairs();
        // --mic / --speaker put both devices on the given routes (a named room that a monitor
        // can join, for instance); a route not given is the fresh room's.
        mMic = mCommon.mic.empty() ? "sim:" + mRoom : mCommon.mic;
        mSpeaker = mCommon.speaker.empty() ? "sim:" + mRoom : mCommon.speaker;
        const bool freshRoom = mCommon.mic.empty() || mCommon.speaker.empty();
        RouteUse routes;
        routes.mic = routes.speaker = true;
        if (int status = checkRouteTexts(routes, mMic, mSpeaker)) return status;
        if (!presetsApply()) return 2;
        if (!roomsFree()) return 2;
        mRounds.start(monotonicMs());
        std::string noise = "no noise";
        if (mOpt.snrGiven) {
            mNoiseDbfs = kToneDbfs + kNoisyRoomGainDb - mOpt.snr;
            char text[128];
            snprintf(text, sizeof text, "noise %.1f dBFS (SNR %.1f dB)", mNoiseDbfs, mOpt.snr);
            noise = text;
        }
        const std::string where = freshRoom ? "in room " + mRoom : "on mic " + mMic + ", speaker " + mSpeaker;
        std::string presets;
        if (!mOpt.room.empty()) presets += ", room " + mOpt.room;
        if (!mOpt.devices.empty()) presets += ", devices " + mOpt.devices;
        if (mOpt.codesGiven) {
            mCodes = mOpt.codes;
            presets += ", codes " + mCodes.text();
        } else if (carriedCodes() < kBuiltinCodes) {
            mCodes.hi = carriedCodes() - 1;
            presets += ", codes " + mCodes.text() + " (the " + mOpt.devices + "'s loudspeaker carries none above " +
                       std::to_string(int(korvo::platform::devicePresetTopHz(mOpt.devices))) + " Hz)";
        }
        infof("demo %s: %s, acknowledgement %s, tones of %d ms, %s, %s decision%s%s\n", shown(where).c_str(),
              plural(mOpt.rounds, "round").c_str(), mOpt.noAck ? "off" : "on", mOpt.toneMs, noise.c_str(),
              decoderName(mOpt.decoder), levelArgument().empty() ? "" : (", " + levelArgument().substr(2)).c_str(),
              presets.c_str());

        // Both start together and calibrate at once; they begin when both are ready.
        const bool started = startDevice(kListener) && startDevice(kSpeaker);
        if (started) mDevices.pump([this](Who who, const std::string& line) { onLine(who, line); }, silenceAllowedMs());
        mDevices.finish();
        if (freshRoom) removeRoom();
        if (mDevices.stopped()) leaveNamedRooms();
        return summarize(started);
    }

private:
    // Several pairs in one fresh room, each a demo of its own on its share of the codes the
    // loudspeakers carry (or all of them on the same codes, with --same-codes).
    int runAllPairs() {
        if (!mCommon.mic.empty() || !mCommon.speaker.empty()) {
            errf("--pairs puts the pairs in a fresh room of their own: --mic and --speaker do not apply");
            return 2;
        }
        const CodeRange all = mOpt.codesGiven ? mOpt.codes : CodeRange{0, carriedCodes() - 1};
        const int share = all.count() / mOpt.pairs;
        if (!mOpt.sameCodes && share < 3) {
            errf("--pairs %d: %s are too few for %d pairs of at least three", mOpt.pairs,
                 plural(all.count(), "code").c_str(), mOpt.pairs);
            return 2;
        }
        PairsPlan plan;
        plan.room = mRoom;
        std::string shares;
        for (int i = 0; i < mOpt.pairs; ++i) {
            const CodeRange codes = mOpt.sameCodes ? all : CodeRange{all.lo + i * share, all.lo + (i + 1) * share - 1};
            shares += (i ? ", " : "") + codes.text();
            plan.demos.push_back(pairArguments(codes));
        }
        infof("demo of %d pairs in room %s: codes %s%s\n", mOpt.pairs, mRoom.c_str(), shares.c_str(),
              mOpt.sameCodes ? " (the same for every pair)" : "");
        return runPairs(plan);
    }

    // One pair's demo: this demo's options on the shared room and the pair's codes.
    std::vector<std::string> pairArguments(const CodeRange& codes) const {
        std::vector<std::string> args = {"soundmeter"};
        if (mCommon.json) args.push_back("--json");
        if (mCommon.quiet) args.push_back("-q");
        for (int i = 0; i < mCommon.verbose; ++i) args.push_back("-v");
        if (!mCommon.plugin.empty()) args.push_back("--plugin=" + mCommon.plugin);
        args.insert(args.end(), {"demo", "--rounds", std::to_string(mOpt.rounds), "--tone-ms", std::to_string(mOpt.toneMs),
                                 "--timeout-ms", std::to_string(mOpt.timeoutMs), "--mic", "sim:" + mRoom, "--speaker",
                                 "sim:" + mRoom, "--codes=" + codes.text(), "--shared-room",
                                 std::string("--decoder=") + decoderName(mOpt.decoder)});
        if (mOpt.noAck) args.push_back("--no-ack");
        if (mOpt.snrGiven) args.push_back("--snr=" + std::to_string(mOpt.snr));
        if (mOpt.level.given) args.push_back(mOpt.level.automatic ? "--level=auto" : "--level=" + std::to_string(mOpt.level.value));
        if (!mOpt.room.empty()) args.push_back("--room=" + mOpt.room);
        if (!mOpt.devices.empty()) args.push_back("--devices=" + mOpt.devices);
        return args;
    }

    // A room's or a device's preset is the simulated room's: a sound card has its own.
    bool presetsApply() const {
        if (mOpt.room.empty() && mOpt.devices.empty()) return true;
        for (const std::string& route : {mMic, mSpeaker}) {
            if (route.compare(0, 4, "sim:") != 0) {
                errf("%s applies to simulated rooms only, not to %s", mOpt.room.empty() ? "--devices" : "--room",
                     shown(route).c_str());
                return false;
            }
        }
        return true;
    }

    // The handshake's codes that the devices' loudspeakers carry: those at or below the
    // preset's top frequency.
    int carriedCodes() const {
        const double top = mOpt.devices.empty() ? 0.0 : korvo::platform::devicePresetTopHz(mOpt.devices);
        int codes = kBuiltinCodes;
        while (top > 0.0 && codes > 0 && korvo::codeHz(codes - 1) > top) --codes;
        return codes;
    }

    // Speakers of another run in a room would mix their codes with this demo's, and both
    // runs would fail rounds without knowing why. A monitor only listens: it is welcome.
    bool roomsFree() {
        if (mOpt.sharedRoom) return true;
        return roomFree(mSpeaker, "speaker") && (mMic == mSpeaker || roomFree(mMic, "microphone"));
    }

    bool roomFree(const std::string& route, const char* what) {
        std::string why;
        const int speakers = korvo::platform::routeRoomSpeakers(route, mDevices.running(), &why);
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
        EnvList env;
        std::vector<std::string> args = {"soundmeter", "handshake", "--role", kWhoName[who],
                                         "--rounds", std::to_string(mOpt.rounds), "--tone-ms",
                                         std::to_string(mOpt.toneMs), "--timeout-ms", std::to_string(mOpt.timeoutMs),
                                         "--mic", mMic, "--speaker", mSpeaker};
        if (mOpt.noAck) args.push_back("--no-ack");
        if (mCodes.count() < kBuiltinCodes) args.push_back("--codes=" + mCodes.text());
        if (!mOpt.room.empty()) env.emplace_back("KORVO_SIM_ROOM", mOpt.room);
        if (!mOpt.devices.empty()) {
            env.emplace_back("KORVO_SIM_DEVICE", mOpt.devices);
            // Two devices of one make are not on one clock: their crystals are off in opposite
            // directions, the speaker's as the preset says, the listener's the other way.
            char ppm[32];
            snprintf(ppm, sizeof ppm, "%g", (who == kSpeaker ? 1 : -1) * korvo::platform::devicePresetClockPpm(mOpt.devices));
            env.emplace_back("KORVO_SIM_CLOCK_PPM", ppm);
        }
        args.push_back(std::string("--decoder=") + decoderName(mOpt.decoder));
        args.push_back("--start-on-stdin");
        if (!levelArgument().empty()) args.push_back(levelArgument());
        for (int i = 0; i < mCommon.verbose; ++i) args.push_back("-v");
        if (!mCommon.plugin.empty()) args.push_back("--plugin=" + mCommon.plugin);
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
        return mDevices.start(who, args, env, kStartupMs);
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

    void onLine(Who who, const std::string& line) {
        ProtocolLine p;
        if (!p.parse(line)) return;  // not a protocol line: the device's business
        mDevices.heardFrom(who, silenceAllowedMs());
        if (p.event == "ready") {
            mReady[who] = true;
            mDevices.heardFrom(who, kStartupMs);  // its peer may still be starting
            mRounds.show(p.get("t", monotonicMs()), who, "ready");
            if (mReady[kListener] && mReady[kSpeaker] && !mDevices.stopped()) begin();
            return;
        }
        if (p.event == "done") mDevices.done(who);
        mRounds.add(who, p);
    }

    void begin() {
        // A run started at the same moment passed the check at the start; its devices are
        // in the room by now, as this demo's are: the later of the two is always told.
        if (!roomsFree()) {
            mCrowded = true;
            mDevices.stop();
            return;
        }
        mDevices.begin(silenceAllowedMs());
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

    int summarize(bool started) {
        mRounds.summarize();
        if (interrupted()) return 130;
        if (!started) return 1;
        if (mCrowded) return 2;            // its line is out
        if (mDevices.stuck()) return 1;    // its line is out
        const std::string failed = mDevices.failures();
        if (!failed.empty()) {
            errf("%s", failed.c_str());
            return 1;
        }
        if (mRounds.completed() != mOpt.rounds) {
            errf("%d of %s completed", mRounds.completed(), plural(mOpt.rounds, "exchange").c_str());
            return 1;
        }
        return 0;
    }

    const CommonOptions& mCommon;
    const DemoOptions& mOpt;
    std::string mRoom;
    std::string mMic;
    std::string mSpeaker;
    double mNoiseDbfs = 0.0;
    DemoDevices mDevices;
    DemoRounds mRounds;
    bool mReady[2] = {false, false};
    bool mCrowded = false;  // another run's speakers came into the room
    CodeRange mCodes;  // the handshake's codes this exchange uses
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
    sub->add_option("--room", options->room,
                    "the simulated room's situation: reverberation, distance and background sounds (README: Simulated "
                    "rooms; default: KORVO_SIM_ROOM, else quiet)")
        ->check(CLI::IsMember(korvo::platform::roomPresets()));
    sub->add_option("--devices", options->devices,
                    "both devices' loudspeakers, microphones and clocks (README: Simulated rooms; default: "
                    "KORVO_SIM_DEVICE, else ideal)")
        ->check(CLI::IsMember(korvo::platform::devicePresets()));
    addCodesOption(sub, &options->codes,
                   "the codes the exchange uses (default: those the devices' loudspeakers carry; with --pairs, shared "
                   "out among the pairs)")
        ->each([options](const std::string&) { options->codesGiven = true; });
    sub->add_option("--pairs", options->pairs,
                    "pairs of devices in one fresh room, each on its own share of the codes; the summary counts the "
                    "codes a device heard before its own peer said them")
        ->check(CLI::Range(1, 6))
        ->capture_default_str();
    sub->add_flag("--same-codes", options->sameCodes, "with --pairs: every pair on all the codes, to see why they are shared out");
    // A pair's own demo, run by --pairs: not in the help.
    sub->add_flag("--shared-room", options->sharedRoom, "other pairs' speakers are in the room")->group("");
    // Both devices use these routes instead of the fresh room (e.g. sim:lab, which a monitor can join).
    addRouteOptions(sub, common, "the fresh room", "the fresh room");
    return {sub, [&common, options] {
                DemoRun demo(common, *options);
                return demo.run();
            }};
}

}  // namespace host
}  // namespace korvo
