// soundmeter calibrate: listens to the room alone and proposes a detection level
// (host/hearing/Calibration.h says how).
#include <cmath>

#include <CLI/CLI.hpp>

#include "host/CodePlan.h"
#include "host/Hearing.h"
#include "host/JsonEvent.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/Session.h"

namespace korvo {
namespace host {
namespace {

struct CalibrateOptions {
    double seconds = 2.0;
    DecoderKind decoder = DecoderKind::Host;
};

int runCalibrate(const CommonOptions& common, const CalibrateOptions& o) {
    const DecoderKind kind = o.decoder;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    infof("listening to the room for %.1f s; nothing should be said meanwhile\n", o.seconds);
    Hearing hearing(session.device(), kind);
    Calibration calibration;
    const int steps = static_cast<int>(std::lround(o.seconds * korvo::kSampleRate / korvo::kFrameSamples));
    const Outcome outcome = hearing.listenToRoom(steps, &calibration);
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);

    const Calibration::Proposal host = calibration.propose(DecoderKind::Host);
    const Calibration::Proposal builtin = calibration.propose(DecoderKind::Builtin);
    const Calibration::Proposal& chosen = kind == DecoderKind::Host ? host : builtin;
    if (chosen.silent) {
        infof("the room is silent: the read-out shows no bin above its floor\n");
    } else {
        infof("the room's noise: median bin level %.1f over %d analysed frames\n", host.noiseLevel, calibration.frames());
        infof("host's decision: level %d keeps the room's noise in the read-out; its thresholds, relative to the "
              "noise around each code, keep noise alone under 1 false code in 10,000 steps at any level\n",
              host.level);
        infof("builtin decision (HearFreqIdx): level %d, about %.2f false codes in 10,000 steps expected\n",
              builtin.level, builtin.falsePer10k);
    }
    JsonEvent event("calibration");
    event.add("decoder", decoderName(kind)).add("level", chosen.level).add("seconds", o.seconds);
    event.add("frames", calibration.frames()).add("noise_level", host.noiseLevel);
    event.add("host_level", host.level).add("builtin_level", builtin.level).add("builtin_false_per_10k", builtin.falsePer10k);
    resultf(event, "proposed detection level %d (%s decision)\n", chosen.level, decoderName(kind));
    return 0;
}

}  // namespace

Command addCalibrateCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<CalibrateOptions>();
    CLI::App* sub = app.add_subcommand(
        "calibrate",
        "Listen to the room alone and propose the detection level at which its noise gives fewer than 1 false "
        "code in 10,000 hearing steps while leaving the most headroom for tones (--level auto does the same "
        "in 1.5 s before listening).");
    sub->add_option("--seconds", options->seconds, "how long to listen to the room")
        ->check(finiteRange(0.5, 3600.0))
        ->capture_default_str();
    addDecoderOption(sub, &options->decoder);
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runCalibrate(common, *options); }};
}

}  // namespace host
}  // namespace korvo
