// soundmeter scan FILE: hears a recording offline, as fast as the processor allows.
//
// The library's own analysis and detection code runs in this process on the file's
// samples, with the timing of a live listener reproduced step by step on the file's
// clock (host/hearing/SimulatedEar.h): the same codes are heard at the same times as a
// live `listen` on the file would hear them, given the same phase of the analysis.
#include <CLI/CLI.hpp>

#include <korvo/platform/Recording.h>

#include <chrono>

#include "host/CodePlan.h"
#include "host/Environment.h"
#include "host/JsonEvent.h"
#include "host/Options.h"
#include "host/Output.h"
#include "host/OfflineRun.h"

namespace korvo {
namespace host {
namespace {

struct ScanOptions {
    std::string file;
    DecoderKind decoder = DecoderKind::Host;
    LevelChoice level;
    int phase = 0;
};

int runScan(const CommonOptions& common, const ScanOptions& o) {
    applyLogSettings(common.verbose);
    const DecoderKind kind = o.decoder;
    std::string cause;
    std::unique_ptr<korvo::platform::Recording> recording =
        korvo::platform::Recording::open(o.file, korvo::kSampleRate, &cause);
    if (!recording) {
        errf("scan %s: %s", o.file.c_str(), cause.c_str());
        return 2;
    }
    const auto began = std::chrono::steady_clock::now();
    OfflineListener listener(kind, o.phase);
    bool reportedLevel = false;
    if (o.level.given && o.level.automatic) listener.calibrateFirst();
    if (o.level.given && !o.level.automatic) listener.setLevel(o.level.value);

    int count = 0;
    OfflineRun run;
    const bool read = hearRecording(*recording, listener, 0.0, [&](CodeSet begun) {
        if (o.level.automatic && !reportedLevel && listener.calibrated()) {
            reportedLevel = true;
            infof("detection level %d (calibrated on %.1f s of the recording for the %s decision)\n",
                  listener.proposal().level, stepSeconds(kAutoCalibrationSteps), decoderName(kind));
        }
        for (int c = 0; c < kCodeCount; ++c) {
            if (!(begun & codeBit(c))) continue;
            ++count;
            printHeard(c, listener.seconds());
        }
    }, &run, &cause);
    if (!read) {
        errf("scan %s: %s", o.file.c_str(), cause.c_str());
        return 1;
    }
    if (run.interrupted) return 130;
    const double audioSeconds = run.audioSeconds;
    const double took = std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
    resultf(JsonEvent("summary").add("audio_s", audioSeconds).add("took_s", took).add("codes", count),
            "scanned %.1f s of audio in %.2f s: %s\n", audioSeconds, took, plural(count, "code").c_str());
    return 0;
}

}  // namespace

Command addScanCommand(CLI::App& app, CommonOptions& common) {
    auto options = std::make_shared<ScanOptions>();
    CLI::App* sub = app.add_subcommand(
        "scan",
        "Hear a recording offline, as fast as the processor allows: every code heard, with its time in the "
        "file, as a live listen on the file hears it (the plug-in's analysis and detection run in this "
        "process on a simulation of its capture and analysis timing).");
    sub->add_option("FILE", options->file, "the recording (anything libsndfile reads; - for standard input)")
        ->required();
    addDecoderOption(sub, &options->decoder);
    addLevelOption(sub, &options->level, "detection level: spectrum levels at or below it count as silence");
    sub->add_option("--phase", options->phase,
                    "where the analysis stands against the capture, 0..9: which steps carry its turns (phase "
                    "mod 2) and the slot it takes first (phase / 2); live, it depends on how the threads started")
        ->check(CLI::Range(0, kPhases - 1))
        ->capture_default_str();
    return {sub, [&common, options] { return runScan(common, *options); }};
}

}  // namespace host
}  // namespace korvo
