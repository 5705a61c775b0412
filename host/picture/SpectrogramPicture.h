// Draws a spectrogram as a PNG picture: frequency against time, the code bands marked
// and labelled on the left, each heard code labelled where it was heard, the colour
// scale with the detection level on the right, and a title.
//
// Geometry (in pixels): the plot holds bins 1..255 from the bottom up, 2 pixels each
// (510 high), and one column of pixels per spectrogram column, widened to a whole
// number of pixels per column (the fewest that make it kMinPlotWidth or wider). Around it
// lie kLeftMargin, kTopMargin, kRightMargin and kBottomMargin.
#pragma once
#include <string>

#include "host/hearing/Decoder.h"
#include "host/picture/Spectrogram.h"

namespace korvo {
namespace host {

struct SpectrogramLayout {
    static constexpr int kBinPixels = 2;
    static constexpr int kPlotHeight = kBinPixels * korvo::kLastSpectrumEntry;
    static constexpr int kMinPlotWidth = 480;
    static constexpr int kLeftMargin = 80;
    static constexpr int kRightMargin = 190;
    static constexpr int kTopMargin = 48;
    static constexpr int kBottomMargin = 48;

    explicit SpectrogramLayout(int columns);
    int columnPixels;
    int plotWidth;
    int width;
    int height;
    // Top of bin `bin`'s two rows, and left of column `column`'s pixels.
    static constexpr int yOfBin(int bin) { return kTopMargin + kBinPixels * (korvo::kLastSpectrumEntry - bin); }
    int xOfColumn(double column) const { return kLeftMargin + static_cast<int>(column * columnPixels); }
};

// The levels the colours span: the read-out's scale from a magnitude of 1e-6 to full scale.
constexpr float kPictureLowLevel = 0.0f;
constexpr float kPictureHighLevel = 100.0f;

struct PictureTitle {
    std::string source;  // the file or the microphone's route
    double seconds = 0.0;
    bool hasLevel = false;  // the decoder takes a detection level: `level`
    int level = 0;
    DecoderKind decoder = DecoderKind::Host;
};

// False with the cause in a few words when the picture cannot be written.
bool writeSpectrogramPng(const Spectrogram& spectrogram, const PictureTitle& title, const std::string& path,
                         std::string* cause);

}  // namespace host
}  // namespace korvo
