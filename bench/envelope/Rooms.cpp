#include "envelope/Rooms.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <random>
#include <vector>

#include "envelope/Jobs.h"
#include "envelope/RoomChannel.h"
#include "envelope/Trials.h"
#include "envelope/simulated/OfflineListener.h"

namespace korvo {
namespace envelope {

namespace {

using platform::acoustics::DevicePreset;
using platform::acoustics::RoomPreset;

constexpr double kToneMs = 64.0;  // the demo's tone
// The plug-in's tone peaks at 0.45 of full scale (its tone engine at volume 0.8).
constexpr double kTonePeak = 0.45 * 32768.0;
constexpr double kAfterSeconds = 1.0;
constexpr double kPi = 3.14159265358979323846;

struct Job {
    const RoomPreset* room;
    const DevicePreset* device;
    int code;  // -1: the background alone
};

struct Result {
    int trials = 0, heard = 0, wrong = 0, repeats = 0;
    std::vector<double> latencies;
    double seconds = 0.0;  // listened to after the warm-up
};

bool carries(const DevicePreset& device, int code) { return device.topHz <= 0.0 || korvo::codeHz(code) <= device.topHz; }

std::unique_ptr<RoomChannel> channelOrExit(const Job& job, uint64_t seed, RoomChannel::Speaker speaker) {
    std::string error;
    auto c = RoomChannel::make(*job.room, *job.device, seed, std::move(speaker), &error);
    if (!c) {
        fprintf(stderr, "korvo_envelope: room %s, device %s: %s\n", job.room->name, job.device->name, error.c_str());
        exit(1);
    }
    return c;
}

void runTrial(const Job& job, uint64_t seed, Result* r) {
    std::mt19937_64 random(seed);
    std::uniform_real_distribution<double> u(0.0, 1.0);
    host::OfflineListener listener(DecoderKind::Host, static_cast<int>(random() % host::kPhases));
    const double hz = korvo::codeHz(job.code);
    const double phase = 2.0 * kPi * u(random);
    const int64_t toneStart = korvo::kWarmUpSteps * kFrame + static_cast<int64_t>((0.2 + 0.1 * u(random)) * kRate);
    const int64_t toneEnd = toneStart + static_cast<int64_t>(kToneMs * kRate / 1000.0);
    auto speaker = [=](int64_t at, int count, int16_t* out) {
        for (int i = 0; i < count; ++i) {
            const int64_t n = at + i;
            out[i] = n >= toneStart && n < toneEnd
                         ? static_cast<int16_t>(std::lround(kTonePeak * std::sin(phase + 2.0 * kPi * hz * (n - toneStart) / kRate)))
                         : 0;
        }
    };
    auto channel = channelOrExit(job, random(), speaker);
    const int64_t end = toneEnd + static_cast<int64_t>(kAfterSeconds * kRate);
    bool heard = false;
    std::vector<int16_t> frame(kFrame);
    for (int64_t at = 0; at + kFrame <= end; at += kFrame) {
        channel->capture(frame.data(), kFrame);
        const host::CodeSet begun = listener.step(frame.data());
        for (int c = 0; c < korvo::kPlanCodes; ++c) {
            if (!(begun & host::codeBit(c))) continue;
            if (c != job.code || at + kFrame <= toneStart) {
                // Rare, and each worth a look.
                fprintf(stderr, "\n  %s, %s, code %d: heard %d, %.0f ms after the tone began\n", job.room->name,
                        job.device->name, job.code, c, static_cast<double>(at + kFrame - toneStart) * 1000.0 / kRate);
                ++r->wrong;
            } else if (heard) {
                ++r->repeats;
            } else {
                heard = true;
                r->latencies.push_back(static_cast<double>(at + kFrame - toneStart) * 1000.0 / kRate);
            }
        }
    }
    ++r->trials;
    r->heard += heard ? 1 : 0;
    r->seconds += static_cast<double>(end - korvo::kWarmUpSteps * kFrame) / kRate;
}

void runQuiet(const Job& job, double minutes, uint64_t seed, Result* r) {
    host::OfflineListener listener(DecoderKind::Host, static_cast<int>(seed % host::kPhases));
    auto channel = channelOrExit(job, seed, [](int64_t, int count, int16_t* out) { std::fill(out, out + count, 0); });
    const int64_t steps = korvo::kWarmUpSteps + static_cast<int64_t>(minutes * 60.0 * kRate / kFrame);
    std::vector<int16_t> frame(kFrame);
    for (int64_t s = 0; s < steps; ++s) {
        channel->capture(frame.data(), kFrame);
        r->wrong += __builtin_popcountll(listener.step(frame.data()));
    }
    r->seconds = static_cast<double>(steps - korvo::kWarmUpSteps) * kFrame / kRate;
}

double perHour(int count, double seconds) { return seconds > 0.0 ? count * 3600.0 / seconds : 0.0; }

}  // namespace

void measureRooms(const RoomSettings& s) {
    std::vector<Job> list;
    for (const RoomPreset& room : platform::acoustics::roomPresets()) {
        for (const DevicePreset& device : platform::acoustics::devicePresets()) {
            list.push_back({&room, &device, -1});
            for (int c = 0; c < host::codesHeardBy(DecoderKind::Host); ++c) list.push_back({&room, &device, c});
        }
    }
    std::vector<Result> results(list.size());
    std::vector<std::function<void()>> jobs;
    // The long runs of background alone first, so that none of them ends last on one core.
    for (bool quiet : {true, false}) {
        for (size_t i = 0; i < list.size(); ++i) {
            if ((list[i].code < 0) != quiet) continue;
            jobs.push_back([&, i] {
                const uint64_t seed = 7000003ull * (i + 1);
                if (list[i].code < 0) {
                    runQuiet(list[i], s.quietMinutes, seed, &results[i]);
                    return;
                }
                std::mt19937_64 random(seed);
                for (int t = 0; t < s.trials; ++t) runTrial(list[i], random(), &results[i]);
                std::sort(results[i].latencies.begin(), results[i].latencies.end());
            });
        }
    }
    fprintf(stderr, "rooms: %zu presets, %d trials a code, %.0f minutes of background each\n",
            platform::acoustics::roomPresets().size() * platform::acoustics::devicePresets().size(), s.trials,
            s.quietMinutes);
    runAll(jobs, s.threads);

    FILE* codes = openCsv(s.out, "rooms-codes.csv",
                          "room,device,code,hz,carried,trials,heard,p_heard,lower95,latency_median_ms,latency_p99_ms,"
                          "wrong,repeats");
    FILE* summary = openCsv(s.out, "rooms-summary.csv",
                            "room,device,codes_carried,min_p,mean_p,wrong_per_hour,repeats_per_hour,false_per_hour,"
                            "latency_median_ms,latency_p99_ms");
    for (size_t i = 0; i < list.size();) {
        const Job& preset = list[i];
        const Result& quiet = results[i];
        int carried = 0, wrong = 0, repeats = 0;
        double minP = 1.0, sumP = 0.0, seconds = 0.0;
        std::vector<double> latencies;
        for (++i; i < list.size() && list[i].code >= 0; ++i) {
            const Job& j = list[i];
            const Result& r = results[i];
            const double p = r.trials ? double(r.heard) / r.trials : 0.0;
            const bool carry = carries(*j.device, j.code);
            fprintf(codes, "%s,%s,%d,%d,%d,%d,%d,%.4f,%.4f,%.1f,%.1f,%d,%d\n", j.room->name, j.device->name, j.code,
                    korvo::codeHz(j.code), carry ? 1 : 0, r.trials, r.heard, p, lowerBound(r.heard, r.trials, 0.95),
                    quantile(r.latencies, 0.5), quantile(r.latencies, 0.99), r.wrong, r.repeats);
            // Wrong codes count at every code: a loudspeaker that cannot carry a code must
            // still not make the listener hear another.
            wrong += r.wrong;
            repeats += r.repeats;
            seconds += r.seconds;
            if (!carry) continue;
            ++carried;
            minP = std::min(minP, p);
            sumP += p;
            latencies.insert(latencies.end(), r.latencies.begin(), r.latencies.end());
        }
        std::sort(latencies.begin(), latencies.end());
        fprintf(summary, "%s,%s,%d,%.4f,%.4f,%.2f,%.2f,%.2f,%.1f,%.1f\n", preset.room->name, preset.device->name, carried,
                minP, carried ? sumP / carried : 0.0, perHour(wrong, seconds), perHour(repeats, seconds),
                perHour(quiet.wrong, quiet.seconds), quantile(latencies, 0.5), quantile(latencies, 0.99));
    }
    fclose(codes);
    fclose(summary);
}

}  // namespace envelope
}  // namespace korvo
