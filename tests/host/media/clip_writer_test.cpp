#include <sys/resource.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <sstream>

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
  // Without its sound it isn't written.
  std::filesystem::remove(In("in.mp4"));
  const auto silent = [&] { ClipWriter::Create(In("silent.mp4"), info, 64, 48, {}); };
  EXPECT_THAT(silent, Fails(Failure::Side::input, HasSubstr("in.mp4: No such file")));
  EXPECT_FALSE(std::filesystem::exists(In("silent.mp4")));
}

double StartOf(const std::string& path) {
  return std::stod(Output(
      "ffprobe -v error -select_streams v -show_entries stream=start_time -of csv=p=0 " + path));
}

// Where the first loud sample is, and the last one of all, in seconds from the first frame.
struct Sound {
  double beep, end;
};
Sound SoundOf(const std::string& path) {
  constexpr int kRate = 48000;
  const std::string heard =
      Output("ffmpeg -v error -copyts -i " + path +
             " -map 0:a -af aresample=async=1:first_pts=0 -ac 1 -ar 48000 -f s16le -");
  std::vector<std::int16_t> samples(heard.size() / 2);
  std::memcpy(samples.data(), heard.data(), 2 * samples.size());
  const auto beep = std::find_if(samples.begin(), samples.end(),
                                 [](std::int16_t sample) { return std::abs(sample) > 1000; });
  const auto seconds = [&](auto place) {
    return static_cast<double>(place - samples.begin()) / kRate - StartOf(path);
  };
  return {seconds(beep), seconds(samples.end())};
}

// Ten seconds in, of half an hour by its clock: a beep of a tenth of a second 0.5 s after the cut,
// captions before, in and behind it.
TEST_F(ClipTest, APartTakesWhatLiesWithinItAndStaysInTime) {
  MakeFile("s.srt",
           "1\n00:00:02,000 --> 00:00:03,000\ngone\n\n2\n00:00:09,500 --> 00:00:10,400\ninto\n\n"
           "3\n00:00:10,600 --> 00:00:10,800\nwhole\n\n4\n00:00:11,200 --> 00:00:13,000\nout\n");
  MakeFile("chapters",
           ";FFMETADATA1\n[CHAPTER]\nTIMEBASE=1/1000\nSTART=0\nEND=9000\ntitle=A\n[CHAPTER]\n"
           "TIMEBASE=1/1000\nSTART=9000\nEND=11000\ntitle=B\n[CHAPTER]\nTIMEBASE=1/1000\n"
           "START=11000\nEND=14000\ntitle=C\n");
  const std::string sound =
      "-f lavfi -i \"aevalsrc='sin(2*PI*2000*t)*between(t,10.5,10.6):s=48000:d=14'\" ";
  const struct {
    const char *in, *out, *codecs;
  } cases[] = {{"a.mp4", "part.mp4", "-c:a aac -c:s mov_text"},
               {"a.mkv", "part.mkv", "-c:a aac -c:s srt"},
               {"a.mov", "part.mov", "-c:a pcm_s16le -c:s mov_text"},
               {"b.mp4", "opus.mp4", "-c:a libopus -sn"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.in << " to " << c.out);
    Ffmpeg("-f lavfi -i testsrc2=s=64x48:r=30:d=14 " + sound + "-i " + In("s.srt") + " -i " +
           In("chapters") +
           " -map 0 -map 1 -map 2 -map_chapters 3 -vf \"select='not(eq(mod(n,7),3))'\" -vsync vfr "
           "-c:v libx264 -g 30 -timecode 00:30:00:00 -t 14 " +
           c.codecs + " " + In(c.in));
    const auto reader = ClipReader::Open(In(c.in));
    const ClipInfo& whole = reader->info();
    const auto seconds = [](const ClipInfo& clip, std::size_t i) {
      return static_cast<double>(clip.times[i].pts - clip.times[0].pts) * clip.time_base.num /
             clip.time_base.den;
    };
    FrameRange range{0, whole.frame_count};
    while (seconds(whole, range.first) < 9.9999) ++range.first;
    while (seconds(whole, range.end - 1) > 11.9999) --range.end;
    const ClipInfo part = PartOf(whole, range);
    WriteClip(In(c.out), part, [&](int frame, HX_Pixel8* pixels) {
      reader->Read(range.first + static_cast<std::size_t>(frame), pixels, 64 * 4);
    });
    const auto written = ClipReader::Open(In(c.out));
    ASSERT_EQ(written->info().frame_count, range.size());
    for (std::size_t i = 0; i < range.size(); ++i) {
      EXPECT_NEAR(seconds(written->info(), i),
                  seconds(whole, range.first + i) - seconds(whole, range.first), 0.00101);
    }
    const Sound before = SoundOf(In(c.in)), after = SoundOf(In(c.out));
    EXPECT_NEAR(after.beep, before.beep - seconds(whole, range.first), 0.0011);
    // No more of it than a packet.
    const double length =
        seconds(part, range.size() - 1) +
        static_cast<double>(part.times.back().duration) * part.time_base.num / part.time_base.den;
    EXPECT_NEAR(after.end, length, 0.022);
    const double zero = StartOf(In(c.out));
    // Of B the second half; Matroska's own clock begins with the sound's priming.
    std::istringstream chapters(Output(
        "ffprobe -v error -show_entries chapter=start_time,end_time -of csv=p=0 " + In(c.out)));
    double from, to;
    for (const auto& [begins, ends] : {std::pair{0.0, 1.0}, {1.0, 2.033}}) {
      char comma;
      chapters >> from >> comma >> to;
      EXPECT_NEAR(from, begins, 0.022);
      EXPECT_NEAR(to, ends, 0.022);
    }
    EXPECT_FALSE(chapters >> from) << "a third one";
    if (std::string(c.in) == "a.mov") {
      EXPECT_THAT(Output("ffprobe -v error -show_entries stream_tags=timecode " + In(c.out)),
                  HasSubstr("00:30:09:23"));  // 257 frames on, 26 to a second
    }
    // Begin, length and bytes; of those without a text two.
    std::istringstream packets(Output(
        "ffprobe -v error -select_streams s -show_entries packet=pts_time,duration_time,size "
        "-of csv=p=0 " +
        In(c.out)));
    std::vector<std::array<double, 2>> texts;
    double begin, lasts;
    for (char comma; packets >> begin >> comma >> lasts >> comma;) {
      int size;
      packets >> size;
      if (size > 2) texts.push_back({begin - zero, lasts});
    }
    const std::vector<std::array<double, 2>> expected = {{0, 0.4}, {0.6, 0.2}, {1.2, 0.8}};
    ASSERT_EQ(texts.size(), std::string(c.codecs).find("-sn") == std::string::npos ? 3u : 0u);
    for (std::size_t i = 0; i < texts.size(); ++i) {
      EXPECT_NEAR(texts[i][0], expected[i][0], 0.002) << i;
      EXPECT_NEAR(texts[i][1], expected[i][1], i == 2 ? 0.04 : 0.002) << i;
    }
  }
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

// By what x264 writes of itself into the stream; the numbers of its presets are its manual's.
TEST_F(ClipTest, EncodersAreSetAsAsked) {
  const struct {
    std::string preset;
    std::vector<std::string> options;
    const char* says;
  } cases[] = {{"", {}, "subme=7"},
               {"", {}, "crf=18.0"},
               {"ultrafast", {}, "subme=0"},
               {"draft", {}, "subme=2"},
               {"slower", {"crf=31"}, "crf=31.0"},
               {"slower", {}, "subme=9"},
               {"", {"g=7", "g=9"}, "keyint=9"},
               {"", {"b=300k"}, "rc=abr"},
               {"", {"x264-params=ref=2:me=umh"}, "ref=2"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.says);
    WriteClip<HX_Pixel16>(In("o.mp4"), Made(96, 64, 3, 25), Gradient{96, 64},
                          {.codec = "libx264",
                           .pixel_format = "",
                           .preset = c.preset,
                           .options = c.options,
                           .overwrite = true});
    EXPECT_THAT(Content("o.mp4"), HasSubstr(std::string(" ") + c.says));
  }
}

TEST_F(ClipTest, WhatAnEncoderDoesNotTakeIsToldInOneLine) {
  const struct {
    const char *out, *codec, *preset, *option, *says;
  } cases[] = {{"o.mp4", "", "veryfst", "", "did you mean veryfast?"},
               {"o.webm", "", "quick", "", "libvpx-vp9 also takes numbers"},
               {"o.webm", "", "99", "", "option cpu-used of encoder libvpx-vp9 doesn't take '99'"},
               {"o.mov", "prores", "fast", "", "prores has no such setting"},
               {"o.mp4", "", "", "crff=3", "has no option 'crff'; did you mean crf?"},
               {"o.mp4", "", "", "time_base=1/9", "has no option 'time_base'"},
               {"o.mp4", "", "", "g=often", "option g of encoder libx264 doesn't take 'often'"},
               {"o.mp4", "", "", "tune=film,grian", "'grian' is none of film, "},
               {"o.mp4", "", "", "x264-params=nosuch=2", "nosuch"},
               {"o.mp4", "libx265", "", "x265-params=nosuch=2", "nosuch"},
               {"o.mkv", "libsvtav1", "", "svtav1-params=nosuch=2", "nosuch"},
               {"o.mp4", "h264_amf_vulkan", "", "", "built without encoder h264_amf_vulkan"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.says);
    const auto create = [&] {
      std::vector<std::string> options;
      if (*c.option) options.emplace_back(c.option);
      ClipWriter::Create(
          In(c.out), Made(96, 64, 3, 25), 96, 64,
          {.codec = c.codec, .pixel_format = "", .preset = c.preset, .options = options});
    };
    EXPECT_THAT(create, Fails(Failure::Side::output, HasSubstr(c.says)));
  }
  EXPECT_TRUE(std::filesystem::is_empty(In("")));
}

// SVT-AV1 by itself never ends then.
TEST_F(ClipTest, AWriterThatGetsNoFrameEnds) {
  for (const char* codec : {"libsvtav1", "libvpx-vp9", "libaom-av1", "libx265"}) {
    ClipWriter::Create(In("o.mkv"), Made(96, 64, 3, 25), 96, 64,
                       {.codec = codec, .pixel_format = ""});
  }
  EXPECT_TRUE(std::filesystem::is_empty(In("")));
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
