// Measures the frame decoder against the link's targets, with fixed seeds: detection of
// short and faint tones in white noise, latency, false codes in an hour of each noise,
// wrong codes through distortion, clipping, clock error and reverberation, and repeats.
// External sound comes from sox, espeak-ng and recordings shipped in Debian packages.
//   korvo_decoder_eval [--minutes M] [--trials N] [--only latency|repeat|distortion|reverb|detection|false]
//                      [--source NAME] [--csv FILE]   (false codes: one source; rows appended to FILE)
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <glob.h>
#include <random>
#include <string>
#include <vector>

#include "decoder/Sox.h"
#include "host/hearing/FrameDecoder.h"

using korvo::host::CodeSet;
using korvo::host::FrameDecoder;
using namespace korvo::decoderbench;

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr double kRate = korvo::kSampleRate;
constexpr int kFrame = korvo::kFrameSamples;
constexpr int kCodes = FrameDecoder::kCodes;
constexpr double kToneAmplitude = 0.02;  // -37 dBFS RMS: the noise of -20 dB SNR stays unclipped

struct Event {
    int64_t endSample;  // the end of the frame that reported it
    int code;
};

std::vector<Event> decode(FrameDecoder& d, const std::vector<double>& x) {
    d.reset();
    std::vector<Event> events;
    int16_t frame[kFrame];
    for (size_t at = 0; at + kFrame <= x.size(); at += kFrame) {
        for (int i = 0; i < kFrame; ++i) frame[i] = static_cast<int16_t>(std::clamp(std::lround(x[at + i] * 32768.0), -32768L, 32767L));
        const CodeSet began = d.addFrame(frame);
        for (int c = 0; c < kCodes; ++c)
            if (began & korvo::host::codeBit(c)) events.push_back({static_cast<int64_t>(at + kFrame), c});
    }
    return events;
}

std::vector<double> toDouble(const Samples& s) {
    std::vector<double> x(s.size());
    for (size_t i = 0; i < s.size(); ++i) x[i] = s[i] / 32768.0;
    return x;
}

// White Gaussian noise whose power is `snrDb` below a sine of amplitude `a`.
std::vector<double> whiteNoise(size_t n, double a, double snrDb, std::mt19937_64& rng) {
    std::normal_distribution<double> g(0.0, std::sqrt(a * a / 2.0 / std::pow(10.0, snrDb / 10.0)));
    std::vector<double> x(n);
    for (double& v : x) v = g(rng);
    return x;
}

void addTone(std::vector<double>& x, double hz, int64_t start, int64_t length, double a, double phase) {
    for (int64_t i = 0; i < length && start + i < static_cast<int64_t>(x.size()); ++i)
        x[static_cast<size_t>(start + i)] += a * std::sin(2.0 * kPi * hz * static_cast<double>(i) / kRate + phase);
}

double percentile(std::vector<double> v, double q) {
    if (v.empty()) return NAN;
    std::sort(v.begin(), v.end());
    return v[std::min(v.size() - 1, static_cast<size_t>(q * static_cast<double>(v.size())))];
}

int64_t ms(double m) { return static_cast<int64_t>(m * kRate / 1000.0); }

// Tones of `lengthMs` at each SNR, every code, `trials` each: the share heard as their code.
void detection(FrameDecoder& d, int trials) {
    const std::vector<std::pair<int, std::vector<double>>> plan = {
        {40, {-6, -8, -10}}, {64, {-9, -11, -13}}, {100, {-11, -13, -15}}, {192, {-13, -15, -17}}, {300, {-16, -18, -20}}};
    std::printf("\n== detection in white noise (%d trials per code and point)\n", trials);
    std::printf("%8s %8s %10s %8s %s\n", "tone ms", "SNR dB", "heard %", "wrong", "worst code");
    for (const auto& [lengthMs, snrs] : plan) {
        for (double snr : snrs) {
            int heard = 0, total = 0, wrong = 0, worstCode = 0, worstHeard = trials + 1;
            for (int c = 0; c < kCodes; ++c) {
                int codeHeard = 0;
                for (int t = 0; t < trials; ++t) {
                    std::mt19937_64 rng(1000003u * static_cast<uint64_t>(lengthMs) + 7919u * static_cast<uint64_t>(c) + static_cast<uint64_t>(t) + static_cast<uint64_t>(-snr * 100));
                    const int64_t start = ms(300) + static_cast<int64_t>(rng() % kFrame);
                    std::vector<double> x = whiteNoise(static_cast<size_t>(start + ms(lengthMs) + ms(350)), kToneAmplitude, snr, rng);
                    addTone(x, korvo::codeHz(c), start, ms(lengthMs), kToneAmplitude, static_cast<double>(rng() % 1000) * 0.00628);
                    bool got = false;
                    for (const Event& e : decode(d, x)) {
                        if (e.code == c && e.endSample > start && e.endSample <= start + ms(lengthMs) + ms(300)) got = true;
                        else ++wrong;
                    }
                    codeHeard += got;
                    ++total;
                }
                heard += codeHeard;
                if (codeHeard < worstHeard) worstHeard = codeHeard, worstCode = c;
            }
            std::printf("%8d %8.0f %10.2f %8d %d (%d/%d)\n", lengthMs, snr, 100.0 * heard / total, wrong, worstCode, worstHeard, trials);
            std::fflush(stdout);
        }
    }
}

// 200 ms tones at 10 dB SNR: time from the tone's start to the frame that reports it.
void latency(FrameDecoder& d, int trials) {
    std::vector<double> l;
    int missed = 0;
    for (int c = 0; c < kCodes; ++c) {
        for (int t = 0; t < trials; ++t) {
            std::mt19937_64 rng(424242u + 31u * static_cast<uint64_t>(c) + static_cast<uint64_t>(t) * 1009u);
            const int64_t start = ms(300) + static_cast<int64_t>(rng() % kFrame);
            std::vector<double> x = whiteNoise(static_cast<size_t>(start + ms(500)), kToneAmplitude, 10.0, rng);
            addTone(x, korvo::codeHz(c), start, ms(200), kToneAmplitude, static_cast<double>(rng() % 1000) * 0.00628);
            double got = -1;
            for (const Event& e : decode(d, x))
                if (e.code == c && got < 0) got = static_cast<double>(e.endSample - start) * 1000.0 / kRate;
            if (got < 0) ++missed; else l.push_back(got);
        }
    }
    std::printf("\n== latency at 10 dB SNR, 200 ms tones, %d per code\nmedian %.1f ms, p99 %.1f ms, max %.1f ms, missed %d\n",
                trials, percentile(l, 0.5), percentile(l, 0.99), percentile(l, 1.0), missed);
}

// Runs `x` (looped to `seconds`) and counts events.
int countEvents(FrameDecoder& d, const Samples& x, double seconds, std::vector<int>* perCode) {
    d.reset();
    int events = 0;
    const size_t total = static_cast<size_t>(seconds * kRate);
    for (size_t at = 0; at + kFrame <= total; at += kFrame) {
        const size_t from = at % (x.size() - kFrame);
        const CodeSet began = d.addFrame(&x[from]);
        for (int c = 0; c < kCodes; ++c)
            if (began & korvo::host::codeBit(c)) ++events, ++(*perCode)[static_cast<size_t>(c)];
    }
    return events;
}

std::vector<std::string> files(const std::string& pattern) {
    glob_t g{};
    std::vector<std::string> out;
    if (::glob(pattern.c_str(), 0, nullptr, &g) == 0)
        for (size_t i = 0; i < g.gl_pathc; ++i) out.push_back(g.gl_pathv[i]);
    globfree(&g);
    return out;
}

// A minute of espeak-ng voices talking over each other.
std::string babble(const std::string& dir) {
    const std::vector<std::string> voices = {"en", "de", "fr", "es", "en-us", "it", "nl", "pl"};
    const std::vector<std::string> texts = {
        "The quick brown fox jumps over the lazy dog while the band plays on in the hall.",
        "Please leave your message after the tone, and we will call you back soon.",
        "Seven hundred and forty two people were counted in the square at noon today.",
        "She sells sea shells by the sea shore, and the shells she sells are surely sea shells.",
    };
    std::string mix;
    for (size_t v = 0; v < voices.size(); ++v) {
        std::string text;
        for (int r = 0; r < 6; ++r) text += texts[(v + static_cast<size_t>(r)) % texts.size()] + " ";
        const std::string path = dir + "/voice" + std::to_string(v) + ".wav";
        const std::string cmd = "espeak-ng -v " + voices[v] + " -s " + std::to_string(130 + 15 * static_cast<int>(v)) + " -p " +
                                std::to_string(30 + 8 * static_cast<int>(v)) + " -w " + path + " " + quote(text) + " 2>/dev/null";
        if (std::system(cmd.c_str()) != 0) return "";
        mix += " -v 0.5 " + path;
    }
    return "-m " + mix;
}

// 60 s of Gaussian white noise of RMS `level` (full scale 1), from a fixed seed.
Samples gaussian(double level) {
    std::mt19937_64 rng(20261125u);
    std::normal_distribution<double> g(0.0, level * 32768.0);
    Samples s(static_cast<size_t>(60 * kRate));
    for (int16_t& v : s) v = static_cast<int16_t>(std::clamp(std::lround(g(rng)), -32768L, 32767L));
    return s;
}

// Counts false codes in each source at each level; with `csv`, one row per source and level.
void falseCodes(FrameDecoder& d, double minutes, const std::string& dir, const std::string& only, const std::string& csv) {
    std::printf("\n== false codes in noise alone, %.0f min of each source over levels -80..-10 dBFS\n", minutes);
    std::printf("%-10s %10s %12s %s\n", "source", "events", "per hour", "codes");
    std::string speech, music;
    for (const std::string& f : files("/usr/share/sounds/alsa/*.wav")) if (f.find("Noise") == std::string::npos) speech += " " + quote(f);
    // The ringtones differ in rate and channels: each is converted before they are joined.
    int n = 0;
    for (const std::string& f : files("/usr/share/sounds/lomiri/ringtones/*.ogg")) {
        const std::string wav = dir + "/music" + std::to_string(n++) + ".wav";
        if (std::system(("sox -V1 " + quote(f) + " -r 44100 -c 1 " + wav).c_str()) == 0) music += " " + wav;
    }
    const std::string voices = babble(dir);
    struct Source { std::string name, inputs, effects; };
    const std::vector<Source> sources = {
        {"gaussian", "-n", ""},
        {"white", "-n", "synth 60 whitenoise"},
        {"pink", "-n", "synth 60 pinknoise"},
        {"brown", "-n", "synth 60 brownnoise"},
        {"white<16k", "-n", "synth 60 whitenoise sinc -16000"},
        {"babble", voices, "remix -"},
        {"speech", speech, "remix -"},
        {"music", music, "remix -"},
    };
    const std::vector<double> levels = {-80, -60, -40, -25, -10};
    for (const Source& s : sources) {
        if (!only.empty() && s.name != only) continue;
        if (s.inputs.empty() || s.inputs == " ") { std::printf("%-10s (missing)\n", s.name.c_str()); continue; }
        const bool own = s.effects.empty();
        const double r = own ? 1.0 : rms(sox(s.inputs, s.effects));
        std::vector<int> perCode(kCodes, 0);
        int events = 0;
        for (double level : levels) {
            const double v = std::pow(10.0, level / 20.0) / r;
            char gain[64];
            std::snprintf(gain, sizeof gain, " vol %.9f", v);
            const Samples x = own ? gaussian(std::pow(10.0, level / 20.0)) : sox(s.inputs, s.effects + gain);
            const double seconds = minutes * 60.0 / static_cast<double>(levels.size());
            const int atLevel = countEvents(d, x, seconds, &perCode);
            events += atLevel;
            if (!csv.empty()) {
                FILE* out = std::fopen(csv.c_str(), "a");
                if (out) {
                    std::fprintf(out, "%s,%.0f,%.1f,%d,%.1f\n", s.name.c_str(), level, seconds / 60.0, atLevel, atLevel * 3600.0 / seconds);
                    std::fclose(out);
                }
            }
        }
        std::string codes;
        for (int c = 0; c < kCodes; ++c) if (perCode[static_cast<size_t>(c)]) codes += std::to_string(c) + "x" + std::to_string(perCode[static_cast<size_t>(c)]) + " ";
        std::printf("%-10s %10d %12.1f %s\n", s.name.c_str(), events, events * 60.0 / minutes, codes.c_str());
        std::fflush(stdout);
    }
}

// One code through a distortion: heard as itself, and the other codes reported.
struct Tally { int heard = 0, total = 0, wrong = 0, extra = 0; std::string wrongCodes; };
void tally(Tally& t, const std::vector<Event>& events, int code) {
    int own = 0;
    for (const Event& e : events) {
        if (e.code == code) ++own;
        else ++t.wrong, t.wrongCodes += std::to_string(code) + "->" + std::to_string(e.code) + " ";
    }
    t.heard += own > 0;
    t.extra += std::max(own - 1, 0);
    ++t.total;
}
void print(const char* name, const Tally& t) {
    std::printf("%-28s heard %3d/%3d  wrong %3d  twice %d %s\n", name, t.heard, t.total, t.wrong, t.extra, t.wrongCodes.substr(0, 200).c_str());
}

void distortions(FrameDecoder& d, const std::string& dir) {
    std::printf("\n== distortion, clipping, clock error (every code, 300 ms tone, 30 dB SNR)\n");
    const double kThd[] = {1.0, 3.0, 10.0};   // per cent
    const int kClipDb[] = {3, 6, 12};          // over full scale
    const double kOffset[] = {0.1, 0.5, 1.0, 2.0};  // per cent, each side
    Tally poly[3], clip[3], drive, off[4][2];
    for (int c = 0; c < kCodes; ++c) {
        std::mt19937_64 rng(99u + static_cast<uint64_t>(c));
        const double hz = korvo::codeHz(c);
        const int64_t start = ms(200) + static_cast<int64_t>(rng() % kFrame);
        // A loudspeaker of THD k %: 2nd and 3rd harmonics of k / sqrt(2) % each (Chebyshev terms).
        for (int i = 0; i < 3; ++i) {
            const double a = 0.3, h = kThd[i] / 100.0 / std::sqrt(2.0);
            std::vector<double> x = whiteNoise(static_cast<size_t>(start + ms(600)), a, 30, rng);
            for (int64_t n = 0; n < ms(300); ++n) {
                const double u = std::sin(2.0 * kPi * hz * static_cast<double>(n) / kRate);
                x[static_cast<size_t>(start + n)] += a * (u + h * (2 * u * u - 1) + h * (4 * u * u * u - 3 * u));
            }
            tally(poly[i], decode(d, x), c);
        }
        std::vector<double> clean = whiteNoise(static_cast<size_t>(start + ms(600)), 0.5, 30, rng);
        addTone(clean, hz, start, ms(300), 0.5, 0.3);
        Samples s(clean.size());
        for (size_t i = 0; i < clean.size(); ++i) s[i] = static_cast<int16_t>(std::clamp(std::lround(clean[i] * 32768.0), -32768L, 32767L));
        tally(drive, decode(d, toDouble(soxEffect(s, "overdrive 10", dir))), c);
        // 0.5 (-6 dBFS) raised by 6 + k dB: k dB over full scale.
        for (int i = 0; i < 3; ++i) tally(clip[i], decode(d, toDouble(soxEffect(s, "gain " + std::to_string(6 + kClipDb[i]), dir))), c);
        for (int i = 0; i < 4; ++i) {
            for (int side : {0, 1}) {
                std::vector<double> x = whiteNoise(static_cast<size_t>(start + ms(600)), kToneAmplitude, 10, rng);
                addTone(x, hz * (1.0 + kOffset[i] / 100.0 * (side ? 1 : -1)), start, ms(300), kToneAmplitude, 0.1);
                tally(off[i][side], decode(d, x), c);
            }
        }
    }
    char name[64];
    for (int i = 0; i < 3; ++i) {
        std::snprintf(name, sizeof name, "distortion %g %% THD", kThd[i]);
        print(name, poly[i]);
    }
    print("sox overdrive 10", drive);
    for (int i = 0; i < 3; ++i) {
        std::snprintf(name, sizeof name, "clipping +%d dB", kClipDb[i]);
        print(name, clip[i]);
    }
    for (int i = 0; i < 4; ++i) {
        for (int side : {0, 1}) {
            std::snprintf(name, sizeof name, "%g %% %s, 10 dB SNR", kOffset[i], side ? "high" : "low");
            print(name, off[i][side]);
        }
    }
}

// Every code in turn (150 ms tones, 150 ms apart) through sox's reverb 50 and 90.
void reverb(FrameDecoder& d, const std::string& dir) {
  for (int amount : {50, 90}) {
    std::printf("\n== reverberation (sox reverb %d), every code in turn, 150 ms tones with 150 ms gaps\n", amount);
    for (int order = 0; order < 2; ++order) {
        std::mt19937_64 rng(777u + static_cast<uint64_t>(order));
        std::vector<int> codes(kCodes);
        for (int c = 0; c < kCodes; ++c) codes[static_cast<size_t>(c)] = c;
        if (order) std::shuffle(codes.begin(), codes.end(), rng);
        const int64_t step = ms(300);
        std::vector<double> x = whiteNoise(static_cast<size_t>(ms(300) + step * kCodes + ms(800)), 0.1, 30, rng);
        for (int i = 0; i < kCodes; ++i) addTone(x, korvo::codeHz(codes[static_cast<size_t>(i)]), ms(300) + step * i, ms(150), 0.1, 0.0);
        Samples s(x.size());
        for (size_t i = 0; i < x.size(); ++i) s[i] = static_cast<int16_t>(std::lround(x[i] * 32768.0));
        const auto events = decode(d, toDouble(soxEffect(s, "reverb " + std::to_string(amount), dir)));
        std::vector<int> count(kCodes, 0);
        int wrong = 0;
        for (size_t i = 0; i < events.size(); ++i) {
            // An event counts for the tone it falls in (or the echo right after it).
            const int64_t slot = std::clamp<int64_t>((events[i].endSample - ms(300)) / step, 0, kCodes - 1);
            if (events[i].code == codes[static_cast<size_t>(slot)]) ++count[static_cast<size_t>(events[i].code)];
            else ++wrong, std::printf("  wrong: code %d at %.3f s in slot of %d\n", events[i].code, events[i].endSample / kRate, codes[static_cast<size_t>(slot)]);
        }
        int missed = 0, twice = 0;
        for (int c : count) missed += c == 0, twice += c > 1;
        std::printf("%-10s events %zu, missed %d, reported twice %d, wrong %d\n", order ? "shuffled" : "ascending", events.size(), missed, twice, wrong);
    }
  }
}

// The same code twice with a 150 ms gap, 100 ms tones at 10 dB SNR.
void repeats(FrameDecoder& d, int trials) {
    int both = 0, total = 0, wrong = 0;
    for (int c = 0; c < kCodes; ++c) {
        for (int t = 0; t < trials; ++t) {
            std::mt19937_64 rng(5150u + 17u * static_cast<uint64_t>(c) + 100003u * static_cast<uint64_t>(t));
            const int64_t start = ms(300) + static_cast<int64_t>(rng() % kFrame);
            std::vector<double> x = whiteNoise(static_cast<size_t>(start + ms(700)), kToneAmplitude, 10, rng);
            addTone(x, korvo::codeHz(c), start, ms(100), kToneAmplitude, 0.0);
            addTone(x, korvo::codeHz(c), start + ms(250), ms(100), kToneAmplitude, 1.0);
            int own = 0;
            for (const Event& e : decode(d, x)) (e.code == c ? own : wrong)++;
            both += own == 2;
            ++total;
        }
    }
    std::printf("\n== repeated code, 150 ms gap, 10 dB SNR: both reported %.2f %% (%d/%d), wrong %d\n", 100.0 * both / total, both, total, wrong);
}

}  // namespace

int main(int argc, char** argv) {
    double minutes = 60;
    int trials = 20;
    std::string only, source, csv;
    for (int i = 1; i + 1 < argc; i += 2) {
        const std::string a = argv[i];
        if (a == "--minutes") minutes = std::atof(argv[i + 1]);
        else if (a == "--trials") trials = std::atoi(argv[i + 1]);
        else if (a == "--only") only = argv[i + 1];
        else if (a == "--source") source = argv[i + 1];
        else if (a == "--csv") csv = argv[i + 1];
    }
    char dirTemplate[] = "/tmp/korvo-decoder-eval-XXXXXX";
    const std::string dir = mkdtemp(dirTemplate);
    FrameDecoder d;
    auto want = [&](const char* name) { return only.empty() || only == name; };
    if (want("latency")) latency(d, trials * 2);
    if (want("repeat")) repeats(d, trials);
    if (want("distortion")) distortions(d, dir);
    if (want("reverb")) reverb(d, dir);
    if (want("detection")) detection(d, trials);
    if (want("false")) falseCodes(d, minutes, dir, source, csv);
    std::filesystem::remove_all(dir);
    return 0;
}
