// A room's background sounds, each at its own level: white, pink and brown noise, a fan, a
// babble of distant voices and music (made here, or a recording looped). Levels are dBFS
// RMS, 0 dBFS being an RMS of full scale. Real-time: add() neither allocates nor blocks.
#pragma once
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace korvo {
namespace platform {
namespace acoustics {

enum class SoundKind { White, Pink, Brown, Fan, Babble, Music };

// "white", "pink", ...; false for an unknown name.
bool soundKindFromName(const std::string& name, SoundKind* kind);
const char* soundKindName(SoundKind kind);

struct SoundSpec {
    SoundKind kind = SoundKind::White;
    double dbfs = -60.0;
};

// One source of unit RMS.
class SoundSource {
public:
    virtual ~SoundSource() = default;
    virtual float next() = 0;
};

class Background {
public:
    // `musicFile`: a recording to loop for the music (any rate, mixed to mono); empty: music
    // made here. Null with a one-line reason when the file cannot be used.
    static std::unique_ptr<Background> make(const std::vector<SoundSpec>& sounds, uint64_t seed, double rate,
                                            const std::string& musicFile, std::string* error);
    bool none() const { return mSources.empty(); }
    // Adds the room's sounds to `samples` (full scale 1).
    void add(float* samples, int count);

private:
    struct Source {
        std::unique_ptr<SoundSource> source;
        float gain;
    };
    std::vector<Source> mSources;
};

// A source of the given kind, scaled to unit RMS (music made here when `music` is empty).
std::unique_ptr<SoundSource> makeSound(SoundKind kind, uint64_t seed, double rate, std::vector<float> music);

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
