#include <sys/resource.h>

#include <algorithm>
#include <cmath>
#include <csignal>

#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

using testing::HasSubstr;

// A smooth picture with every channel moving.
struct Gradient {
  const int width, height;
  void operator()(int frame, HX_Pixel16* pixels) const {
    for (int y = 0; y < height; ++y) {
      for (int x = 0; x < width; ++x) {
        *pixels++ = {32768, static_cast<std::uint16_t>(32768 * x / width),
                     static_cast<std::uint16_t>(32768 * y / height),
                     static_cast<std::uint16_t>(1000 * frame + 16 * (x + y) % 20000)};
      }
    }
  }
};

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
    ClipInfo info = Made(c.width, c.height, 1, 25);
    info.bit_depth = 16;
    const Gradient gradient{c.width, c.height};
    WriteClip<HX_Pixel16>(In("r.mkv"), info, gradient,
                          {.codec = c.codec, .pixel_format = c.format, .overwrite = true});
    const auto reader = ClipReader::Open(In("r.mkv"));
    EXPECT_EQ(reader->info().width, c.width);
    EXPECT_EQ(reader->info().height, c.height);
    const auto read = ReadFrame<HX_Pixel16>(*reader, 0);
    std::vector<HX_Pixel16> written(read.size());
    gradient(0, written.data());
    int worst = 0;
    for (std::size_t i = 0; i < read.size(); ++i) {
      for (const auto channel :
           {&HX_Pixel16::alpha, &HX_Pixel16::red, &HX_Pixel16::green, &HX_Pixel16::blue}) {
        worst = std::max(worst, std::abs(read[i].*channel - written[i].*channel));
      }
    }
    EXPECT_LT(worst / 32768.0, c.bound);
  }
}

// Seconds from the first frame's time to that of the first sound.
double SoundDelay(const std::string& path) {
  const auto first = [&](const std::string& stream) {
    return std::stod(
        Output("ffprobe -v error -read_intervals %+#1 -show_entries packet=pts_time "
               "-of csv=p=0 -select_streams " +
               stream + " '" + path + "'"));
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
    const auto copied = [&](int frame, HX_Pixel8* pixels) { reader->Read(frame, pixels, 64 * 4); };
    EXPECT_THAT(WriteClip(In(name), info, copied), testing::IsEmpty());
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
    EXPECT_THAT(probe, testing::AllOf(HasSubstr("title=Walk"), HasSubstr("language=fr")));
  }
  const std::string bytes = Content("out.mp4");
  EXPECT_LT(bytes.find("moov"), bytes.find("mdat"));
}

TEST_F(ClipTest, TagsAspectAndFieldsAreKept) {
  ClipInfo info = Made(64, 64, 2, 25, {16, 15});
  info.bit_depth = 10;
  info.field_order = FieldOrder::bottom_first;
  info.colour = {9, 16, 9, 1, 1};
  WriteClip<HX_Pixel16>(In("t.mkv"), info, Gradient{64, 64});
  const ClipInfo read = ClipReader::Open(In("t.mkv"))->info();
  EXPECT_EQ(read.codec, "h264");
  EXPECT_EQ(read.bit_depth, 10);
  EXPECT_EQ(read.pixel_aspect, info.pixel_aspect);
  EXPECT_EQ(read.field_order, info.field_order);
  EXPECT_EQ(read.colour, info.colour);
}

TEST_F(ClipTest, WhatTheCodecHasOfTheSourceIsKeptAndTheRestIsTold) {
  const struct {
    std::string make, name, out, codec, format, told;
  } cases[] = {
      {"prores_ks -pix_fmt yuv422p10le", "0.mov", "0o.mov", "prores", "yuv422p10le", ""},
      // Decoders give ProRes 4444 as 12 bits.
      {"prores_ks -pix_fmt yuva444p10le", "1.mov", "1o.mov", "prores", "yuva444p12le",
       "prores drops the clip's 12 bits (10 stay); --codec ffv1 in .mkv keeps all"},
      {"ffv1 -pix_fmt yuv422p12le", "2.mkv", "2o.mkv", "ffv1", "yuv422p12le", ""},
      {"ffv1 -pix_fmt bgr0", "3.mkv", "3o.mkv", "ffv1", "bgr0", ""},
      {"libvpx-vp9 -auto-alt-ref 0 -pix_fmt yuva420p", "4.webm", "4o.webm", "", "yuva420p", ""},
      {"libx265 -x265-params log-level=none -pix_fmt yuv420p10le", "5.mp4", "5o.mp4", "libx265",
       "yuv420p10le", ""},
      {"mjpeg -pix_fmt yuvj422p", "6.avi", "6o.mp4", "", "yuvj422p", ""},
      {"ffv1 -pix_fmt yuv444p", "7.mkv", "7o.mp4", "", "yuv444p",
       "h264 drops the clip's losslessness; --crf 0 keeps all"},
      {"ffv1 -pix_fmt yuva420p", "8.mkv", "8o.mp4", "", "yuv420p",
       "h264 drops the clip's alpha and losslessness; --codec ffv1 in .mkv keeps all"},
      {"libx264 -pix_fmt yuv422p", "9.mp4", "9o.mkv", "mpeg4", "yuv420p",
       "mpeg4 drops the clip's 4:2:2 chroma (4:2:0 stays); --codec libx264 keeps all"},
      {"qtrle -pix_fmt argb", "10.mov", "10o.y4m", "", "yuv444p",
       "YUV4MPEG2 drops the clip's alpha and losslessness; --codec rawvideo to - keeps all"},
      {"libvpx-vp9 -auto-alt-ref 0 -pix_fmt yuva420p", "11.webm", "11o.mp4", "", "yuv420p",
       "h264 drops the clip's alpha; --codec libvpx-vp9 in .webm keeps all"},
      {"ffv1 -pix_fmt bgr0", "12.mkv", "12o.mp4", "", "yuv444p",
       "h264 drops the clip's losslessness; --codec ffv1 in .mkv keeps all"},
      {"qtrle -pix_fmt argb", "13.mov", "13o%d.jpg", "", "yuvj444p",
       "mjpeg drops the clip's alpha and losslessness; a name like f%04d.png keeps all"},
  };
  std::string make = "-f lavfi -i testsrc=s=64x48:r=25,format=rgba,colorchannelmixer=aa=0.5 ";
  for (const auto& c : cases) make += "-frames:v 5 -c:v " + c.make + " " + In(c.name) + " ";
  Ffmpeg(make);
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const auto reader = ClipReader::Open(In(c.name));
    const auto copied = [&](int frame, HX_Pixel8* pixels) { reader->Read(frame, pixels, 64 * 4); };
    const auto told =
        WriteClip(In(c.out), reader->info(), copied, {.codec = c.codec, .pixel_format = ""});
    if (c.told.empty()) {
      EXPECT_THAT(told, testing::IsEmpty());
    } else {
      EXPECT_THAT(told, testing::ElementsAre(testing::EndsWith(c.told)));
    }
    const auto written = ClipReader::Open(In(c.out));
    EXPECT_EQ(written->info().pixel_format, c.format);
    if (written->info().has_alpha) {
      EXPECT_NEAR(ReadFrame(*written, 1)[99].alpha, 128, 2);
    }
  }
}

TEST_F(ClipTest, AFullDiskIsToldAndLeavesNothing) {
  std::signal(SIGXFSZ, SIG_IGN);
  rlimit before;
  getrlimit(RLIMIT_FSIZE, &before);
  const rlimit small{200000, before.rlim_max};
  setrlimit(RLIMIT_FSIZE, &small);
  const auto write = [&] {
    WriteClip<HX_Pixel16>(In("full.mkv"), Made(256, 256, 20, 25), Gradient{256, 256},
                          {.codec = "rawvideo", .pixel_format = ""});
  };
  EXPECT_THAT(write, Fails(Failure::Side::output, HasSubstr("full.mkv: can't be written")));
  setrlimit(RLIMIT_FSIZE, &before);
  EXPECT_TRUE(std::filesystem::is_empty(In("")));
}

}  // namespace
}  // namespace calmframe::media
