#include "stabilization/warp/displacement_svg.h"

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <ostream>

namespace marrow::stabilization {
namespace {

#if defined(__GNUC__)
__attribute__((format(printf, 2, 3)))
#endif
void print(std::ostream& out, const char* format, ...) {
  char line[512];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(line, sizeof line, format, arguments);
  va_end(arguments);
  out << line;
}

}  // namespace

void write_displacement_svg(std::ostream& out, std::span<const Displacement> list, int width,
                            int height) {
  out << "<?xml version=\"1.0\" standalone=\"no\"?>\n"
         "<!DOCTYPE svg PUBLIC \"-//W3C//DTD SVG 1.1//EN\" "
         "\"http://www.w3.org/Graphics/SVG/1.1/DTD/svg11.dtd\">\n";
  print(out, "<svg width=\"%d\" height=\"%d\" version=\"1.1\" xmlns=\"%s\">\n", width, height,
        "http://www.w3.org/2000/svg");
  double largest = 0;
  for (const Displacement& d : list) largest = std::max(largest, d.weight);
  for (const Displacement& d : list) {
    const int red = largest > 0 && !d.outlier ? static_cast<int>(255 * d.weight / largest) : 0;
    const int blue = d.outlier ? 255 : 0;
    print(out, "<circle cx=\"%.3f\" cy=\"%.3f\" r=\"2\" fill=\"grey\"/>\n", d.sourceX, d.sourceY);
    print(out, "<line x1=\"%.3f\" y1=\"%.3f\" x2=\"%.3f\" y2=\"%.3f\" stroke=\"rgb(%d,%d,%d)\"/>\n",
          d.sourceX, d.sourceY, d.targetX, d.targetY, red, 0, blue);
    print(out, "<circle cx=\"%.3f\" cy=\"%.3f\" r=\"2\" fill=\"rgb(%d,%d,%d)\"/>\n", d.targetX,
          d.targetY, red, 0, blue);
  }
  out << "</svg>\n";
}

}  // namespace marrow::stabilization
