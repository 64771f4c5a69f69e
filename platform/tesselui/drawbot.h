#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/tesselui/font.h"

// Anti-aliased drawing. Positions in pixels from the top left of the surface, y down; a pixel's
// centre lies at a half. One thread at a time uses an object.
namespace tesselui::drawbot {

// 0 to 1 each, limited to that; straight alpha.
struct Color {
  float red = 0, green = 0, blue = 0, alpha = 1;
};

class Path {
 public:
  void MoveTo(double x, double y);
  void LineTo(double x, double y);
  void Close();
  // Degrees from the positive x axis towards the positive y axis; a path that is open gets a line
  // to the arc's start.
  void AddArc(double x, double y, double radius, double start, double sweep);
  void AddRect(double x, double y, double width, double height);

 private:
  friend class Surface;
  enum class Kind { kMove, kLine, kClose, kArc };
  struct Step {
    Kind kind;
    double x, y, radius, start, sweep;
  };
  std::vector<Step> steps_;
};

struct Brush {
  Color color;
};

struct Pen {
  Color color;
  double width = 1;
};

// Draws over a buffer of 8-bit pixels in the order blue, green, red, alpha, straight alpha, top row
// first, which it borrows. The buffer changes in Flush alone. Throws std::bad_alloc.
class Surface {
 public:
  Surface(void* pixels, int row_bytes, int width, int height);
  ~Surface();  // drops what was not flushed
  Surface(const Surface&) = delete;
  Surface& operator=(const Surface&) = delete;

  // The inside by the rule of non-zero winding; open parts count as closed.
  void FillPath(const Path& path, const Brush& brush);
  void StrokePath(const Path& path, const Pen& pen);
  // The top left of the text's extent at (x, y).
  void DrawText(const Font& font, const std::string& text, double x, double y, const Color& color);
  void Flush();

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace tesselui::drawbot
