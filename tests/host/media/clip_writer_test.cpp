#include <sys/resource.h>

#include <algorithm>
#include <cmath>
#include <csignal>

#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

// A smooth picture with every channel moving.
std::vector<HX_Pixel16> Gradient(int width, int height, int frame) {
  std::vector<HX_Pixel16> pixels;
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      pixels.push_back({32768, static_cast<std::uint16_t>(32768 * x / width),
                        static_cast<std::uint16_t>(32768 * y / height),
                        static_cast<std::uint16_t>(1000 * frame + 16 * (x + y) % 20000)});
    }
  }
  return pixels;
}

TEST_F(ClipTest, PicturesOfAnySizeAndFormatComeBack) {
  // A code word of 8-bit YUV, as dithered, is up to 1.164 + 2.017 of 255 in blue; deeper and RGB
  // formats lose less. Halved chroma and tiny pictures' lossy codes tell the size alone.
  const struct {
    const char *codec, *format;
    int width, height;
    double bound;
  } cases[] = {{"ffv1", "yuv444p", 101, 67, 3.2 / 255},
               {"ffv1", "yuv444p10le", 101, 67, 0.8 / 255},
               {"ffv1", "yuv444p16le", 65, 33, 0.02 / 255},
               {"ffv1", "bgr0", 101, 67, 0.51 / 255},
               {"ffv1", "gbrp16le", 101, 67, 0.01 / 255},
               {"ffv1", "yuva444p", 101, 67, 3.2 / 255},
               {"", "", 1, 1, 1.01},
               {"", "", 3, 5, 1.01},
               {"", "", 64, 33, 1.01}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.format << " " << c.width);
    EncodeSettings settings;
    settings.codec = c.codec;
    settings.pixel_format = c.format;
    settings.overwrite = true;
    const auto written = Gradient(c.width, c.height, 0);
    const auto writer = ClipWriter::Create(In("r.mkv"), Made(c.width, c.height, 1, 16), c.width,
                                           c.height, settings);
    WriteFrame(*writer, 0, c.width, written);
    writer->Finish();
    const auto reader = ClipReader::Open(In("r.mkv"));
    EXPECT_EQ(reader->info().width, c.width);
    EXPECT_EQ(reader->info().height, c.height);
    const auto read = ReadFrame<HX_Pixel16>(*reader, 0);
    int worst = 0;
    for (std::size_t i = 0; i < read.size(); ++i) {
      worst = std::max({worst, std::abs(read[i].red - written[i].red),
                        std::abs(read[i].green - written[i].green),
                        std::abs(read[i].blue - written[i].blue),
                        std::abs(read[i].alpha - written[i].alpha)});
    }
    EXPECT_LT(worst / 32768.0, c.bound);
  }
}

// Seconds from the first frame's time to that of the first sound.
double SoundDelay(const std::string& path) {
  const auto first = [&](const std::string& stream) {
    return std::stod(Output("ffprobe -v error -select_streams " + stream +
                            " -read_intervals %+#1 -show_entries packet=pts_time -of "
                            "csv=p=0 '" +
                            path + "'"));
  };
  return first("a:0") - first("v:0");
}

std::string SoundHash(const std::string& path) {
  return Output("ffmpeg -v error -i '" + path + "' -map 0:a -c copy -f streamhash -hash md5 -");
}

TEST_F(ClipTest, VariableRateAndOtherStreamsGoThroughUntouched) {
  Ffmpeg(
      "-f lavfi -i testsrc2=s=64x48:r=30:d=3 -f lavfi -i sine=d=3 -f lavfi -i sine=880:d=3 "
      "-map 0 -map 1 -map 2 -vf \"select='not(eq(mod(n,7),3))'\" -vsync vfr -c:v libx264 "
      "-c:a aac -metadata title=Walk -metadata:s:a:1 language=fra -t 3 " +
      In("in.mp4"));
  const auto reader = ClipReader::Open(In("in.mp4"));
  const ClipInfo& info = reader->info();
  ASSERT_LT(info.frame_count, 80u);
  for (const char* name : {"out.mp4", "out.mkv"}) {
    SCOPED_TRACE(name);
    const auto writer = ClipWriter::Create(In(name), info, info.width, info.height, {});
    EXPECT_TRUE(writer->warnings().empty());
    for (std::size_t i = 0; i < info.frame_count; ++i) {
      WriteFrame(*writer, i, info.width, ReadFrame<HX_Pixel8>(*reader, i));
    }
    writer->Finish();
    const auto written = ClipReader::Open(In(name));
    ASSERT_EQ(written->info().frame_count, info.frame_count);
    // From the first frame: Matroska has no time below zero, where the sound's priming lies.
    const auto seconds = [](const ClipInfo& clip, std::size_t i) {
      return static_cast<double>(clip.times[i].pts - clip.times[0].pts) * clip.time_base.num /
             clip.time_base.den;
    };
    const double tick = std::string(name) == "out.mp4" ? 1e-9 : 0.00101;  // Matroska: milliseconds
    for (std::size_t i = 0; i < info.frame_count; ++i) {
      EXPECT_NEAR(seconds(written->info(), i), seconds(info, i), tick) << i;
    }
    EXPECT_NEAR(SoundDelay(In(name)), SoundDelay(In("in.mp4")), 0.0015);
    EXPECT_EQ(SoundHash(In(name)), SoundHash(In("in.mp4")));
    const std::string probe =
        Output("ffprobe -v error -show_entries format_tags=title:stream_tags " + In(name));
    EXPECT_NE(probe.find("title=Walk"), std::string::npos) << probe;
    EXPECT_NE(probe.find("language=fr"), std::string::npos) << probe;
  }
}

TEST_F(ClipTest, TagsAspectAndFieldsAreKept) {
  ClipInfo info = Made(64, 64, 2, 10);
  info.pixel_aspect = {16, 15};
  info.field_order = FieldOrder::bottom_first;
  info.colour = {9, 16, 9, 1, 1};
  const auto writer = ClipWriter::Create(In("t.mkv"), info, 64, 64, {});
  for (int i = 0; i < 2; ++i) WriteFrame(*writer, i, 64, Gradient(64, 64, i));
  writer->Finish();
  const ClipInfo read = ClipReader::Open(In("t.mkv"))->info();
  EXPECT_EQ(read.codec, "h264");
  EXPECT_EQ(read.bit_depth, 10);
  EXPECT_EQ(read.pixel_aspect, info.pixel_aspect);
  EXPECT_EQ(read.field_order, info.field_order);
  EXPECT_EQ(read.colour, info.colour);
}

TEST_F(ClipTest, AFullDiskIsToldAndLeavesNothing) {
  std::signal(SIGXFSZ, SIG_IGN);
  rlimit before;
  getrlimit(RLIMIT_FSIZE, &before);
  EncodeSettings settings;
  settings.codec = "rawvideo";
  const std::string line = LineOf(Failure::Side::output, [&] {
    const auto writer = ClipWriter::Create(In("full.mkv"), Made(256, 256, 50), 256, 256, settings);
    const rlimit small{200000, before.rlim_max};
    setrlimit(RLIMIT_FSIZE, &small);
    for (int i = 0; i < 20; ++i) WriteFrame(*writer, i, 256, Gradient(256, 256, i));
    writer->Finish();
  });
  setrlimit(RLIMIT_FSIZE, &before);
  EXPECT_NE(line.find("full.mkv: can't be written"), std::string::npos) << line;
  EXPECT_TRUE(std::filesystem::is_empty(In("")));
}

}  // namespace
}  // namespace calmframe::media
