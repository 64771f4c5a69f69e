// Sound clips that are unlike most: each gives the frames, times and pixels that the ffmpeg program
// decodes from it.

#include <cmath>
#include <cstring>
#include <iterator>
#include <sstream>

#include "host/media/colour_model.h"
#include "host/media/frame_index.h"
#include "tests/host/media/clip_fixture.h"

namespace calmframe::media {
namespace {

class UnusualMediaTest : public ClipTest {
 protected:
  // Seconds of the frames, in the order shown.
  static std::vector<double> TimesOf(const std::string& path) {
    std::istringstream times(Output(
        "ffprobe -v error -select_streams V:0 -show_entries frame=best_effort_timestamp_time "
        "-of default=nk=1:nw=1 '" +
        path + "'"));
    return {std::istream_iterator<double>(times), {}};
  }

  // Times of a clip's frames against those of the ffmpeg program, and its pixels against those that
  // it decoded to planes of green, blue, red and alpha.
  void ExpectAsDecoded(const std::string& name, std::size_t frames, const std::string& decoded) {
    const auto reader = ClipReader::Open(In(name));
    const ClipInfo& info = reader->info();
    EXPECT_EQ(info.warning, "");
    const std::vector<double> times = TimesOf(In(name));
    ASSERT_EQ(info.frame_count, frames);
    ASSERT_EQ(times.size(), frames);
    const double tick = static_cast<double>(info.time_base.num) / info.time_base.den;
    const std::size_t plane = static_cast<std::size_t>(info.width) * info.height;
    ASSERT_EQ(decoded.size(), 4 * plane * frames);
    for (std::size_t i = frames; i-- > 0;) {
      EXPECT_NEAR(static_cast<double>(info.times[i].pts) * tick, times[i], 1e-5) << i;
      const auto pixels = ReadFrame(*reader, i);
      const auto* green = reinterpret_cast<const std::uint8_t*>(decoded.data()) + 4 * plane * i;
      int sum = 0;
      for (std::size_t k = 0; k < plane; ++k) {
        const HX_Pixel8& p = pixels[k];
        sum += std::abs(p.green - green[k]) + std::abs(p.blue - green[k + plane]) +
               std::abs(p.red - green[k + 2 * plane]) + std::abs(p.alpha - green[k + 3 * plane]);
      }
      EXPECT_LT(sum / (4.0 * static_cast<double>(plane)), 0.5) << i;  // of 255, on average
    }
  }
};

// All are made by one run of the ffmpeg program, and decoded by another.
TEST_F(UnusualMediaTest, FramesTimesAndPixelsAreTheFilesOwn) {
  const std::string folder = "cd '" + In("") + "' && ffmpeg -nostdin -y -v error ";
  const std::string alpha = "-vf format=rgba,colorchannelmixer=ar=0.7:aa=0.2 -frames:v 3 -c:v ";
  const struct {
    std::string name, make;
    std::size_t frames;
  } clips[] = {
      {"one.mp4", "-frames:v 1 -c:v libx264", 1},
      {"two.mp4", "-frames:v 2 -c:v libx264 -bf 2", 2},
      {"gaps.mkv", "-vf 'setpts=N+20*floor(N/4)' -vsync passthrough -c:v ffv1", 25},
      {"vfr.mp4", "-vf select='mod(n\\,5)' -vsync vfr -c:v libx264", 20},
      {"late.ts", "-c:v libx264 -bf 2 -output_ts_offset 5000", 25},
      {"negative.nut", "-c:v mpeg4 -bsf:v setts=ts=TS-9", 25},
      {"edited.mp4", "-map 1 -c:v libx264 -bf 2 -c:a aac", 12},
      {"attached.mkv", "-c:v libx264 -attach cover.png -metadata:s:t mimetype=image/png", 25},
      {"streams.mkv", "-map 2 -map 1 -c:v ffv1 -c:a flac -disposition:v:0 default", 25},
      {"alpha.mov", alpha + "qtrle", 3},
      {"alpha.mkv", alpha + "ffv1 -pix_fmt yuva444p", 3},
      {"open.mp4",
       "-pix_fmt yuv420p10le -c:v libx265 -x265-params log-level=none:keyint=6:open-gop=1", 25},
      {"still.avi", "-frames:v 3 -c:v mjpeg -pix_fmt yuvj422p", 3},
      {"vp9.webm", "-frames:v 5 -c:v libvpx-vp9 -deadline realtime -cpu-used 8", 5},
      {"palette.gif", "-frames:v 4 -vf split[a][b],[a]palettegen[p],[b][p]paletteuse", 4},
      {"mono.nut", "-frames:v 3 -c:v rawvideo -pix_fmt monow", 3},
      {"odd.mkv", "-frames:v 5 -vf crop=97:65 -c:v ffv1 -pix_fmt yuv420p", 5},
      {"411.mkv", "-frames:v 3 -c:v ffv1 -pix_fmt yuv411p", 3},
  };
  Ffmpeg("-f lavfi -i color=red:s=32x32 -frames:v 1 " + In("cover.png"));
  std::string make =
      "-f lavfi -i testsrc=s=98x66:r=25:d=1,gblur=3 -f lavfi -i sine=d=1 "
      "-f lavfi -i color=s=32x32:d=1 ";
  std::string inputs, decode;
  for (const auto& clip : clips) {
    const std::string input = std::to_string(&clip - clips);
    make += (clip.name == "streams.mkv" ? "-map 1 -map 0 " : "-map 0 ") + clip.make + " " +
            (clip.name == "edited.mp4" ? "whole.mp4" : clip.name) + " ";
    inputs += "-i " + clip.name + " ";
    // The program takes chroma as centred whatever the file says.
    decode += "-map " + input +
              ":V:0 -vsync passthrough "
              "-vf scale=flags=bicubic+accurate_rnd+full_chroma_int+full_chroma_inp" +
              (clip.name == "still.avi" ? "" : ":in_h_chr_pos=0") +
              " -pix_fmt gbrap -f rawvideo decoded" + input + " ";
  }
  Output(folder + make);
  Output(folder + "-ss 0.5 -i whole.mp4 -c copy edited.mp4");
  Output(folder + inputs + decode);
  for (const auto& clip : clips) {
    SCOPED_TRACE(clip.name);
    ExpectAsDecoded(clip.name, clip.frames, Content("decoded" + std::to_string(&clip - clips)));
  }
}

TEST_F(UnusualMediaTest, EveryTurnAndMirrorImage) {
  Ffmpeg("-f lavfi -i testsrc=s=64x32:r=25:d=0.1,setsar=2/1 -c:v libx264rgb -qp 0 " +
         In("flat.mp4"));
  const auto flat = ReadFrame(*ClipReader::Open(In("flat.mp4")), 1);
  const std::string bytes = Content("flat.mp4");
  const std::size_t matrix = bytes.find("tkhd") + 44;
  constexpr int kMatrices[][4] = {{1, 0, 0, 1},  {0, 1, -1, 0}, {-1, 0, 0, -1}, {0, -1, 1, 0},
                                  {-1, 0, 0, 1}, {1, 0, 0, -1}, {0, 1, 1, 0},   {0, -1, -1, 0}};
  for (const auto& [a, b, c, d] : kMatrices) {
    SCOPED_TRACE(testing::Message() << a << " " << b << " " << c << " " << d);
    std::string turned = bytes;
    const int entries[] = {a, b, 0, c, d};  // 16.16, big-endian
    for (std::size_t i = 0; i < 5; ++i) {
      turned[matrix + 4 * i] = static_cast<char>(-(entries[i] < 0));
      turned[matrix + 4 * i + 1] = static_cast<char>(entries[i]);
      turned[matrix + 4 * i + 2] = turned[matrix + 4 * i + 3] = 0;
    }
    MakeFile("turned.mp4", turned);
    const auto reader = ClipReader::Open(In("turned.mp4"));
    const int width = a != 0 ? 64 : 32;
    ASSERT_EQ(reader->info().width, width);
    const Ratio aspect = reader->info().pixel_aspect;
    EXPECT_EQ(aspect.num * (a != 0 ? 1 : 2), aspect.den * (a != 0 ? 2 : 1));
    const auto shown = ReadFrame(*reader, 1);
    int wrong = 0;
    for (int y = 0; y < 32; ++y) {
      for (int x = 0; x < 64; ++x) {
        // A stored point (x, y) is shown at (a x + c y, b x + d y), counted from the picture's
        // edge.
        const int to_x = a * x + c * y + (a < 0 ? 63 : 0) + (c < 0 ? 31 : 0);
        const int to_y = b * x + d * y + (b < 0 ? 63 : 0) + (d < 0 ? 31 : 0);
        wrong += std::memcmp(&shown[to_y * width + to_x], &flat[y * 64 + x], 4) != 0;
      }
    }
    EXPECT_EQ(wrong, 0);
  }
}

TEST_F(UnusualMediaTest, FieldsInBothOrders) {
  for (const bool top : {true, false}) {
    Ffmpeg(std::string("-f lavfi -i testsrc2=s=64x64:r=50:d=0.4 -vf interlace=lowpass=off:scan=") +
           (top ? "tff" : "bff") + " -c:v libx264 -flags +ilme+ildct -x264-params " +
           (top ? "tff" : "bff") + "=1 " + In("i.ts"));
    // Told by the frames alone.
    EXPECT_EQ(ClipReader::Open(In("i.ts"))->info().field_order,
              top ? FieldOrder::top_first : FieldOrder::bottom_first);
    // Upside down, the other field's rows are on top.
    Ffmpeg("-i " + In("i.ts") + " -c copy -metadata:s:v rotate=180 " + In("turned.mp4"));
    EXPECT_EQ(ClipReader::Open(In("turned.mp4"))->info().field_order,
              top ? FieldOrder::bottom_first : FieldOrder::top_first);
  }
}

TEST_F(UnusualMediaTest, SizeThatChangesOnTheWayIsThatOfTheFirstFrame) {
  Ffmpeg("-f lavfi -i testsrc=s=64x48:r=25:d=0.4 -c:v libx264 " + In("a.ts"));
  Ffmpeg("-f lavfi -i testsrc=s=96x80:r=25:d=0.4 -c:v libx264 -pix_fmt yuv444p " + In("b.ts"));
  MakeFile("c.ts", Content("a.ts") + Content("b.ts"));
  const auto reader = ClipReader::Open(In("c.ts"));
  ASSERT_EQ(reader->info().frame_count, 20u);
  EXPECT_EQ(reader->info().width, 64);
  const auto last = ReadFrame(*reader, 19);
  Ffmpeg("-i " + In("b.ts") + " -vf scale=64:48:flags=bicubic -c:v ffv1 " + In("d.mkv"));
  const auto expected = ReadFrame(*ClipReader::Open(In("d.mkv")), 9);
  double sum = 0;
  for (std::size_t i = 0; i < last.size(); ++i) sum += std::abs(last[i].green - expected[i].green);
  EXPECT_LT(sum / static_cast<double>(last.size()), 4);
}

TEST_F(UnusualMediaTest, TimesBeyondAnyClockAreNone) {
  for (const char* times : {"ts=9.2e18+4096*N", "ts=if(eq(N\\,2)\\,9.2e18\\,2048*N)",
                            "pts=if(eq(N\\,2)\\,5e17\\,PTS)", "ts=-9.2e18+2048*N"}) {
    SCOPED_TRACE(times);
    Ffmpeg("-f lavfi -i testsrc2=s=64x48:r=25:d=0.2 -c:v mpeg4 -bsf:v \"setts=" +
           std::string(times) + "\" " + In("far.nut"));
    const ClipInfo info = ClipReader::Open(In("far.nut"))->info();
    ASSERT_EQ(info.frame_count, 5u);
    EXPECT_GT(info.frame_rate.num, 0);
    EXPECT_GT(info.frame_rate.den, 0);
    // A 25th of a second.
    for (std::size_t i = 1; i < 5; ++i) EXPECT_EQ(info.times[i].pts - info.times[i - 1].pts, 2048);
    EXPECT_LT(std::abs(info.times[4].pts), std::int64_t{1} << 61);
  }
}

// An MPEG-4 header tells eight bits, and FFmpeg hands them on.
TEST_F(UnusualMediaTest, ColoursThatThereAreNotAreNotTold) {
  const FramePtr frame = NewFrame();
  const ColourTags silent = TagsOf(*frame);
  for (const int known : {1, 206}) {
    std::memcpy(&frame->color_primaries, &known, sizeof known);
    std::memcpy(&frame->color_trc, &known, sizeof known);
    std::memcpy(&frame->colorspace, &known, sizeof known);
    std::memcpy(&frame->color_range, &known, sizeof known);
    std::memcpy(&frame->chroma_location, &known, sizeof known);
    EXPECT_EQ(TagsOf(*frame), known == 1 ? (ColourTags{1, 1, 1, 1, 1}) : silent);
  }
}

TEST_F(UnusualMediaTest, WhatIsTooMuchIsRefusedInOneLine) {
  Ffmpeg("-f lavfi -i testsrc=s=64x48:r=25:d=0.4 -c:v mpeg4 " + In("many.avi"));
  ClipInfo info;
  EXPECT_THAT([&] { ScanFrames(In("many.avi"), info, 9); },
              Fails(Failure::Side::input, In("many.avi") + ": more than 9 frames"));
  EXPECT_EQ(ScanFrames(In("many.avi"), info, 10).size(), 10u);

  Ffmpeg("-f lavfi -i color=s=7680x4320 -frames:v 1 -c:v mjpeg " + In("8k.mov"));
  EXPECT_EQ(ClipReader::Open(In("8k.mov"))->info().width, 7680);
  MakeFile("huge.y4m", "YUV4MPEG2 W16000 H16000 F25:1 Ip A1:1 C420jpeg\nFRAME\n");
  EXPECT_THAT(
      [&] { ClipReader::Open(In("huge.y4m")); },
      Fails(Failure::Side::input, testing::HasSubstr("16000 x 16000 pixels are too large")));
  Ffmpeg("-f lavfi -i sine=d=1 " + In("sound.wav"));
  EXPECT_THAT([&] { ClipReader::Open(In("sound.wav")); },
              Fails(Failure::Side::input, testing::Ne("")));
}

}  // namespace
}  // namespace calmframe::media
