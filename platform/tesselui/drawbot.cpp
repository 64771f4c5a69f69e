#include "platform/tesselui/drawbot.h"

#include <cairo.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <new>

#include "platform/tesselui/text_layout.h"

namespace tesselui::drawbot {
namespace {

// Cairo's fixed-point positions reach a little farther.
constexpr double kFarthest = 4e6;
constexpr double kRadians = M_PI / 180;

double Limited(double position) {
  return std::isnan(position) ? 0 : std::clamp(position, -kFarthest, kFarthest);
}

unsigned char Divided(unsigned value, unsigned by) {
  return static_cast<unsigned char>(std::min(255U, (value + by / 2) / by));
}

void Arc(cairo_t* context, double x, double y, double radius, double start, double sweep) {
  const double begin = start * kRadians, end = (start + sweep) * kRadians;
  (sweep < 0 ? cairo_arc_negative : cairo_arc)(context, Limited(x), Limited(y),
                                               std::max(0.0, Limited(radius)), begin, end);
}

// Composes a premultiplied pixel over a straight one: a = as + ad (1 - as),
// c = (cs as + cd ad (1 - as)) / a.
void Over(const unsigned char* from, unsigned char* to) {
  const unsigned source_alpha = from[3];
  if (source_alpha == 0) return;
  const unsigned rest = to[3] * (255 - source_alpha);  // ad (1 - as) in 1/255^2
  const unsigned alpha = source_alpha * 255 + rest;    // a in 1/255^2
  for (int c = 0; c < 3; ++c) to[c] = Divided(from[c] * 255U * 255U + to[c] * rest, alpha);
  to[3] = Divided(alpha, 255);
}

}  // namespace

void Path::MoveTo(double x, double y) {
  steps_.push_back({Kind::kMove, x, y, 0, 0, 0});
}
void Path::LineTo(double x, double y) {
  steps_.push_back({Kind::kLine, x, y, 0, 0, 0});
}
void Path::Close() {
  steps_.push_back({Kind::kClose, 0, 0, 0, 0, 0});
}
void Path::AddArc(double x, double y, double radius, double start, double sweep) {
  steps_.push_back({Kind::kArc, x, y, radius, start, sweep});
}
void Path::AddRect(double x, double y, double width, double height) {
  MoveTo(x, y);
  LineTo(x + width, y);
  LineTo(x + width, y + height);
  LineTo(x, y + height);
  Close();
}

// Drawing goes into a clear layer of Cairo's premultiplied pixels, since the buffer's are straight.
struct Surface::State {
  State(void* pixels, int row_bytes, int width, int height)
      : buffer(static_cast<unsigned char*>(pixels)),
        buffer_stride(row_bytes),
        layer(cairo_image_surface_create(CAIRO_FORMAT_ARGB32, width, height)),
        context(cairo_create(layer)) {
    if (cairo_status(context) != CAIRO_STATUS_SUCCESS) {
      Destroy();
      throw std::bad_alloc();
    }
  }
  ~State() { Destroy(); }
  void Destroy() {
    cairo_destroy(context);
    cairo_surface_destroy(layer);
  }

  void SetColor(const Color& color) {
    cairo_set_source_rgba(context, color.red, color.green, color.blue, color.alpha);
  }

  void Trace(const Path& path) {
    cairo_new_path(context);
    for (const Path::Step& step : path.steps_) {
      switch (step.kind) {
        case Path::Kind::kMove:
          cairo_move_to(context, Limited(step.x), Limited(step.y));
          break;
        case Path::Kind::kLine:
          cairo_line_to(context, Limited(step.x), Limited(step.y));
          break;
        case Path::Kind::kClose:
          cairo_close_path(context);
          break;
        case Path::Kind::kArc:
          Arc(context, step.x, step.y, step.radius, step.start, step.sweep);
          break;
      }
    }
  }

  unsigned char* const buffer;
  const int buffer_stride;
  cairo_surface_t* const layer;
  cairo_t* const context;
};

Surface::Surface(void* pixels, int row_bytes, int width, int height)
    : state_(std::make_unique<State>(pixels, row_bytes, width, height)) {}
Surface::~Surface() = default;

void Surface::FillPath(const Path& path, const Brush& brush) {
  state_->Trace(path);
  state_->SetColor(brush.color);
  cairo_fill(state_->context);
}

void Surface::StrokePath(const Path& path, const Pen& pen) {
  state_->Trace(path);
  state_->SetColor(pen.color);
  cairo_set_line_width(state_->context, std::max(0.0, Limited(pen.width)));
  cairo_stroke(state_->context);
}

void Surface::DrawText(const Font& font, const std::string& text, double x, double y,
                       const Color& color) {
  const TextLayout layout(font, text);
  state_->SetColor(color);
  cairo_move_to(state_->context, Limited(x), Limited(y));
  pango_cairo_show_layout(state_->context, layout.get());
}

void Surface::Flush() {
  if (cairo_status(state_->context) != CAIRO_STATUS_SUCCESS) throw std::bad_alloc();
  cairo_surface_flush(state_->layer);
  const unsigned char* layer = cairo_image_surface_get_data(state_->layer);
  const int stride = cairo_image_surface_get_stride(state_->layer);
  const int width = cairo_image_surface_get_width(state_->layer);
  const int height = cairo_image_surface_get_height(state_->layer);
  for (int y = 0; y < height; ++y) {
    const unsigned char* from = layer + std::ptrdiff_t{y} * stride;
    unsigned char* to = state_->buffer + std::ptrdiff_t{y} * state_->buffer_stride;
    for (int x = 0; x < width; ++x) Over(from + 4 * x, to + 4 * x);
  }
  cairo_save(state_->context);
  cairo_set_operator(state_->context, CAIRO_OPERATOR_CLEAR);
  cairo_paint(state_->context);
  cairo_restore(state_->context);
}

}  // namespace tesselui::drawbot
