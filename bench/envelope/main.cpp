// korvo_envelope: the operating envelope of the link for both decoders, measured offline (the
// host's frame decoder on every frame; the builtin one on the library's analysis and detection
// with a live listener's timing) and checked against real-time runs of `soundmeter listen` at
// a few points. Run by hand
// (scripts/envelope.sh; about 40 minutes on two cores): it writes CSV files and
// gnuplot's PNG plots into the output folder.
//
//   korvo_envelope [--out DIR] [--trials N] [--quick] [--no-realtime | --realtime-only | --rooms] [--soundmeter PATH]
//
// --rooms measures the simulated room's presets instead (Rooms.h; 100 trials a code by default).
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdio>
#include <cerrno>
#include <cstring>
#include <functional>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "envelope/Jobs.h"
#include "envelope/RealTime.h"
#include "envelope/Rooms.h"
#include "envelope/Trials.h"

using namespace korvo::envelope;
using korvo::host::DecoderKind;

namespace {

struct Settings {
    std::string out = "docs/envelope";
    int trials = 0;  // 300 a point; 100 a code and preset for --rooms
    bool quick = false;
    bool realtime = true;
    bool realtimeOnly = false;  // only the real-time check (its CSV), not the grids
    bool rooms = false;         // only the room and device presets
    std::string soundmeter;
    unsigned threads = std::max(1u, std::thread::hardware_concurrency());
};

// Grids around the 99 % thresholds of both decoders: 300 trials at every point of them fit
// in about 40 minutes on two cores.
const std::vector<double> kSnrs = {20, 10, 0, -5, -8, -10, -12, -14, -16, -18, -20};
// Speech-like noise is pink and pauses between syllables: it holds far less power at the
// codes' frequencies than its full-band figure says, so its grid reaches further down.
const std::vector<double> kSpeechSnrs = {30, 10, -10, -20, -30, -40};
const std::vector<double> kToneLengths = {20, 40, 64, 100, 192, 300};
const std::vector<double> kNoiseLevels = {-80, -70, -60, -50, -40, -30, -20, -10};
const DecoderKind kDecoders[] = {DecoderKind::Host, DecoderKind::Builtin};
constexpr double kLengthSnr = 10.0;   // tone lengths are measured at this SNR
constexpr double kLatencySnr = 10.0;  // and latency
constexpr double kFalseMinutes = 10.0;

std::vector<PointResult> runPoints(const std::vector<Point>& points, const Settings& s) {
    std::vector<PointResult> results(points.size());
    std::vector<std::function<void()>> jobs;
    for (size_t i = 0; i < points.size(); ++i) jobs.push_back([&, i] { results[i] = runPoint(points[i]); });
    runAll(jobs, s.threads);
    return results;
}

uint64_t seedOf(int grid, int decoder, int code, double x) {
    return 1000003ull * grid + 10007ull * decoder + 101ull * (code + 1) + static_cast<uint64_t>(std::lround(x * 10 + 1000));
}

std::vector<PointResult> measure(int grid, Noise noise, double toneMs, const std::vector<double>& snrs, const Settings& s) {
    std::vector<Point> points;
    for (DecoderKind d : kDecoders) {
        for (int c = 0; c < korvo::host::codesHeardBy(d); ++c) {
            for (double snr : snrs) {
                Point p;
                p.decoder = d;
                p.noise = noise;
                p.code = c;
                p.toneMs = toneMs;
                p.snrDb = snr;
                p.trials = s.trials;
                p.seed = seedOf(grid, static_cast<int>(d), c, snr);
                points.push_back(p);
            }
        }
    }
    fprintf(stderr, "%s noise, tones of %.0f ms: %zu points of %d trials\n", noiseName(noise), toneMs, points.size(), s.trials);
    return runPoints(points, s);
}

std::vector<PointResult> measureLengths(const Settings& s) {
    std::vector<Point> points;
    for (DecoderKind d : kDecoders) {
        for (int c = 0; c < korvo::host::codesHeardBy(d); ++c) {
            for (double ms : kToneLengths) {
                Point p;
                p.decoder = d;
                p.code = c;
                p.toneMs = ms;
                p.snrDb = kLengthSnr;
                p.trials = s.trials;
                p.seed = seedOf(9, static_cast<int>(d), c, ms);
                points.push_back(p);
            }
        }
    }
    fprintf(stderr, "tone lengths at %.0f dB SNR: %zu points\n", kLengthSnr, points.size());
    return runPoints(points, s);
}

std::vector<FalseResult> measureFalse(const Settings& s) {
    struct Job {
        DecoderKind d;
        Noise n;
        double dbfs;
    };
    std::vector<Job> list;
    for (DecoderKind d : kDecoders) {
        for (Noise n : {Noise::White, Noise::Speech}) {
            for (double dbfs : kNoiseLevels) list.push_back({d, n, dbfs});
        }
    }
    std::vector<FalseResult> results(list.size());
    std::vector<std::function<void()>> jobs;
    const double minutes = s.quick ? 1.0 : kFalseMinutes;
    for (size_t i = 0; i < list.size(); ++i) {
        jobs.push_back([&, i, minutes] {
            results[i] = runNoiseOnly(list[i].d, list[i].n, list[i].dbfs, minutes, seedOf(11, static_cast<int>(list[i].d), 0, list[i].dbfs) + static_cast<uint64_t>(list[i].n));
        });
    }
    fprintf(stderr, "noise alone, %.0f minutes each: %zu runs\n", minutes, list.size());
    runAll(jobs, s.threads);
    return results;
}

void writePoints(const Settings& s, const char* name, const std::vector<PointResult>& results) {
    FILE* f = openCsv(s.out, name,
                      "decoder,noise,tone_ms,code,hz,snr_db,trials,heard,p_heard,lower95,latency_median_ms,latency_p99_ms,"
                      "level,false_codes,p_analysed");
    for (const PointResult& r : results) {
        const Point& p = r.point;
        fprintf(f, "%s,%s,%.0f,%d,%d,%.1f,%d,%d,%.4f,%.4f,%.1f,%.1f,%d,%d,%.4f\n", korvo::host::decoderName(p.decoder),
                noiseName(p.noise), p.toneMs, p.code, korvo::codeHz(p.code), p.snrDb, p.trials, r.heard, r.rate(),
                r.lower95, r.medianMs, r.p99Ms, r.level, r.falseCodes, r.coverage());
    }
    fclose(f);
}

// Over the codes of each decoder, at each SNR (or tone length): the worst and the mean
// probability heard, the mean share of trials with an analysed frame holding the tone,
// the median of the codes' median latencies and the worst 99th percentile.
void writeAggregate(const Settings& s, const char* name, const std::vector<PointResult>& results, bool byLength) {
    FILE* f = openCsv(s.out, name, byLength ? "decoder,tone_ms,min_p,mean_p,p_analysed,latency_median_ms,latency_p99_max_ms"
                                        : "decoder,snr_db,min_p,mean_p,p_analysed,latency_median_ms,latency_p99_max_ms");
    for (DecoderKind d : kDecoders) {
        std::map<double, std::vector<const PointResult*>> byX;
        for (const PointResult& r : results) {
            if (r.point.decoder == d) byX[byLength ? r.point.toneMs : -r.point.snrDb].push_back(&r);
        }
        for (const auto& [key, list] : byX) {
            double minP = 1.0, sumP = 0.0, sumC = 0.0, worstP99 = -1.0;
            std::vector<double> medians;
            for (const PointResult* r : list) {
                minP = std::min(minP, r->rate());
                sumP += r->rate();
                sumC += r->coverage();
                if (r->medianMs >= 0) medians.push_back(r->medianMs);
                worstP99 = std::max(worstP99, r->p99Ms);
            }
            std::sort(medians.begin(), medians.end());
            const double n = static_cast<double>(list.size());
            fprintf(f, "%s,%.1f,%.4f,%.4f,%.4f,%.1f,%.1f\n", korvo::host::decoderName(d), byLength ? key : -key, minP, sumP / n,
                    sumC / n, quantile(medians, 0.5), worstP99);
        }
    }
    fclose(f);
}

// Lowest SNR from which on (and above) a code is heard in at least 99 % of trials; NaN when never.
double threshold99(const std::vector<PointResult>& results, const std::vector<double>& snrs, DecoderKind d, int code) {
    double best = NAN;
    for (double snr : snrs) {  // from the highest down
        const auto it = std::find_if(results.begin(), results.end(), [&](const PointResult& r) {
            return r.point.decoder == d && r.point.code == code && r.point.snrDb == snr;
        });
        if (it == results.end()) continue;
        if (it->rate() < 0.99) break;
        best = snr;
    }
    return best;
}

const PointResult* find(const std::vector<PointResult>& results, DecoderKind d, int code, double snr, double ms) {
    for (const PointResult& r : results) {
        if (r.point.decoder == d && r.point.code == code && r.point.snrDb == snr && r.point.toneMs == ms) return &r;
    }
    return nullptr;
}

double shortest99(const std::vector<PointResult>& lengths, DecoderKind d, int code) {
    double best = NAN;
    for (auto it = kToneLengths.rbegin(); it != kToneLengths.rend(); ++it) {
        const PointResult* r = find(lengths, d, code, kLengthSnr, *it);
        if (!r || r->rate() < 0.99) break;
        best = *it;
    }
    return best;
}

double best(const std::vector<PointResult>& results, DecoderKind d, int code) {
    double b = 0.0;
    for (const PointResult& r : results) {
        if (r.point.decoder == d && r.point.code == code) b = std::max(b, r.rate());
    }
    return b;
}

std::string selfFolder() {
    char path[4096];
    const ssize_t n = readlink("/proc/self/exe", path, sizeof path - 1);
    if (n <= 0) return ".";
    path[n] = '\0';
    std::string s = path;
    return s.substr(0, s.rfind('/'));
}

void measureGrids(const Settings& s, const std::vector<double>& snrs, const std::vector<double>& speechSnrs);
void checkRealTimes(const Settings& s);

}  // namespace

int main(int argc, char** argv) {
    Settings s;
    for (int i = 1; i < argc; ++i) {
        const std::string a = argv[i];
        if (a == "--out" && i + 1 < argc) {
            s.out = argv[++i];
        } else if (a == "--trials" && i + 1 < argc) {
            s.trials = std::max(1, atoi(argv[++i]));
        } else if (a == "--quick") {
            s.quick = true;
        } else if (a == "--no-realtime") {
            s.realtime = false;
        } else if (a == "--realtime-only") {
            s.realtimeOnly = true;
        } else if (a == "--rooms") {
            s.rooms = true;
        } else if (a == "--soundmeter" && i + 1 < argc) {
            s.soundmeter = argv[++i];
        } else {
            fprintf(stderr, "usage: korvo_envelope [--out DIR] [--trials N] [--quick] [--no-realtime | --realtime-only | --rooms] [--soundmeter PATH]\n");
            return 2;
        }
    }
    if (s.soundmeter.empty()) s.soundmeter = selfFolder() + "/soundmeter";
    if (s.trials == 0) s.trials = s.rooms ? 100 : 300;
    if (s.quick) s.trials = std::min(s.trials, 60);
    if (access(s.out.c_str(), W_OK) != 0) {
        fprintf(stderr, "korvo_envelope: output folder %s: %s\n", s.out.c_str(), strerror(errno));
        return 2;
    }

    const std::vector<double> snrs = s.quick ? std::vector<double>{10, 0, -10} : kSnrs;
    const std::vector<double> speechSnrs = s.quick ? std::vector<double>{10, -10, -30} : kSpeechSnrs;
    if (s.rooms) {
        RoomSettings r;
        r.out = s.out;
        r.trials = s.trials;
        r.quietMinutes = s.quick ? 1.0 : 10.0;
        r.threads = s.threads;
        measureRooms(r);
    } else {
        if (!s.realtimeOnly) measureGrids(s, snrs, speechSnrs);
        if (s.realtime) checkRealTimes(s);
    }

    const std::string plot = "gnuplot -e \"dir='" + s.out + "'\" '" + (s.rooms ? KORVO_ROOM_PLOTS : KORVO_ENVELOPE_PLOTS) + "'";
    if (system(plot.c_str()) != 0) fprintf(stderr, "korvo_envelope: gnuplot failed (scripts/install-deps.sh envelope installs it)\n");
    fprintf(stderr, "wrote %s\n", s.out.c_str());
    return 0;
}

namespace {

void measureGrids(const Settings& s, const std::vector<double>& snrs, const std::vector<double>& speechSnrs) {
    const auto white300 = measure(1, Noise::White, 300, snrs, s);
    writePoints(s, "heard-white-300ms.csv", white300);
    writeAggregate(s, "codes-white-300ms.csv", white300, false);
    const auto white40 = measure(2, Noise::White, 40, snrs, s);
    writePoints(s, "heard-white-40ms.csv", white40);
    writeAggregate(s, "codes-white-40ms.csv", white40, false);
    const auto speech300 = measure(3, Noise::Speech, 300, speechSnrs, s);
    writePoints(s, "heard-speech-300ms.csv", speech300);
    writeAggregate(s, "codes-speech-300ms.csv", speech300, false);
    const auto lengths = measureLengths(s);
    writePoints(s, "tone-length.csv", lengths);
    writeAggregate(s, "codes-tone-length.csv", lengths, true);
    const auto falses = measureFalse(s);
    {
        FILE* f = openCsv(s.out, "false-codes.csv", "decoder,noise,noise_dbfs,minutes,level,steps,false_codes,per_10k");
        for (const FalseResult& r : falses) {
            fprintf(f, "%s,%s,%.0f,%.1f,%d,%lld,%d,%.4f\n", korvo::host::decoderName(r.decoder), noiseName(r.noise), r.noiseDbfs,
                    r.minutes, r.level, static_cast<long long>(r.steps), r.falseCodes, r.per10k());
        }
        fclose(f);
    }

    // Per code, the headline figures.
    FILE* f = openCsv(s.out, "summary.csv",
                      "decoder,code,hz,snr99_white_300ms,snr99_white_40ms,snr99_speech_300ms,best_p_white_40ms,"
                      "latency_median_ms_10db,latency_p99_ms_10db,shortest_tone_99_ms_10db");
    for (DecoderKind d : kDecoders) {
        for (int c = 0; c < korvo::host::codesHeardBy(d); ++c) {
            const PointResult* lat = find(white300, d, c, kLatencySnr, 300);
            fprintf(f, "%s,%d,%d,%.0f,%.0f,%.0f,%.4f,%.1f,%.1f,%.0f\n", korvo::host::decoderName(d), c, korvo::codeHz(c),
                    threshold99(white300, snrs, d, c), threshold99(white40, snrs, d, c), threshold99(speech300, speechSnrs, d, c),
                    best(white40, d, c), lat ? lat->medianMs : NAN, lat ? lat->p99Ms : NAN, shortest99(lengths, d, c));
        }
    }
    fclose(f);
}

// A few points heard live by `soundmeter listen` on a recording, against the offline listener.
void checkRealTimes(const Settings& s) {
    std::vector<Point> checks(3);
    checks[0].code = 5, checks[0].toneMs = 300, checks[0].snrDb = -10, checks[0].seed = 501;
    checks[1].code = 17, checks[1].toneMs = 40, checks[1].snrDb = 0, checks[1].seed = 502;
    checks[2].code = 10, checks[2].toneMs = 300, checks[2].snrDb = 10, checks[2].seed = 503;
    checks[2].decoder = DecoderKind::Builtin;
    FILE* r = openCsv(s.out, "realtime-check.csv",
                      "decoder,noise,tone_ms,code,snr_db,tones,heard_live,heard_simulated,latency_median_live_ms,"
                      "latency_median_simulated_ms,latency_p99_live_ms,latency_p99_simulated_ms");
    for (const Point& p : checks) {
        fprintf(stderr, "real time: code %d, %.0f ms, %.0f dB SNR, %s decision\n", p.code, p.toneMs, p.snrDb,
                korvo::host::decoderName(p.decoder));
        const RealTimeCheck c = checkRealTime(p, s.quick ? 10 : 60, s.soundmeter, s.out);
        if (!c.error.empty()) fprintf(stderr, "korvo_envelope: %s\n", c.error.c_str());
        fprintf(r, "%s,%s,%.0f,%d,%.1f,%d,%d,%.1f,%.1f,%.1f,%.1f,%.1f\n", korvo::host::decoderName(p.decoder),
                noiseName(p.noise), p.toneMs, p.code, p.snrDb, c.tones, c.heardLive, c.heardSimulated, c.medianLiveMs,
                c.medianSimulatedMs, c.p99LiveMs, c.p99SimulatedMs);
    }
    fclose(r);
}

}  // namespace
