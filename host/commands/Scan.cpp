// soundmeter scan FILE: hears a recording offline, as fast as the processor allows.
//
// The recording's frames from its first sample go to the same decoder a live listener
// feeds with the frames the plug-in captured: scan reports the codes a live `listen` of
// the file reports, at the same frames. Nothing of the plug-in runs.
#include <CLI/CLI.hpp>

#include <korvo/platform/Recording.h>

#include <chrono>

#include "host/output/CodePlan.h"
#include "host/core/Environment.h"
#include "host/output/JsonEvent.h"
#include "host/core/Options.h"
#include "host/output/Output.h"
#include "host/core/OfflineRun.h"
#include "host/base/Clock.h"

namespace korvo {
namespace host {
namespace {

struct ScanOptions {
    std::string file;
    DecoderKind decoder = DecoderKind::Host;
    LevelChoice level;
};

int runScan(const CommonOptions& common, const ScanOptions& o) {
    applyLogSettings(common.verbose);
    if (!offlineOptionsApply(common, "scan", o.decoder, o.level)) return 2;
    std::string cause;
    std::unique_ptr<korvo::platform::Recording> recording =
        korvo::platform::Recording::open(o.file, korvo::kSampleRate, &cause);
    if (!recording) {
        errf("scan %s: %s", o.file.c_str(), cause.c_str());
        return 2;
    }
    const auto began = std::chrono::steady_clock::now();
    std::unique_ptr<Decoder> decoder = makeDecoder(o.decoder);
    int count = 0;
    OfflineRun run;
    const bool read = hearRecording(*recording, *decoder, 0.0, [&](int64_t frames, CodeSet begun) {
        for (int c = 0; c < kCodeCount; ++c) {
            if (!(begun & codeBit(c))) continue;
            ++count;
            printHeard(c, stepSeconds(frames));
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
        "file, as a live listen on the file hears it (its frames go to the decoder a live listener feeds with "
        "the frames the plug-in captured).");
    sub->add_option("FILE", options->file, "the recording (anything libsndfile reads; - for standard input)")
        ->required();
    addDecoderOption(sub, &options->decoder);
    addLevelOption(sub, &options->level, "detection level, for a decoder that takes one");
    return {sub, [&common, options] { return runScan(common, *options); }};
}

}  // namespace host
}  // namespace korvo
