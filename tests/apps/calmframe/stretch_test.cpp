#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

class StretchTest : public ProgramTest {
 protected:
  // Three seconds of a street at 30 frames a second, with a beep of a tenth of a second at 1.5 s.
  void MakeBeep(const std::string& name) const {
    MakeClip("mute.mkv", 160, 120, 90);
    const Outcome muxed =
        Shell("cd '" + path().string() +
              "' && ffmpeg -v error -y -i mute.mkv -f lavfi -i \"aevalsrc='sin(2*PI*2000*t)*"
              "between(t,1.5,1.6):d=3'\" -c:v copy -c:a aac -shortest " +
              name);
    ASSERT_EQ(muxed.code, 0);
  }

  // When the beep begins, in seconds from the first frame's time.
  double BeepIn(const std::string& name) const {
    const std::string in = "cd '" + path().string() + "' && ";
    const std::string zero = Shell(in +
                                   "ffprobe -v error -select_streams v -show_entries "
                                   "stream=start_time -of csv=p=0 " +
                                   name)
                                 .text;
    const std::string heard = Shell(in + "ffmpeg -v error -copyts -i " + name +
                                    " -af aresample=async=1:first_pts=0 -ac 1 -ar 48000 -f u8 -")
                                  .text;
    const auto beep = std::find_if(heard.begin(), heard.end(), [](char sample) {
      return std::abs(static_cast<unsigned char>(sample) - 128) > 4;
    });
    return static_cast<double>(beep - heard.begin()) / 48000 - std::stod(zero);
  }
};

TEST_F(StretchTest, OnlyItsFramesAreWorkedAndWrittenWithTheirSound) {
  MakeBeep("in.mp4");
  const std::string work = " --project p.calm --crf 0 ";
  RunWell("stabilize in.mp4 out.mkv --from 1 --to 0:02.5" + work);
  const auto whole = ClipReader::Open(Path("out.mkv"));
  ASSERT_EQ(whole->info().frame_count, 45u);
  EXPECT_NEAR(BeepIn("out.mkv"), 0.5, 0.004);
  // Nothing else was analysed.
  EXPECT_THAT(RunWell("info p.calm"), HasSubstr("45 frames of 160x120 from 30,"));
  EXPECT_THAT(RunWell("analyze in.mp4 --from 30f --to 75f"), HasSubstr("in.mp4: 45 frames"));

  // Saved work keeps its stretch, and gives parts of it, by frames and times of the clip.
  const std::string reused = "p.calm: reused the analysis, the solve and the framing\n";
  for (const char* flags : {"", " --from 0:01 --to 75f"}) {
    EXPECT_THAT(RunWell("stabilize in.mp4 again.mkv --overwrite" + work + flags),
                HasSubstr(reused));
  }
  EXPECT_THAT(RunWell("render part.mp4 --from 40 --to 0:02" + work), HasSubstr(reused));
  EXPECT_NEAR(BeepIn("part.mp4"), 1.5 - 40 / 30.0, 0.004);
  const auto again = ClipReader::Open(Path("again.mkv")), part = ClipReader::Open(Path("part.mp4"));
  ASSERT_EQ(again->info().frame_count, 45u);
  ASSERT_EQ(part->info().frame_count, 20u);
  for (std::size_t f = 0; f < 45; ++f) {
    const auto expected = ReadFrame(*whole, f);
    EXPECT_TRUE(SamePixels(ReadFrame(*again, f), expected)) << f;
    if (f >= 10 && f < 30) {
      EXPECT_TRUE(SamePixels(ReadFrame(*part, f - 10), expected)) << f;
    }
  }
  for (const char* command : {"stabilize in.mp4 x.mkv --from 1.5", "analyze in.mp4 --from 0",
                              "render x.mkv --from 10", "render x.mkv --to 0:03"}) {
    ExpectLine(command + std::string(" --quiet --project p.calm"), 2,
               "p.calm: holds work from 0:01 to 0:02.5 of the clip, frames 30 to 75");
  }
  EXPECT_THAT(RunWell("report p.calm p.html"), HasSubstr("45/45"));
  EXPECT_THAT(Content("p.html"), HasSubstr("45 frames, 1.5 s, from 0:01"));

  // The same frames as a clip of their own come out the same.
  RunWell("stabilize in.mp4 steady.mkv --from 30f --to 75f --crf 0 --window steady");
  ASSERT_EQ(Shell("cd '" + path().string() +
                  "' && ffmpeg -v error -i in.mp4 -vf trim=start_frame=30:end_frame=75,"
                  "setpts=PTS-STARTPTS -an -c:v ffv1 cut.mkv")
                .code,
            0);
  RunWell("stabilize cut.mkv own.mkv --crf 0 --window steady");
  const auto steady = ClipReader::Open(Path("steady.mkv")), own = ClipReader::Open(Path("own.mkv"));
  for (std::size_t f = 0; f < 45; ++f) {
    EXPECT_TRUE(SamePixels(ReadFrame(*steady, f), ReadFrame(*own, f))) << f;
  }
}

TEST_F(StretchTest, WhatIsNoneIsToldInOneLine) {
  MakeClip("in.mkv", 64, 48, 90);
  const struct {
    const char *flags, *part;
  } cases[] = {
      {"--from 3", "--from 3 lies behind the last frame: the clip has 90 frames and ends at 0:03"},
      {"--from 0:00:02.99 --to 9", "--from 0:00:02.99 lies behind"},
      {"--from 90f", "--from 90f lies behind"},
      {"--to 91f", "--to 91f lies behind"},
      {"--from 0:02 --to 0:01", "--to 0:01 must lie behind --from 0:02"},
      {"--from 1 --to 30f", "--to 30f must lie behind --from 1"},
      {"--from 1.01 --to 1.02", "--to 1.02 must lie behind --from 1.01"},
      {"--to 0", "--to 0 must lie behind the clip's first frame"},
      {"--from -1", "-1 is out of range: 0 or more"},
      {"--from=-0:01", "-0:01 is out of range: 0 or more"},
      {"--from 1:75", "'1:75' is no time"},
      {"--from 1:2:03", "'1:2:03' is no time"},
      {"--from 0:0:0:1", "'0:0:0:1' is no time"},
      {"--from nan", "'nan' is no time"},
      {"--from 1e3", "'1e3' is no time"},
      {"--from 1.5f", "'1.5f' is no time"},
      {"--from \"\"", "is no time"}};
  for (const auto& c : cases) {
    ExpectLine(std::string("stabilize in.mkv x.mkv --quiet ") + c.flags, 2, c.part);
  }
  EXPECT_FALSE(fs::exists(Path("x.mkv")));
  // A frame belongs to the time that is written for it in milliseconds, and the end to no frame.
  for (const auto& [flags, frames] : {std::pair{"--from 2.967", "1 frame "},
                                      {"--from 0:02.933 --to 0:59", "2 frames "},
                                      {"--from 88f --to 89f", "1 frame "}}) {
    EXPECT_THAT(RunWell(std::string("analyze in.mkv --quiet ") + flags), HasSubstr(frames));
  }
}

}  // namespace
}  // namespace calmframe
