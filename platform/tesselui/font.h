#pragma once

#include <string>

namespace tesselui {

// Size of a text in pixels: its advance, and the height of its lines.
struct TextExtent {
  int width = 0, height = 0;
};

// The font of the host's user interface: a sans-serif face. Any thread.
class Font {
 public:
  static Font HostFont();

  // UTF-8; a line break begins a line.
  TextExtent Measure(const std::string& text) const;
  double pixels() const { return pixels_; }  // height of the em square

 private:
  explicit Font(double pixels) : pixels_(pixels) {}
  double pixels_;
};

}  // namespace tesselui
