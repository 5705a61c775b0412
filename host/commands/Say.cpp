// soundmeter say CODE: one code, said once by a speaker device.
#include <CLI/CLI.hpp>

#include <korvo/platform/Routes.h>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"

namespace korvo {
namespace host {
namespace {

struct SayOptions {
    int code = 0;
    int ms = 500;
};

int runSay(const CommonOptions& common, const SayOptions& o) {
    Session session(common);
    DeviceSettings settings;
    settings.role = 2;  // speaker, no acknowledgement: saying leaves nothing to wait for
    settings.routes.speaker = true;
    if (int status = session.open(settings)) return status;
    noteSilentSpeaker();
    const std::string truth = codeTruth(o.code, static_cast<int>(korvo::platform::outputRateOf(korvo::platform::speakerRoute())));
    if (!truth.empty()) infof("note: %s\n", truth.c_str());

    const int64_t start = monotonicMs();
    session.device().sayCode(o.code, o.ms);
    infof("saying code %d (%d Hz) for %d ms\n", o.code, codeHz(o.code), o.ms);
    // The engine fades the tone out by itself; tearing down earlier would cut it.
    const Outcome outcome = session.device().stepUntil(start + o.ms + kToneTailMs);
    session.close();
    if (outcome != Outcome::Done) return exitStatusOf(outcome);
    resultf(JsonEvent("said").add("code", o.code).add("hz", codeHz(o.code)).add("ms", o.ms), "said code %d (%d Hz)\n",
            o.code, codeHz(o.code));
    return 0;
}

}  // namespace

void noteSilentSpeaker() {
    if (korvo::platform::speakerRoute() != "null" || outputMode() != OutputMode::Normal) return;
    errf("note: the speaker route is null, so nothing is audible; add --speaker card to play through the sound card");
}

Command addSayCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<SayOptions>();
    CLI::App* sub = app.add_subcommand("say", "Say one code (role speaker) and wait until its tone has ended.");
    sub->add_option("CODE", options->code, "code to say, 0..39 (every listener hears 0..17; the host's decision also 18..22)")
        ->required()
        ->check(CLI::Range(0, kCodeCount - 1));
    sub->add_option("--ms", options->ms, "tone duration in milliseconds")
        ->check(CLI::Range(1, 60000))
        ->capture_default_str();
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runSay(common, *options); }};
}

}  // namespace host
}  // namespace korvo
