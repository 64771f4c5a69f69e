// The program, whose frames pass a host, its threads, its cache and the plug-in, against the same
// stages walked by hand: every pixel of every frame is the same.

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "pipeline/stabilize.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"

namespace {

using calmframe::media::ClipReader;
using kelp::effect::Controls;

class Deaf final : public calmframe::pipeline::Listener {
 public:
  void Progress(const char*, double, double, const char*) override {}
  bool Cancelled() override { return false; }
  void Warn(const std::string&) override {}
};

struct Case {
  const char* name;
  const char* conversion;  // of the drawn clip, by ffmpeg
  const char* flags;       // of the program
  Controls controls;       // the same
  int depth;
};

Controls With(void (*change)(Controls&)) {
  Controls controls;
  change(controls);
  return controls;
}

class DirectDriverTest : public testing::TestWithParam<Case> {
 protected:
  std::string Path(const std::string& name) const { return folder_.In(name); }

  static void Run(const std::string& command) {
    EXPECT_EQ(std::system(command.c_str()), 0) << command;
  }

  const ScratchFolder folder_;
};

TEST_P(DirectDriverTest, EveryFrameIsTheSame) {
  const Case& c = GetParam();
  calmframe::media::EncodeSettings lossless;
  lossless.crf = 0;
  calmframe::WriteStreet(Path("drawn.mkv"), calmframe::Made(192, 128, 48, 50), 3, lossless);
  Run("ffmpeg -nostdin -v error -i '" + Path("drawn.mkv") + "' " + c.conversion + " '" +
      Path("in.mkv") + "'");

  calmframe::pipeline::Output output;
  output.path = Path("direct.mkv");
  output.encode.crf = 0;
  output.depth = c.depth;
  Deaf deaf;
  calmframe::pipeline::Stabilize(Path("in.mkv"), c.controls, output, deaf);
  Run(CALMFRAME_PROGRAM " stabilize '" + Path("in.mkv") + "' '" + Path("hosted.mkv") +
      "' --quiet --crf 0 --depth " + std::to_string(c.depth) + " " + c.flags);

  const auto direct = ClipReader::Open(Path("direct.mkv"));
  const auto hosted = ClipReader::Open(Path("hosted.mkv"));
  ASSERT_EQ(hosted->info().frame_count, direct->info().frame_count);
  ASSERT_EQ(hosted->info().width, direct->info().width);
  const auto samples = static_cast<std::size_t>(4 * direct->info().width) * direct->info().height;
  std::vector<std::uint16_t> a(samples), b(samples);
  const std::ptrdiff_t row_bytes = direct->info().width * 8;
  for (std::size_t f = 0; f < direct->info().frame_count; ++f) {
    direct->Read(f, reinterpret_cast<HX_Pixel16*>(a.data()), row_bytes);
    hosted->Read(f, reinterpret_cast<HX_Pixel16*>(b.data()), row_bytes);
    ASSERT_EQ(a, b) << "frame " << f;
  }
}

INSTANTIATE_TEST_SUITE_P(
    Clips, DirectDriverTest,
    testing::Values(
        Case{"Defaults", "-c:v libx264 -crf 10", "", {}, 8},
        Case{"Anamorphic10Bit", "-vf setsar=4/3 -pix_fmt yuv420p10le -c:v libx264 -crf 10",
             "--method perspective --smoothness 120", With([](Controls& controls) {
               controls.method = kelp::effect::Method::perspective;
               controls.smoothness = 120;
             }),
             16},
        Case{"InterlacedBottomFirst",
             "-vf interlace=scan=bff:lowpass=off -c:v libx264 -crf 10 -flags +ildct+ilme",
             "--crop-less-smooth-more 30",
             With([](Controls& controls) { controls.crop_less_smooth_more = 30; }), 8},
        Case{"NoMotionStabilizeOnly", "-c:v libx264 -crf 10",
             "--result no-motion --framing stabilize-only", With([](Controls& controls) {
               controls.result = kelp::effect::Result::no_motion;
               controls.framing = Framing::stabilize_only;
             }),
             32},
        Case{"SynthesizedEdges", "-c:v libx264 -crf 10",
             "--framing synthesize-edges --synthesis-input-range 0.2 --synthesis-edge-feather 6",
             With([](Controls& controls) {
               controls.framing = Framing::synthesize_edges;
               controls.synthesis_input_range = 0.2;
               controls.synthesis_edge_feather = 6;
             }),
             8},
        Case{"SynthesizedEdgesOfFields",
             "-vf interlace=scan=tff:lowpass=off -c:v libx264 -crf 10 -flags +ildct+ilme",
             "--framing synthesize-edges",
             With([](Controls& controls) { controls.framing = Framing::synthesize_edges; }), 16},
        Case{"DetailedCropOnly", "-c:v libx264 -crf 10",
             "--detailed-analysis --framing crop --additional-scale 90 "
             "--rolling-shutter-ripple enhanced",
             With([](Controls& controls) {
               controls.detailed_analysis = true;
               controls.framing = Framing::crop;
               controls.additional_scale = 90;
               controls.rolling_shutter_ripple =
                   kelp::effect::RollingShutterRipple::enhanced_reduction;
             }),
             8}),
    [](const testing::TestParamInfo<Case>& test) { return std::string(test.param.name); });

}  // namespace
