#include "platform/tesselui/font.h"

#include <algorithm>
#include <limits>

#include "platform/tessel/utility.h"
#include "platform/tesselui/text_layout.h"

namespace tesselui {
namespace {

// The longest banner text and its margins just fit 1200 pixels.
constexpr double kHostFontPixels = 24;

std::mutex& font_mutex() {
  static std::mutex& mutex = *new std::mutex;
  return mutex;
}

// Under font_mutex.
PangoFontMap* FontMap() {
  static PangoFontMap* const map = pango_cairo_font_map_new();
  return map;
}

}  // namespace

TextLayout::TextLayout(const Font& font, const std::string& text)
    : lock_(font_mutex()),
      context_(pango_font_map_create_context(FontMap())),
      layout_(pango_layout_new(context_.get())) {
  // Grey edges without hints: the same picture whatever the desktop's settings are.
  cairo_font_options_t* options = cairo_font_options_create();
  cairo_font_options_set_antialias(options, CAIRO_ANTIALIAS_GRAY);
  cairo_font_options_set_hint_style(options, CAIRO_HINT_STYLE_NONE);
  cairo_font_options_set_hint_metrics(options, CAIRO_HINT_METRICS_OFF);
  pango_cairo_context_set_font_options(context_.get(), options);
  cairo_font_options_destroy(options);

  PangoFontDescription* description = pango_font_description_new();
  pango_font_description_set_family_static(description, "sans-serif");
  pango_font_description_set_absolute_size(description, font.pixels() * PANGO_SCALE);
  pango_layout_set_font_description(layout_.get(), description);
  pango_font_description_free(description);
  const std::string valid = tessel::utility::ToUTF8(tessel::utility::ToUTF16(text));
  const std::size_t most = std::numeric_limits<int>::max();
  pango_layout_set_text(layout_.get(), valid.data(),
                        static_cast<int>(std::min(valid.size(), most)));
}

Font Font::HostFont() {
  return Font(kHostFontPixels);
}

TextExtent Font::Measure(const std::string& text) const {
  const TextLayout layout(*this, text);
  TextExtent extent;
  pango_layout_get_pixel_size(layout.get(), &extent.width, &extent.height);
  return extent;
}

}  // namespace tesselui
