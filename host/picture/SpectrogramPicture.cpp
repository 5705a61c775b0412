#include "host/picture/SpectrogramPicture.h"

#include <cairo.h>
#include <fontconfig/fontconfig.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <memory>

#include "host/base/Clock.h"
#include "host/picture/PictureFile.h"

namespace korvo {
namespace host {

namespace {

struct Rgb {
    double r, g, b;
};

constexpr int kBarLeftGap = 50;  // kHz labels between plot and colour bar
constexpr int kBarWidth = 16;
constexpr double kFontSize = 11.0;
constexpr double kTitleSize = 14.0;
constexpr int kMinTickSpacing = 70;  // pixels between time labels
constexpr Rgb kPage{1.0, 1.0, 1.0};
constexpr Rgb kInk{0.0, 0.0, 0.0};
constexpr Rgb kNotListening{0.86, 0.86, 0.86};
// A decoder without a detection level: no level greys anything, and no line is drawn.
constexpr int kNoLevel = -1000;

// A dark-to-bright map whose brightness rises throughout, so brighter always means louder.
Rgb heat(double t) {
    static constexpr std::array<Rgb, 6> kStops = {{{0.00, 0.00, 0.02},
                                                   {0.16, 0.04, 0.33},
                                                   {0.40, 0.08, 0.43},
                                                   {0.73, 0.22, 0.33},
                                                   {0.98, 0.56, 0.04},
                                                   {0.99, 1.00, 0.64}}};
    t = std::clamp(t, 0.0, 1.0) * (kStops.size() - 1);
    const size_t i = std::min(static_cast<size_t>(t), kStops.size() - 2);
    const double f = t - static_cast<double>(i);
    const Rgb& a = kStops[i];
    const Rgb& b = kStops[i + 1];
    return {a.r + (b.r - a.r) * f, a.g + (b.g - a.g) * f, a.b + (b.b - a.b) * f};
}

double scaled(float level) {
    return (static_cast<double>(level) - kPictureLowLevel) / (kPictureHighLevel - kPictureLowLevel);
}

// At or under the detection level a read-out shows nothing: such levels are drawn in dim grey.
Rgb colourOf(float level, int detection) {
    if (!std::isfinite(level)) return heat(0.0);
    const double t = std::clamp(scaled(level), 0.0, 1.0);
    if (!(level > static_cast<float>(detection))) {
        const double g = 0.05 + 0.4 * t;
        return {g, g, g};
    }
    return heat(t);
}

uint32_t pixel(const Rgb& c) {
    auto byte = [](double v) { return static_cast<uint32_t>(std::lround(std::clamp(v, 0.0, 1.0) * 255.0)); };
    return 0xff000000u | byte(c.r) << 16 | byte(c.g) << 8 | byte(c.b);
}

void setColour(cairo_t* cr, const Rgb& c) { cairo_set_source_rgb(cr, c.r, c.g, c.b); }

void font(cairo_t* cr, double size, bool bold = false) {
    cairo_select_font_face(cr, "DejaVu Sans", CAIRO_FONT_SLANT_NORMAL,
                           bold ? CAIRO_FONT_WEIGHT_BOLD : CAIRO_FONT_WEIGHT_NORMAL);
    cairo_set_font_size(cr, size);
}

enum class Align { Left, Centre, Right };

// Text with its baseline at y; x is its left end, centre or right end.
void text(cairo_t* cr, double x, double y, const std::string& s, Align align = Align::Left) {
    cairo_text_extents_t e;
    cairo_text_extents(cr, s.c_str(), &e);
    if (align == Align::Centre) x -= e.x_advance / 2.0;
    if (align == Align::Right) x -= e.x_advance;
    cairo_move_to(cr, x, y);
    cairo_show_text(cr, s.c_str());
}

// White text with a dark outline: readable over any colour of the plot.
void markText(cairo_t* cr, double x, double y, const std::string& s) {
    cairo_move_to(cr, x, y);
    cairo_text_path(cr, s.c_str());
    setColour(cr, kInk);
    cairo_set_line_width(cr, 3.0);
    cairo_stroke_preserve(cr);
    setColour(cr, kPage);
    cairo_fill(cr);
}

void line(cairo_t* cr, double x0, double y0, double x1, double y1) {
    cairo_move_to(cr, x0, y0);
    cairo_line_to(cr, x1, y1);
    cairo_stroke(cr);
}

std::string format(const char* fmt, double v) {
    char s[64];
    snprintf(s, sizeof s, fmt, v);
    return s;
}

void paintPlot(cairo_surface_t* surface, const Spectrogram& sg, const SpectrogramLayout& at, int detection) {
    cairo_surface_flush(surface);
    unsigned char* data = cairo_image_surface_get_data(surface);
    const int stride = cairo_image_surface_get_stride(surface);
    for (int c = 0; c < sg.columns(); ++c) {
        const int x0 = at.xOfColumn(c);
        for (int bin = 1; bin <= korvo::kLastSpectrumEntry; ++bin) {
            const uint32_t p = pixel(sg.filled(c) ? colourOf(sg.level(c, bin), detection) : kNotListening);
            const int y0 = SpectrogramLayout::yOfBin(bin);
            for (int y = y0; y < y0 + SpectrogramLayout::kBinPixels; ++y) {
                auto* row = reinterpret_cast<uint32_t*>(data + static_cast<ptrdiff_t>(y) * stride);
                std::fill(row + x0, row + x0 + at.columnPixels, p);
            }
        }
    }
    cairo_surface_mark_dirty(surface);
}

void drawTitle(cairo_t* cr, const Spectrogram& sg, const PictureTitle& title) {
    setColour(cr, kInk);
    font(cr, kTitleSize, true);
    text(cr, 8, 20, "Spectrogram of " + title.source);
    font(cr, kFontSize);
    const double columnMs = stepSeconds(sg.stepsPerColumn()) * 1000.0;
    char s[256];
    const std::string level = title.hasLevel ? "detection level " + std::to_string(title.level) : "no detection level";
    snprintf(s, sizeof s, "%.1f s   %s   %s decision   one column: %.1f ms%s", title.seconds, level.c_str(),
             decoderName(title.decoder), columnMs, sg.stepsPerColumn() > 1 ? " (the loudest of its steps)" : "");
    text(cr, 8, 38, s);
}

// Left: each code's band, labelled by code. Right: frequency in kHz.
void drawFrequencyAxes(cairo_t* cr, const SpectrogramLayout& at) {
    const int plotRight = SpectrogramLayout::kLeftMargin + at.plotWidth;
    setColour(cr, kInk);
    cairo_set_line_width(cr, 1.0);
    font(cr, kFontSize);
    for (int c = 0; c < kHostCodes; ++c) {
        const double y = SpectrogramLayout::yOfBin(korvo::codeIndex(c)) + 1.0;
        line(cr, SpectrogramLayout::kLeftMargin - 6, y, SpectrogramLayout::kLeftMargin, y);
        text(cr, SpectrogramLayout::kLeftMargin - 9, y + 4, std::to_string(c), Align::Right);
    }
    cairo_save(cr);
    cairo_translate(cr, 18, SpectrogramLayout::kTopMargin + SpectrogramLayout::kPlotHeight / 2.0);
    cairo_rotate(cr, -M_PI / 2.0);
    text(cr, 0, 0, "code (its band)", Align::Centre);
    cairo_restore(cr);
    for (int khz = 2; khz <= 22; khz += 2) {
        const double y = SpectrogramLayout::yOfBin(0) + 1.0 - khz * 1000.0 / korvo::kBinHz * SpectrogramLayout::kBinPixels;
        line(cr, plotRight, y, plotRight + 5, y);
        text(cr, plotRight + 8, y + 4, std::to_string(khz) + " kHz");
    }
}

void drawTimeAxis(cairo_t* cr, const Spectrogram& sg, const SpectrogramLayout& at) {
    const double pxPerSecond = at.columnPixels / stepSeconds(sg.stepsPerColumn());
    static constexpr std::array<double, 14> kSteps = {0.1, 0.2, 0.5, 1, 2, 5, 10, 15, 30, 60, 120, 300, 600, 1800};
    double every = kSteps.back();
    for (double s : kSteps) {
        if (s * pxPerSecond >= kMinTickSpacing) {
            every = s;
            break;
        }
    }
    const double bottom = SpectrogramLayout::kTopMargin + SpectrogramLayout::kPlotHeight;
    setColour(cr, kInk);
    cairo_set_line_width(cr, 1.0);
    font(cr, kFontSize);
    const double seconds = at.plotWidth / pxPerSecond;
    for (int i = 0; i * every <= seconds + 1e-9; ++i) {
        const double x = SpectrogramLayout::kLeftMargin + i * every * pxPerSecond;
        line(cr, x, bottom, x, bottom + 5);
        text(cr, x, bottom + 18, format(every < 1 ? "%.1f" : "%.0f", i * every), Align::Centre);
    }
    text(cr, SpectrogramLayout::kLeftMargin, at.height - 8,
         "time (s)   colour: level (100 = full scale)   grey: at or under the detection level   pale: not "
         "listening yet");
}

void drawColourScale(cairo_t* cr, const SpectrogramLayout& at, int detection) {
    const double left = SpectrogramLayout::kLeftMargin + at.plotWidth + kBarLeftGap;
    const double top = SpectrogramLayout::kTopMargin;
    const double height = SpectrogramLayout::kPlotHeight;
    auto yOf = [&](double level) { return top + (1.0 - std::clamp(scaled(static_cast<float>(level)), 0.0, 1.0)) * height; };
    for (int y = 0; y < SpectrogramLayout::kPlotHeight; ++y) {
        const double level = kPictureHighLevel - (y + 0.5) / height * (kPictureHighLevel - kPictureLowLevel);
        setColour(cr, colourOf(static_cast<float>(level), detection));
        cairo_rectangle(cr, left, top + y, kBarWidth, 1);
        cairo_fill(cr);
    }
    setColour(cr, kInk);
    cairo_set_line_width(cr, 1.0);
    cairo_rectangle(cr, left - 0.5, top - 0.5, kBarWidth + 1, height + 1);
    cairo_stroke(cr);
    font(cr, kFontSize);
    for (int level = static_cast<int>(kPictureLowLevel); level <= kPictureHighLevel; level += 20) {
        text(cr, left + kBarWidth + 4, yOf(level) + 4, std::to_string(level));
    }
    if (detection == kNoLevel) return;
    // The detection level: a line across the bar, clamped to its ends when off the scale.
    const double y = yOf(detection);
    cairo_set_line_width(cr, 2.0);
    line(cr, left - 4, y, left + kBarWidth + 4, y);
    font(cr, kFontSize, true);
    text(cr, left + kBarWidth + 28, y + 4, "detection " + std::to_string(detection));
}

void drawHeard(cairo_t* cr, const Spectrogram& sg, const SpectrogramLayout& at) {
    font(cr, kFontSize, true);
    for (const Spectrogram::Heard& h : sg.heard()) {
        if (!hears(DecoderKind::Host, h.code)) continue;
        const double x = at.xOfColumn(sg.columnOf(h.step)) + at.columnPixels / 2.0;
        const double y = SpectrogramLayout::yOfBin(korvo::codeIndex(h.code)) + 1.0;
        // A tick from just above the code's band, and the code beside it: the band itself stays visible.
        setColour(cr, kInk);
        cairo_set_line_width(cr, 3.0);
        line(cr, x, y - 5, x, y - 15);
        setColour(cr, kPage);
        cairo_set_line_width(cr, 1.0);
        line(cr, x, y - 5, x, y - 15);
        markText(cr, x + 3, y - 6, std::to_string(h.code));
    }
}

}  // namespace

SpectrogramLayout::SpectrogramLayout(int columns)
    : columnPixels((kMinPlotWidth + std::max(1, columns) - 1) / std::max(1, columns)),
      plotWidth(std::max(1, columns) * columnPixels),
      width(kLeftMargin + plotWidth + kRightMargin),
      height(kTopMargin + kPlotHeight + kBottomMargin) {}

// The text's fonts come from caches that cairo and the font configuration keep for the
// whole process; a command draws one picture, so they are let go once it is drawn.
struct FontCaches {
    ~FontCaches() {
        cairo_debug_reset_static_data();
        FcFini();
    }
};

bool writeSpectrogramPng(const Spectrogram& sg, const PictureTitle& title, const std::string& path,
                         std::string* cause) {
    const FontCaches releasedAfterDrawing;
    const SpectrogramLayout at(sg.columns());
    std::unique_ptr<cairo_surface_t, decltype(&cairo_surface_destroy)> surface(
        cairo_image_surface_create(CAIRO_FORMAT_RGB24, at.width, at.height), cairo_surface_destroy);
    std::unique_ptr<cairo_t, decltype(&cairo_destroy)> context(cairo_create(surface.get()), cairo_destroy);
    cairo_t* cr = context.get();
    setColour(cr, kPage);
    cairo_paint(cr);
    const int detection = title.hasLevel ? title.level : kNoLevel;
    paintPlot(surface.get(), sg, at, detection);
    drawTitle(cr, sg, title);
    drawFrequencyAxes(cr, at);
    drawTimeAxis(cr, sg, at);
    drawColourScale(cr, at, detection);
    drawHeard(cr, sg, at);
    setColour(cr, kInk);
    cairo_set_line_width(cr, 1.0);
    cairo_rectangle(cr, SpectrogramLayout::kLeftMargin - 0.5, SpectrogramLayout::kTopMargin - 0.5, at.plotWidth + 1,
                    SpectrogramLayout::kPlotHeight + 1);
    cairo_stroke(cr);
    if (cairo_status(cr) != CAIRO_STATUS_SUCCESS) {
        *cause = std::string("cannot draw: ") + cairo_status_to_string(cairo_status(cr));
        return false;
    }

    PictureFile file;
    if (!file.open(path, cause)) return false;
    // The stream callback keeps the system's own reason for a failed write.
    struct Sink {
        FILE* file;
        int error;
    } sink{file.stream(), 0};
    const cairo_status_t status = cairo_surface_write_to_png_stream(
        surface.get(),
        [](void* closure, const unsigned char* data, unsigned int length) {
            auto* s = static_cast<Sink*>(closure);
            if (fwrite(data, 1, length, s->file) == length) return CAIRO_STATUS_SUCCESS;
            s->error = errno;
            return CAIRO_STATUS_WRITE_ERROR;
        },
        &sink);
    if (status != CAIRO_STATUS_SUCCESS) {
        *cause = std::string("cannot write: ") + (sink.error != 0 ? strerror(sink.error) : cairo_status_to_string(status));
        return false;  // the new file goes with `file`; whatever was at the path stays
    }
    return file.commit(cause);
}

}  // namespace host
}  // namespace korvo
