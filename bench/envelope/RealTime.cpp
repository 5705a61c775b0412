#include "envelope/RealTime.h"

#include <sndfile.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <memory>
#include <random>
#include <sstream>

#include "envelope/simulated/OfflineListener.h"

namespace korvo {
namespace envelope {

namespace {

struct Layout {
    std::vector<int64_t> starts;  // of the tones, in samples
    int64_t toneSamples = 0;
    int64_t total = 0;
};

// Tones one after the other, 0.7..0.8 s apart, after the warm-up and the calibration.
Layout layOut(const Point& p, int tones, std::mt19937_64& random) {
    Layout l;
    std::uniform_real_distribution<double> u(0.0, 1.0);
    l.toneSamples = static_cast<int64_t>(p.toneMs * kRate / 1000.0);
    int64_t at = (korvo::kWarmUpSteps + host::kAutoCalibrationSteps) * kFrame + static_cast<int64_t>(0.3 * kRate);
    for (int i = 0; i < tones; ++i) {
        at += static_cast<int64_t>(u(random) * kFrame);
        l.starts.push_back(at);
        at += l.toneSamples + static_cast<int64_t>(0.7 * kRate);
    }
    l.total = at + static_cast<int64_t>(0.5 * kRate);
    return l;
}

std::vector<int16_t> render(const Point& p, const Layout& l, std::mt19937_64& random) {
    NoiseSource noise(p.noise, random());
    std::vector<int16_t> out;
    out.reserve(static_cast<size_t>(l.total));
    int64_t at = 0;
    ToneInNoise spec;
    spec.hz = korvo::codeHz(p.code);
    spec.noiseDbfs = noiseDbfsAt(p.snrDb);
    for (int64_t start : l.starts) {
        spec.toneStart = start;
        spec.toneEnd = start + l.toneSamples;
        synthesize(spec, noise, at, start + l.toneSamples - at, &out);
        at = start + l.toneSamples;
    }
    spec.toneStart = spec.toneEnd = 0;
    synthesize(spec, noise, at, l.total - at, &out);
    return out;
}

// Latencies (ms) of the tones heard, from the times (s) a listener reported the code.
std::vector<double> match(const Layout& l, const std::vector<double>& times) {
    std::vector<double> latencies;
    for (int64_t start : l.starts) {
        const double from = static_cast<double>(start) / kRate;
        const double to = static_cast<double>(start + l.toneSamples) / kRate + 0.3;
        for (double t : times) {
            if (t > from && t <= to) {
                latencies.push_back((t - from) * 1000.0);
                break;
            }
        }
    }
    std::sort(latencies.begin(), latencies.end());
    return latencies;
}

bool writeWav(const std::string& path, const std::vector<int16_t>& samples) {
    SF_INFO info{};
    info.samplerate = static_cast<int>(kRate);
    info.channels = 1;
    info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
    SNDFILE* f = sf_open(path.c_str(), SFM_WRITE, &info);
    if (!f) return false;
    const sf_count_t n = sf_write_short(f, samples.data(), static_cast<sf_count_t>(samples.size()));
    sf_close(f);
    return n == static_cast<sf_count_t>(samples.size());
}

}  // namespace

RealTimeCheck checkRealTime(const Point& p, int tones, const std::string& soundmeter, const std::string& folder) {
    RealTimeCheck r;
    r.point = p;
    r.tones = tones;
    std::mt19937_64 random(p.seed);
    const Layout layout = layOut(p, tones, random);
    const std::vector<int16_t> samples = render(p, layout, random);
    const std::string path = folder + "/realtime-" + std::to_string(p.seed) + ".wav";
    if (!writeWav(path, samples)) {
        r.error = "cannot write " + path;
        return r;
    }

    // Offline, at every phase.
    std::vector<double> simulated;
    for (int phase = 0; phase < host::kPhases; ++phase) {
        host::OfflineListener listener(p.decoder, phase);
        listener.calibrateFirst();
        std::vector<double> times;
        for (size_t at = 0; at + kFrame <= samples.size(); at += kFrame) {
            if (listener.step(&samples[at]) & host::codeBit(p.code)) times.push_back(listener.seconds());
        }
        const std::vector<double> l = match(layout, times);
        r.heardSimulated += static_cast<double>(l.size()) / host::kPhases;
        simulated.insert(simulated.end(), l.begin(), l.end());
    }
    std::sort(simulated.begin(), simulated.end());
    r.medianSimulatedMs = quantile(simulated, 0.5);
    r.p99SimulatedMs = quantile(simulated, 0.99);

    // Live.
    std::ostringstream command;
    // The builtin decoder calibrates its level on the room first, as the offline listener did.
    command << "'" << soundmeter << "' listen --json --seconds 0" << (host::decoderInfo(p.decoder).takesLevel ? " --level auto" : "")
            << " --decoder " << host::decoderName(p.decoder) << " --mic 'wav:" << path << "'";
    std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(command.str().c_str(), "r"), pclose);
    if (!pipe) {
        r.error = "cannot run " + soundmeter;
        return r;
    }
    std::vector<double> times;
    char line[512];
    const std::string wanted = "\"code\":" + std::to_string(p.code) + ",";
    while (fgets(line, sizeof line, pipe.get())) {
        const std::string text = line;
        const size_t t = text.find("\"t_s\":");
        if (text.find("\"event\":\"heard\"") != std::string::npos && text.find(wanted) != std::string::npos &&
            t != std::string::npos) {
            times.push_back(std::strtod(text.c_str() + t + 6, nullptr));
        }
    }
    if (pclose(pipe.release()) != 0) r.error = "soundmeter listen failed on " + path;
    const std::vector<double> live = match(layout, times);
    r.heardLive = static_cast<int>(live.size());
    r.medianLiveMs = quantile(live, 0.5);
    r.p99LiveMs = quantile(live, 0.99);
    std::remove(path.c_str());
    return r;
}

}  // namespace envelope
}  // namespace korvo
