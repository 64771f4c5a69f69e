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

std::string WriteOneFrame(const std::string& path, const ClipInfo& info,
                          const EncodeSettings& settings) {
  const auto writer = ClipWriter::Create(path, info, info.width, info.height, settings);
  writer->Write(0, Gradient(info.width, info.height, 0).data(), 8 * info.width);
  writer->Finish();
  return path;
}

TEST_F(ClipTest, LosslessRoundTripKeepsPixels) {
  // A code word of 8-bit YUV, as dithered, is up to 1.164 + 2.017 of 255 in blue; deeper and RGB
  // formats lose less.
  const struct {
    const char* format;
    double bound;
  } cases[] = {{"yuv444p", 3.2 / 255}, {"yuv444p10le", 0.8 / 255}, {"yuv444p16le", 0.02 / 255},
               {"bgr0", 0.51 / 255},   {"gbrp16le", 0.01 / 255},   {"yuva444p", 3.2 / 255}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.format);
    EncodeSettings settings;
    settings.codec = "ffv1";
    settings.pixel_format = c.format;
    settings.overwrite = true;
    const std::string path = WriteOneFrame(In("r.mkv"), Made(101, 67, 1, 16), settings);
    const auto reader = ClipReader::Open(path);
    const auto read = ReadFrame<HX_Pixel16>(*reader, 0);
    const auto written = Gradient(101, 67, 0);
    double worst = 0;
    for (std::size_t i = 0; i < read.size(); ++i) {
      worst = std::max({worst, std::abs(read[i].red - written[i].red) * 1.0,
                        std::abs(read[i].green - written[i].green) * 1.0,
                        std::abs(read[i].blue - written[i].blue) * 1.0,
                        std::abs(read[i].alpha - written[i].alpha) * 1.0});
    }
    EXPECT_LT(worst / 32768, c.bound);
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
    EXPECT_EQ(PacketHash(In(name), "0:a"), PacketHash(In("in.mp4"), "0:a"));
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

TEST_F(ClipTest, TinyAndOddSizesKeepTheirSize) {
  for (const auto& [width, height] : {std::pair{1, 1}, {3, 5}, {2, 2}, {65, 33}, {64, 33}}) {
    SCOPED_TRACE(std::to_string(width) + "x" + std::to_string(height));
    EncodeSettings settings;
    settings.overwrite = true;
    const auto reader =
        ClipReader::Open(WriteOneFrame(In("odd.mp4"), Made(width, height, 1), settings));
    EXPECT_EQ(reader->info().width, width);
    EXPECT_EQ(reader->info().height, height);
    EXPECT_EQ(ReadFrame<HX_Pixel8>(*reader, 0).size(), std::size_t(width) * height);
  }
}

TEST_F(ClipTest, RefusalsNameTheFileAndLeaveNothing) {
  WriteOneFrame(In("in.mkv"), Made(16, 16, 1), {});
  std::filesystem::create_symlink(In("in.mkv"), In("link.mkv"));
  std::ofstream(In("there.mp4")) << "precious";
  const ClipInfo info = ClipReader::Open(In("in.mkv"))->info();
  const std::size_t files = Files();
  const struct {
    const char* name;
    EncodeSettings settings;
    const char* cause;
  } cases[] = {{"in.mkv", {"", 18, "", true}, "input itself"},
               {"link.mkv", {"", 18, "", true}, "input itself"},
               {"out.nonsense", {}, ""},
               {"out", {}, ""},
               {"no/folder/out.mp4", {}, ""},
               {"o.mp4", {"libx246", 18, "", false}, "did you mean libx264?"},
               {"o.mp4", {"", 18, "yuv240p", false}, "did you mean yuv420p?"},
               {"there.mp4", {}, "exists"}};
  for (const auto& c : cases) {
    const std::string line = LineOf(
        Failure::Side::output, [&] { ClipWriter::Create(In(c.name), info, 16, 16, c.settings); });
    EXPECT_EQ(line.find(In(c.name)), 0u) << line;
    EXPECT_NE(line.find(c.cause), std::string::npos) << line;
    EXPECT_EQ(Files(), files) << c.name;
  }
  EXPECT_EQ(Content("there.mp4"), "precious");
}

TEST_F(ClipTest, AbandonedOrFailedWritingLeavesNothing) {
  {
    const auto writer = ClipWriter::Create(In("o.mp4"), Made(64, 64, 9), 64, 64, {});
    WriteFrame(*writer, 0, 64, Gradient(64, 64, 0));
    EXPECT_FALSE(std::filesystem::exists(In("o.mp4")));
  }
  EXPECT_EQ(Files(), 0u);

  // A full disk, as far as this process can tell.
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
  EXPECT_EQ(Files(), 0u);
}

}  // namespace
}  // namespace calmframe::media
