// soundmeter calibrate: listens to the room alone and proposes a detection level for
// the builtin decoder (host/hearing/Calibration.h says how), or tells whether the room
// alone sounds like a code to the host's decoder.
#include <cmath>

#include <CLI/CLI.hpp>

#include "host/output/CodePlan.h"
#include "host/core/LiveHearing.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

struct CalibrateOptions {
    double seconds = 2.0;
    DecoderKind decoder = DecoderKind::Host;
};

// The host's decoder takes no level: calibration tells whether the room alone sounds
// like a code to it (a steady tone in the room would be heard every time).
int hearTheRoom(Session& session, double seconds) {
    LiveHearing hearing(session.device(), DecoderKind::Host);
    const int steps = static_cast<int>(std::lround(seconds * korvo::kSampleRate / korvo::kFrameSamples));
    CodeSet heard = 0;
    Outcome outcome = Outcome::Done;
    for (int i = 0; i < steps; ++i) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        heard |= hearing.step();
    }
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);
    std::string codes;
    JsonEvent event("calibration");
    event.add("decoder", decoderName(DecoderKind::Host)).add("seconds", seconds);
    int count = 0;
    for (int c = 0; c < kHostCodes; ++c) {
        if (!(heard & codeBit(c))) continue;
        codes += (codes.empty() ? "" : ", ") + std::to_string(c);
        ++count;
    }
    event.add("codes_heard", count);
    infof("host decision: no detection level to set; it compares each code with the noise around it\n");
    if (count == 0) {
        resultf(event, "the room alone sounds like no code (host decision, %.1f s)\n", seconds);
    } else {
        resultf(event, "the room alone sounds like code%s %s (host decision, %.1f s): a tone in the room\n",
                count == 1 ? "" : "s", codes.c_str(), seconds);
    }
    return 0;
}

int runCalibrate(const CommonOptions& common, const CalibrateOptions& o) {
    const DecoderKind kind = o.decoder;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    infof("listening to the room for %.1f s; nothing should be said meanwhile\n", o.seconds);
    if (!decoderInfo(kind).takesLevel) return hearTheRoom(session, o.seconds);
    LiveHearing hearing(session.device(), kind);
    Calibration calibration;
    const int steps = static_cast<int>(std::lround(o.seconds * korvo::kSampleRate / korvo::kFrameSamples));
    const Outcome outcome = hearing.listenToRoom(steps, &calibration);
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);

    const Calibration::Proposal chosen = calibration.propose();
    if (chosen.silent) {
        infof("the room is silent: the read-out shows no bin above its floor\n");
    } else {
        infof("the room's noise: median bin level %.1f over %d analysed frames\n", chosen.noiseLevel, calibration.frames());
        infof("builtin decision (HearFreqIdx): level %d, about %.2f false codes in 10,000 steps expected\n",
              chosen.level, chosen.falsePer10k);
    }
    JsonEvent event("calibration");
    event.add("decoder", decoderName(kind)).add("level", chosen.level).add("seconds", o.seconds);
    event.add("frames", calibration.frames()).add("noise_level", chosen.noiseLevel);
    event.add("false_per_10k", chosen.falsePer10k);
    resultf(event, "proposed detection level %d (%s decision)\n", chosen.level, decoderName(kind));
    return 0;
}

}  // namespace

Command addCalibrateCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<CalibrateOptions>();
    CLI::App* sub = app.add_subcommand(
        "calibrate",
        "Listen to the room alone: for --decoder builtin, propose the detection level at which its noise gives "
        "fewer than 1 false code in 10,000 hearing steps while leaving the most headroom for tones (--level auto "
        "does the same in 1.5 s before listening); for the host's decoder, which takes no level, tell whether "
        "the room alone sounds like a code.");
    sub->add_option("--seconds", options->seconds, "how long to listen to the room")
        ->check(finiteRange(0.5, 3600.0))
        ->capture_default_str();
    addDecoderOption(sub, &options->decoder);
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runCalibrate(common, *options); }};
}

}  // namespace host
}  // namespace korvo
