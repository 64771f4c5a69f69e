#include <cstdlib>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

class SideBySideTest : public ProgramTest {
 protected:
  // The largest difference of a frame's columns [begin, end) from those of another that begin at
  // `from`, in 16 bits of 32768.
  static int Difference(const std::vector<HX_Pixel16>& frame, int width, int begin, int end,
                        const std::vector<HX_Pixel16>& other, int other_width, int from) {
    int worst = 0;
    for (std::size_t y = 0; y < frame.size() / static_cast<std::size_t>(width); ++y) {
      for (int x = begin; x < end; ++x) {
        const HX_Pixel16& a = frame[y * static_cast<std::size_t>(width) + x];
        const HX_Pixel16& b = other[y * static_cast<std::size_t>(other_width) + from + x - begin];
        for (const auto c : {&HX_Pixel16::red, &HX_Pixel16::green, &HX_Pixel16::blue}) {
          worst = std::max(worst, std::abs(a.*c - b.*c));
        }
      }
    }
    return worst;
  }
};

TEST_F(SideBySideTest, TheLeftHalfIsTheSourceAndTheRightOneTheResult) {
  struct Case {
    media::ClipInfo info;
    std::string in_format, flags;
    std::size_t first, frames;
    int bound;  // of 32768: an 8-bit code word of YUV in blue is 2.1 levels
  };
  constexpr int k8 = 2 * 32768 / 255 + 20;
  media::ClipInfo odd = Made(161, 121, 8, 25, {16, 11}), deep = Made(160, 120, 8, 25);
  media::ClipInfo fields = Made(160, 120, 8, 25), uneven = Made(160, 120, 12, 25);
  deep.bit_depth = 10;
  fields.field_order = media::FieldOrder::bottom_first;
  uneven.time_base = {1, 1000};
  for (int f = 0; f < 12; ++f) uneven.times.push_back({40 * f + f * f % 30, 40});
  const Case cases[] = {{odd, "yuv444p", "", 0, 8, k8},
                        {deep, "yuv444p10le", "", 0, 8, k8 / 4},
                        {deep, "yuv444p10le", " --depth 32", 0, 8, k8 / 4},
                        {fields, "yuv444p", "", 0, 8, k8},
                        {uneven, "bgr0", " --from 3f --to 9f", 3, 6, 32768 / 255 + 20}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.in_format + c.flags);
    const auto drift = [](double t) { return Camera{2 * std::sin(1.3 * t), 2 * std::cos(t)}; };
    MakeWall("in.mkv", c.info, drift,
             {.codec = "ffv1", .pixel_format = c.in_format, .overwrite = true});
    RunWell("stabilize in.mkv out.mkv --side-by-side both.mkv --codec ffv1 --overwrite" + c.flags);
    const auto in = ClipReader::Open(Path("in.mkv")), out = ClipReader::Open(Path("out.mkv")),
               both = ClipReader::Open(Path("both.mkv"));
    const int width = c.info.width;
    ASSERT_EQ(both->info().width, 2 * width);
    EXPECT_EQ(both->info().height, c.info.height);
    EXPECT_EQ(both->info().pixel_aspect, in->info().pixel_aspect);
    EXPECT_EQ(both->info().field_order, in->info().field_order);
    EXPECT_EQ(both->info().bit_depth, in->info().bit_depth);
    ASSERT_EQ(both->info().frame_count, c.frames);
    EXPECT_EQ(both->info().times, out->info().times);
    for (std::size_t f = 0; f < c.frames; ++f) {
      const auto frame = ReadFrame<HX_Pixel16>(*both, f);
      EXPECT_LE(
          Difference(frame, 2 * width, 0, width, ReadFrame<HX_Pixel16>(*in, c.first + f), width, 0),
          c.bound)
          << f;
      EXPECT_EQ(
          Difference(frame, 2 * width, width, 2 * width, ReadFrame<HX_Pixel16>(*out, f), width, 0),
          0)
          << f;
    }
  }
}

TEST_F(SideBySideTest, WhatItsEncoderCantHoldIsHalved) {
  const auto drift = [](double t) { return Camera{2 * std::sin(1.3 * t), 0}; };
  MakeWall("in.mkv", Made(2101, 45, 4, 25), drift, {.codec = "ffv1", .pixel_format = "yuv420p"});
  EXPECT_THAT(
      RunWell("stabilize in.mkv out.mkv --side-by-side both.mkv --codec mpeg1video "
              "--pixel-format yuv420p --quiet"),
      HasSubstr("both.mkv: its encoder takes no frames of 4202 x 45; both halves are 1050 x "
                "22\n"));
  const auto both = ClipReader::Open(Path("both.mkv"));
  EXPECT_EQ(both->info().width, 2100);
  EXPECT_EQ(both->info().height, 22);
  EXPECT_EQ(both->info().frame_count, 4u);
}

TEST_F(SideBySideTest, TheResultStandsWhateverBecomesOfIt) {
  MakeClip("in.mkv", 160, 120, 20);
  RunWell("analyze in.mkv --project p.calm");
  // Raw frames beyond what a file may have; the result is far below that.
  const Outcome full =
      Run("stabilize in.mkv out.mkv --side-by-side both.y4m --project p.calm --quiet",
          "ulimit -f 400; ");
  EXPECT_EQ(full.code, 4) << full.text;
  EXPECT_THAT(full.text, HasSubstr("both.y4m: "));
  EXPECT_EQ(ClipReader::Open(Path("out.mkv"))->info().frame_count, 20u);
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mkv", "out.mkv", "p.calm"));
  // None of the files that the run reads or writes, which costs no analysis.
  fs::create_hard_link(Path("in.mkv"), Path("link.mkv"));
  const std::string run = " x.mkv --quiet --overwrite --side-by-side ";
  for (const auto& [command, part] :
       {std::pair<std::string, std::string>{"stabilize in.mkv" + run + "in.mkv", "input itself"},
        {"stabilize in.mkv" + run + "link.mkv", "input itself"},
        {"stabilize in.mkv" + run + "./x.mkv", "./x.mkv: is the other output itself"},
        {"stabilize in.mkv" + run + "new.calm --project new.calm", "is an input itself"},
        {"render --project p.calm" + run + "link.mkv", "is an input itself"},
        {"stabilize in.mkv" + run + "both", "has no extension"}}) {
    ExpectLine(command, 4, part);
  }
  EXPECT_FALSE(fs::exists(Path("x.mkv")));
  RunWell("render --project p.calm x.mkv --from 4 --to 9 --side-by-side y.mkv");
  EXPECT_EQ(ClipReader::Open(Path("y.mkv"))->info().frame_count, 5u);
}

// Half of the height is odd; and fields, which a smaller frame has not.
TEST_F(SideBySideTest, ADraftShowsTheSameAtHalfSize) {
  media::ClipInfo fields = Made(164, 126, 6, 25);
  fields.field_order = media::FieldOrder::top_first;
  const auto drift = [](double t) { return Camera{2 * std::sin(1.3 * t), 2 * std::cos(t)}; };
  for (const media::ClipInfo& info : {Made(164, 126, 6, 25, {16, 11}), fields}) {
    SCOPED_TRACE(static_cast<int>(info.field_order));
    MakeWall("in.mkv", info, drift,
             {.codec = "ffv1", .pixel_format = "yuv444p", .overwrite = true});
    const std::string run = "stabilize in.mkv --codec ffv1 --quiet --overwrite ";
    RunWell(run + "whole.mkv");
    RunWell(run + "half.mkv --preset draft --side-by-side both.mkv");
    const auto whole = ClipReader::Open(Path("whole.mkv")),
               half = ClipReader::Open(Path("half.mkv"));
    ASSERT_EQ(half->info().width, 82);
    ASSERT_EQ(half->info().height, 62);
    EXPECT_EQ(half->info().pixel_aspect, info.pixel_aspect);
    EXPECT_EQ(half->info().field_order, media::FieldOrder::progressive);
    EXPECT_EQ(half->info().times, whole->info().times);
    EXPECT_EQ(ClipReader::Open(Path("both.mkv"))->info().width, 164);
    const auto large = ReadFrame(*whole, 3), small = ReadFrame(*half, 3);
    // Of a pixel from the mean of the four that it stands for, and from that of its neighbours.
    const auto difference = [&](int shift) {
      double sum = 0;
      for (int y = 4; y < 58; ++y) {
        for (int x = 4; x < 76; ++x) {
          const auto green = [&](int at_x, int at_y) {
            return large[static_cast<std::size_t>(at_y * 164 + at_x)].green;
          };
          const int left = 2 * x + shift, top = 2 * y;
          const double mean = 0.25 * (green(left, top) + green(left + 1, top) +
                                      green(left, top + 1) + green(left + 1, top + 1));
          sum += std::abs(small[static_cast<std::size_t>(y * 82 + x)].green - mean);
        }
      }
      return sum / (54 * 72);
    };
    EXPECT_LT(difference(0), 0.8 * difference(2));
    EXPECT_LT(difference(0), 0.8 * difference(-2));
  }
}

}  // namespace
}  // namespace calmframe
