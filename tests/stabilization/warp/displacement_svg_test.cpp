#include "stabilization/warp/displacement_svg.h"

#include <gtest/gtest.h>

#include <sstream>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

TEST(DisplacementSvgTest, OneGroupForEachDisplacement) {
  std::vector<Displacement> list = {displacement({1, 2}, {3, 4.5}, 0.5),
                                    displacement({5, 6}, {7, 8}, 1),
                                    displacement({9, 9}, {1e300, 8}, 0)};
  list[2].outlier = true;
  std::ostringstream out;
  write_displacement_svg(out, list, 1920, 1080);
  for (const char* part :
       {"<?xml version=\"1.0\" standalone=\"no\"?>\n",
        "<svg width=\"1920\" height=\"1080\" version=\"1.1\" xmlns=",
        "x1=\"1.000\" y1=\"2.000\" x2=\"3.000\" y2=\"4.500\" stroke=\"rgb(127,0,0)\"",
        "cx=\"7.000\" cy=\"8.000\" r=\"2\" fill=\"rgb(255,0,0)\"", "fill=\"rgb(0,0,255)\"",
        "</svg>"}) {
    EXPECT_NE(out.str().find(part), std::string::npos) << part;
  }
}

}  // namespace
}  // namespace marrow::stabilization
