#include "stabilization/warp/displacement_svg.h"

#include <gtest/gtest.h>

#include <sstream>

#include "tests/stabilization/displacement_lists.h"

namespace marrow::stabilization {
namespace {

TEST(DisplacementSvgTest, OneGroupForEachDisplacement) {
  std::vector<Displacement> list = {displacement({1, 2}, {3, 4.5}, 0.5),
                                    displacement({5, 6}, {7, 8}, 1),
                                    displacement({9, 9}, {1e300, 8}, 0)};
  list[2].outlier = true;
  std::ostringstream out;
  write_displacement_svg(out, list, 1920, 1080);
  const std::string text = out.str();
  EXPECT_EQ(text.rfind("<?xml version=\"1.0\" standalone=\"no\"?>", 0), 0u);
  EXPECT_NE(text.find("<svg width=\"1920\" height=\"1080\" version=\"1.1\" xmlns="),
            std::string::npos);
  EXPECT_NE(text.find("x1=\"1.000\" y1=\"2.000\" x2=\"3.000\" y2=\"4.500\" "
                      "stroke=\"rgb(127,0,0)\""),
            std::string::npos);
  EXPECT_NE(text.find("cx=\"7.000\" cy=\"8.000\" r=\"2\" fill=\"rgb(255,0,0)\""),
            std::string::npos);
  EXPECT_NE(text.find("</svg>"), std::string::npos);
}

}  // namespace
}  // namespace marrow::stabilization
