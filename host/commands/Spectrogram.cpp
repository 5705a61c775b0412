// soundmeter spectrogram: a picture of the spectrum a listener's decoder heard, from a
// microphone route in real time or from a file as fast as the processor allows, with
// the codes it heard, the same as listen or scan. The host's decoder shows its own
// spectrum of every frame; the builtin decoder the plug-in's read-out at the open level
// (it hears with the level applied by the host: LevelledEar).
#include <CLI/CLI.hpp>

#include <cmath>

#include <korvo/platform/Recording.h>
#include <korvo/platform/Routes.h>

#include "host/base/Clock.h"
#include "host/output/CodePlan.h"
#include "host/core/Environment.h"
#include "host/output/FileWatch.h"
#include "host/core/LiveHearing.h"
#include "host/output/JsonEvent.h"
#include "host/core/OfflineRun.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/Session.h"
#include "host/picture/PictureFile.h"
#include "host/picture/SpectrogramPicture.h"

namespace korvo {
namespace host {
namespace {

struct SpectrogramOptions {
    std::string file;  // empty: the microphone route
    std::string png;
    double seconds = 0.0;  // 0: the whole file, or kDefaultLiveSeconds of a microphone
    LevelChoice level;
    DecoderKind decoder = DecoderKind::Host;
};

constexpr double kDefaultLiveSeconds = 10.0;

int64_t stepsIn(double seconds) {
    return static_cast<int64_t>(std::ceil(seconds * korvo::kSampleRate / korvo::kFrameSamples));
}

void noteHeard(Spectrogram& picture, CodeSet begun, int64_t step, double t, int* count) {
    for (int c = 0; c < kCodeCount; ++c) {
        if (!(begun & codeBit(c))) continue;
        picture.addHeard(step, c);
        printHeard(c, t);
        ++*count;
    }
}

int finish(const Spectrogram& picture, const PictureTitle& title, const std::string& png, int count) {
    std::string cause;
    if (!writeSpectrogramPng(picture, title, png, &cause)) {
        errf("spectrogram %s: %s", png.c_str(), cause.c_str());
        return 1;
    }
    resultf(JsonEvent("picture").add("png", png).add("audio_s", title.seconds).add("codes", count),
            "wrote %s: %.1f s of %s, %s heard\n", shown(png).c_str(), title.seconds, shown(title.source).c_str(),
            plural(count, "code").c_str());
    return 0;
}

int fromFile(const CommonOptions& common, const SpectrogramOptions& o) {
    applyLogSettings(common.verbose);
    if (!offlineOptionsApply(common, "spectrogram", o.decoder, o.level)) return 2;
    std::string cause;
    std::unique_ptr<korvo::platform::Recording> recording =
        korvo::platform::Recording::open(o.file, korvo::kSampleRate, &cause);
    if (!recording) {
        errf("spectrogram %s: %s", o.file.c_str(), cause.c_str());
        return 2;
    }
    double length = recording->totalSeconds();
    if (o.seconds > 0 && (length <= 0 || o.seconds < length)) length = o.seconds;
    Spectrogram picture(stepsIn(length) + kFileTailSteps);
    std::unique_ptr<Decoder> decoder = makeDecoder(o.decoder);

    int count = 0;
    OfflineRun run;
    float levels[korvo::kSpectrumBins] = {};
    const bool read = hearRecording(*recording, *decoder, o.seconds, [&](int64_t frames, CodeSet begun) {
        decoder->spectrum(levels);
        picture.addStep(frames, levels);
        noteHeard(picture, begun, frames, stepSeconds(frames), &count);
    }, &run, &cause);
    if (!read) {
        errf("spectrogram %s: %s", o.file.c_str(), cause.c_str());
        return 1;
    }
    if (run.interrupted) return 130;
    return finish(picture, {o.file, run.audioSeconds, false, 0, o.decoder}, o.png, count);
}

int fromMicrophone(const CommonOptions& common, const SpectrogramOptions& o) {
    if (!levelApplies("spectrogram", o.level, o.decoder)) return 2;
    Session session(common);
    DeviceSettings settings;
    settings.role = 1;
    settings.routes.mic = true;
    if (int status = session.open(settings)) return status;
    Device& device = session.device();
    LiveHearing hearing(device, o.decoder, /*seeAll=*/true);
    Outcome outcome = hearing.applyLevel(o.level);

    const double seconds = o.seconds > 0 ? o.seconds : kDefaultLiveSeconds;
    Spectrogram picture(device.steps() + stepsIn(seconds));
    FileWatch file(false);
    int count = 0;
    float levels[korvo::kSpectrumBins] = {};
    const int64_t start = monotonicMs();
    const int64_t end = start + static_cast<int64_t>(seconds * 1000.0);
    for (int64_t now = start; outcome == Outcome::Done && now < end && !file.over(now); now = monotonicMs()) {
        if ((outcome = session.interruption()) != Outcome::Done) break;
        const CodeSet begun = hearing.step();
        hearing.seenSpectrum(levels);
        picture.addStep(device.steps(), levels);
        noteHeard(picture, begun, device.steps(), hearing.seconds(), &count);
    }
    const PictureTitle title{korvo::platform::micRoute(), stepSeconds(device.steps()),
                             decoderInfo(o.decoder).takesLevel, hearing.level(), o.decoder};
    session.close();
    // A route that failed gives no picture: it would show a silence nobody heard.
    if (outcome == Outcome::RouteFailed) return exitStatusOf(outcome);
    const int written = finish(picture, title, o.png, count);
    return outcome == Outcome::Done ? written : exitStatusOf(outcome);
}

int runSpectrogram(const CommonOptions& common, const SpectrogramOptions& o) {
    if (!o.file.empty() && !common.mic.empty()) {
        errf("spectrogram: give a FILE or --mic, not both");
        return 2;
    }
    std::string cause;
    if (!checkPictureFile(o.png, &cause)) {
        errf("spectrogram %s: %s", o.png.c_str(), cause.c_str());
        return 2;
    }
    return o.file.empty() ? fromMicrophone(common, o) : fromFile(common, o);
}

}  // namespace

Command addSpectrogramCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<SpectrogramOptions>();
    CLI::App* sub = app.add_subcommand(
        "spectrogram",
        "Draw a PNG picture of what a listener's read-out saw, frequency against time: from a recording as fast "
        "as the processor allows (FILE), or from the microphone route in real time (--mic). The code bands are "
        "labelled, each code heard is marked where it was heard, and the colour scale shows the detection level.");
    sub->add_option("FILE", options->file, "a recording to draw (anything libsndfile reads; - for standard input)");
    sub->add_option("--png", options->png, "the picture to write")->required();
    sub->add_option("--seconds", options->seconds,
                    "how long to listen to the microphone (default 10), or how much of the file to draw (default "
                    "all of it)")
        ->check(finiteRange(0.0, 86400.0));
    addLevelOption(sub, &options->level, "detection level: spectrum levels at or below it count as silence");
    addDecoderOption(sub, &options->decoder);
    addRouteOptions(sub, common);
    return {sub, [&common, options] { return runSpectrogram(common, *options); }};
}

}  // namespace host
}  // namespace korvo
