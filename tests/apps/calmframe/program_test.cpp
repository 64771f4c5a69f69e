#include <cstdlib>
#include <map>
#include <nlohmann/json.hpp>
#include <random>
#include <sstream>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

using ::testing::Not;

Camera AlongTheWall(double time) {
  return {10 * time, 0, 0, 1};
}

TEST_F(ProgramTest, ClipsOfAnyShapeKeepTheirFramesAndSize) {
  const struct {
    int width, height, frames;
    const char* flags;
  } cases[] = {{160, 120, 24, ""},
               {160, 120, 1, ""},
               {90, 160, 6, "--method position --framing crop"},
               {161, 121, 12, "--result no-motion --framing stabilize-only --depth 16"},
               {20, 20, 3, "--depth 32 --crop-less-smooth-more 100"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::to_string(c.width) + "x" + std::to_string(c.height) + " " + c.flags);
    MakeClip("in.mp4", c.width, c.height, c.frames);
    EXPECT_EQ(RunWell(std::string("stabilize in.mp4 out.mp4 --quiet ") + c.flags), "");
    const auto reader = ClipReader::Open(Path("out.mp4"));
    EXPECT_EQ(reader->info().frame_count, static_cast<std::size_t>(c.frames));
    EXPECT_EQ(reader->info().width, c.width);
    EXPECT_EQ(reader->info().height, c.height);
    EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "out.mp4"));
    fs::remove(Path("in.mp4"));
    fs::remove(Path("out.mp4"));
  }
}

// Each field is steadied for its own instant and gives its own lines: where nothing is smoothed
// away an interlaced clip comes out about as it went in.
TEST_F(ProgramTest, FieldsKeepTheirLines) {
  for (const auto order : {media::FieldOrder::top_first, media::FieldOrder::bottom_first}) {
    media::ClipInfo info = Made(160, 120, 10, 25);
    info.field_order = order;
    MakeWall("in.mkv", info, AlongTheWall);
    RunWell(
        "stabilize in.mkv out.mkv --overwrite --quiet --smoothness 0 --method position "
        "--framing stabilize-only");
    const auto in = ClipReader::Open(Path("in.mkv")), out = ClipReader::Open(Path("out.mkv"));
    EXPECT_EQ(out->info().field_order, order);
    double off = 0;
    for (std::size_t f = 0; f < 10; ++f) {
      const auto a = ReadFrame(*in, f), b = ReadFrame(*out, f);
      for (std::size_t i = 0; i < a.size(); ++i) off += std::abs(a[i].green - b[i].green);
    }
    EXPECT_LT(off / 10 / 160 / 120, 2.5);  // of lines of the other field it is twice that
    fs::remove(Path("in.mkv"));
  }
}

TEST_F(ProgramTest, ADeepClipIsDrawnDeep) {
  MakeWall("in.mkv", Made(160, 120, 10, 25), AlongTheWall,
           {.codec = "", .pixel_format = "yuv420p10le"});
  const auto drawn = [this](const std::string& flags) {
    RunWell("stabilize in.mkv - --quiet " + flags + " >out.y4m");
    return Content("out.y4m");
  };
  const std::string deep = drawn("");
  EXPECT_THAT(deep.substr(0, deep.find('\n')), HasSubstr("p10"));
  EXPECT_TRUE(drawn("--depth 16") == deep);
  EXPECT_FALSE(drawn("--depth 8") == deep);
  // Soft edges are laid over each other at 16 bits, of an 8-bit clip too.
  fs::remove(Path("in.mkv"));
  MakeWall("in.mkv", Made(160, 120, 10, 25), AlongTheWall);
  const std::string filled = drawn("--framing synthesize-edges");
  EXPECT_TRUE(drawn("--framing synthesize-edges --depth 16") == filled);
  EXPECT_FALSE(drawn("--framing synthesize-edges --depth 8") == filled);
}

TEST_F(ProgramTest, APipeGetsWhatItsCodecNeedsAndIsToldOfEachTagThatIsDropped) {
  media::ClipInfo info = Made(64, 48, 5, 25);
  info.colour = {1, 1, 1, 1, 2};
  MakeWall("in.mkv", info, AlongTheWall);
  const std::string dropped = "(primaries bt709, transfer bt709, matrix bt709)";
  for (const std::string codec : {"", "rawvideo", "libx264", "wrapped_avframe"}) {
    SCOPED_TRACE(codec);
    RunWell("stabilize in.mkv - " + (codec.empty() ? "" : "--quiet --codec " + codec) +
            " 2>log >out");
    const media::ClipInfo piped = ClipReader::Open(Path("out"))->info();
    EXPECT_EQ(piped.frame_count, 5u);
    if (codec == "rawvideo" || codec == "libx264") {
      EXPECT_EQ(piped.colour, info.colour);
      EXPECT_EQ(Content("log"), "");
    } else {
      EXPECT_EQ(piped.codec, "rawvideo");
      EXPECT_EQ(piped.colour, (media::ColourTags{2, 2, 2, 1, 2}));
      EXPECT_THAT(Content("log"),  // before any work
                  ::testing::StartsWith("calmframe: standard output: raw frames don't tell the "
                                        "clip's colour tags " +
                                        dropped));
    }
  }
}

TEST_F(ProgramTest, PipesAndPicturesGoInAndPicturesComeOut) {
  MakeClip("in.mp4", 64, 48, 5);
  // Lossless: x264's choices for so small a picture go by what its memory held before.
  RunWell("stabilize in.mp4 file.mkv --quiet --codec ffv1");
  for (const std::string name : {"-", "/dev/stdin"}) {
    EXPECT_EQ(
        Run("stabilize " + name + " piped.mkv --quiet --overwrite --codec ffv1", "cat in.mp4 | ")
            .text,
        "");
    EXPECT_TRUE(SamePixels(ReadFrame(*ClipReader::Open(Path("piped.mkv")), 4),
                           ReadFrame(*ClipReader::Open(Path("file.mkv")), 4)));
  }
  RunWell("stabilize in.mp4 made/ --quiet");
  ExpectLine("stabilize in.mp4 made/", 4, "made/000001.png: exists already");
  ExpectLine("stabilize in.mp4 made", 4, "is a directory; with a / at its end");
  ExpectLine("stabilize - no.mkv </dev/null", 3, "neither a file nor a pipe");
  ExpectLine("stabilize in.mp4 f.png", 4, "f%04d.png");
  ExpectLine("stabilize made made/ --overwrite", 4, "is the input itself");
  ExpectLine("stabilize in.mp4 no/f%d.png", 4, "there is no folder no/");
  RunWell("analyze made --project p.calm --quiet");
  RunWell("render --project p.calm f%02d.jpg --quiet");
  const auto in = ClipReader::Open(Path("made")), out = ClipReader::Open(Path("f*.jpg"));
  ASSERT_EQ(out->info().frame_count, 5u);
  const auto a = ReadFrame(*in, 2), b = ReadFrame(*out, 2);
  double off = 0;
  for (std::size_t i = 0; i < a.size(); ++i) off += a[i].red - b[i].red;
  EXPECT_NEAR(off / static_cast<double>(a.size()), 0, 2);  // the same range and matrix
  EXPECT_THAT(Files(), ::testing::ElementsAre("f01.jpg", "f02.jpg", "f03.jpg", "f04.jpg", "f05.jpg",
                                              "file.mkv", "in.mp4", "made", "p.calm", "piped.mkv"));
}

// Two pans that are too fast for one window, by a hand that shakes. No pixel of the wall is black.
TEST_F(ProgramTest, AWindowThatFollowsLeavesNothingBlackAndKeepsToItsZoom) {
  std::mt19937 random(4);
  std::vector<Camera> shake(80);
  for (Camera& camera : shake) {
    camera = {(random() % 100) * 0.06, (random() % 100) * 0.06, (random() % 100) * 0.0002};
  }
  const auto camera_at = [&](double time) {
    Camera camera = shake[static_cast<std::size_t>(time)];
    camera.x += 12 * std::min(std::abs(time - 40), 30.0);
    return camera;
  };
  // libx264's trees of macroblocks read memory that they have not set, so that its pixels may
  // differ from run to run, and the last run's zoom is near its limit.
  media::EncodeSettings lossless;
  lossless.codec = "ffv1";
  MakeWall("in.mkv", Made(160, 120, 80, 25), camera_at, lossless);
  struct Run {
    std::string flags, what;
    double most_zoom;
  };
  for (const Run& run :
       {Run{"", "by itself", 1.5}, Run{"--zoom-at-most 1.15", "limited", 1.15},
        Run{"--smoothness 80 --window follow", "asked for", 1.5},
        Run{"--smoothness 20", "where the effect's own leaves black", 1.5},
        Run{"--smoothness 80 --zoom-speed 0", "zoomed once for all", 1.5},
        Run{"--as-set --zoom-at-most 1.05", "limited, as set", 1.05},
        Run{"--framing synthesize-edges --zoom-at-most 1.2", "filled", 1.2},
        Run{"--framing synthesize-edges --zoom-at-most 1.05", "no room for a feather", 1.05}}) {
    const std::string told =
        RunWell("stabilize in.mkv out.mkv --codec ffv1 --overwrite " + run.flags);
    const std::size_t at = told.find("zoom ");
    ASSERT_NE(at, std::string::npos) << told;
    EXPECT_LE(std::stod(told.substr(at + 5)), run.most_zoom + 0.005) << run.what;
    const auto out = ClipReader::Open(Path("out.mkv"));
    for (int frame = 0; frame < 80; ++frame) {
      int black = 0;
      for (const auto& pixel : ReadFrame(*out, frame)) {
        black += pixel.red + pixel.green + pixel.blue < 12;
      }
      ASSERT_EQ(black, 0) << run.what << ", frame " << frame;
    }
  }
  // The effect's own, where it is asked for and where nothing is to be chosen.
  const auto content = [&](const std::string& flags) {
    RunWell("stabilize in.mkv out.y4m --quiet --overwrite " + flags);
    return Content("out.y4m");
  };
  EXPECT_TRUE(content("--smoothness 20 --as-set") == content("--smoothness 20 --window steady"));
  EXPECT_TRUE(content("--as-set") == content("--window steady"));
  EXPECT_FALSE(content("") == content("--window steady"));
  // From saved work, and on other processors, the same.
  const std::string filled = content("--framing synthesize-edges --threads 1 --project p.calm");
  RunWell("render --project p.calm out.y4m --quiet --overwrite --threads 2");
  EXPECT_TRUE(Content("out.y4m") == filled);
  EXPECT_FALSE(content("--framing synthesize-edges --window steady") == filled);
  ExpectLine("stabilize in.mkv x.mkv --codec ffv1 --quiet --window follow --framing stabilize-only",
             2, "needs --framing crop-auto-scale");
}

// A camera on a tripod can't be calmed, and its frames come out whole, to their edges.
TEST_F(ProgramTest, WhatNothingCalmsPassesThrough) {
  media::EncodeSettings lossless;
  lossless.codec = "ffv1";
  lossless.pixel_format = "yuv444p";
  MakeWall(
      "in.mkv", Made(160, 120, 12, 25), [](double) { return Camera{}; }, lossless);
  for (const std::string flags : {"", " --framing synthesize-edges"}) {
    EXPECT_THAT(RunWell("stabilize in.mkv out.mkv --codec ffv1 --quiet --json --overwrite" + flags),
                HasSubstr("\"window\":\"none\""));
    const auto in = ClipReader::Open(Path("in.mkv")), out = ClipReader::Open(Path("out.mkv"));
    for (const int frame : {0, 11}) {
      const auto a = ReadFrame(*in, frame), b = ReadFrame(*out, frame);
      double off = 0;
      for (std::size_t i = 0; i < a.size(); ++i) {
        ASSERT_NEAR(a[i].green, b[i].green, 8) << i << flags;
        off += std::abs(a[i].green - b[i].green);
      }
      EXPECT_LT(off / static_cast<double>(a.size()), 1.5);  // rounded to YUV twice
    }
  }
}

TEST_F(ProgramTest, AClipOfWhichNothingStaysInViewIsRefused) {
  MakeWall("in.mkv", Made(160, 120, 24, 25), AlongTheWall);
  ExpectLine("stabilize in.mkv out.mkv --quiet --result no-motion", 5,
             "in.mkv: no part of the picture stays in view; set --framing");
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mkv"));
  ExpectLine("analyze in.mkv --project p.calm --quiet --result no-motion", 5, "no part of the");
  ExpectLine("report p.calm p.html --quiet", 0, "no part of the");
  EXPECT_THAT(Content("p.html"), HasSubstr("Not steadied: nothing stays in view"));
  RunWell("analyze in.mkv --project p.calm --quiet --framing synthesize-edges");
  // Beside another shot it comes out as it was filmed.
  const std::string film = "stabilize in.mkv out.mkv --result no-motion --shots 4f --codec ffv1 ";
  EXPECT_THAT(RunWell(film + "--quiet"), HasSubstr("shot 2: in.mkv: no part of the picture stays"));
  const auto in = ClipReader::Open(Path("in.mkv")), out = ClipReader::Open(Path("out.mkv"));
  for (const int frame : {4, 23}) {
    double off = 0;
    const auto a = ReadFrame(*in, frame), b = ReadFrame(*out, frame);
    for (std::size_t i = 0; i < a.size(); ++i) off += std::abs(a[i].green - b[i].green);
    EXPECT_LT(off / static_cast<double>(a.size()), 1.5) << frame;  // rounded to YUV twice
  }
}

TEST_F(ProgramTest, ABannerIsToldInALineAndDrawnWhereItIsAskedFor) {
  // Of 160 pixels 45 stay in view, below two fifths.
  MakeWall("in.mkv", Made(160, 120, 24, 25), [](double t) { return Camera{5 * t}; });
  const std::string says =
      "24 of 24 frames could not be steadied as asked: To avoid extreme cropping set Framing to "
      "Stabilize Only or adjust other parameters.";
  const auto drawn = [&](const std::string& command) {
    EXPECT_THAT(RunWell(command + " o.mkv --overwrite --crf 0 --quiet"), HasSubstr(says + "\n"));
    return ReadFrame(*ClipReader::Open(Path("o.mkv")), 12);
  };
  const std::string work = "stabilize in.mkv --project p.calm --result no-motion --framing crop ";
  const auto bare = drawn(work + "--param \"Hide Warning Banner=off\"");
  EXPECT_TRUE(SamePixels(drawn("render --project p.calm"), bare));
  EXPECT_TRUE(SamePixels(drawn(work + "--hide-warning-banner"), bare));
  // Whatever saved work says of it, and a flat red bar from side to side.
  const auto with = drawn(work + "--param \"Hide Warning Banner=on\" --warning-banner");
  const auto is_red = [](const HX_Pixel8& p) { return p.red > p.blue + 90; };
  EXPECT_EQ(std::count_if(bare.begin(), bare.end(), is_red), 0);
  EXPECT_GE(std::count_if(with.begin(), with.end(), is_red), 160 * 4);
  EXPECT_TRUE(SamePixels(drawn("render --project p.calm --warning-banner"), with));
  EXPECT_THAT(Run("params --project p.calm").text, HasSubstr("now on\n"));
  EXPECT_THAT(RunWell("report p.calm p.html --quiet"), HasSubstr(says));
  EXPECT_THAT(Content("p.html"), HasSubstr(says + "</li>"));
}

TEST_F(ProgramTest, InputThatIsNoClip) {
  MakeFile("empty.mp4", "");
  MakeFile("garbage.mp4", std::string(5000, 'x'));
  MakeFile("notes.txt", "no video here\n");
  MakeClip("tiny.mp4", 2, 2, 4);
  for (const std::string input :
       {"missing.mp4", "empty.mp4", "garbage.mp4", "notes.txt", ".", "tiny.mp4"}) {
    ExpectLine("stabilize " + input + " out.mp4", 3, input);
    EXPECT_FALSE(fs::exists(Path("out.mp4")));
  }
}

TEST_F(ProgramTest, OutputThatMayNotBeWrittenCostsNoAnalysis) {
  MakeClip("in.mp4", 64, 48, 5);
  MakeFile("there.mp4", "precious");
  fs::create_symlink("in.mp4", Path("link.mp4"));
  fs::create_symlink("ring.mp4", Path("ring.mp4"));
  for (const std::string output :
       {"there.mp4", "in.mp4 --overwrite", "link.mp4 --overwrite", "ring.mp4", "out.unknown",
        "out.mp4 --codec nosuch", "out.mp4 --pixel-format nosuch"}) {
    ExpectLine("stabilize in.mp4 " + output, 4, "");
  }
  ExpectLine("stabilize in.mp4 out.mp4 --codec libx624", 4, "did you mean libx264?");
  ExpectLine("stabilize in.mp4 out.mp4 --pixel-format yuv420", 4, "did you mean yuv420p?");
  ExpectLine("stabilize in.mp4 out.mp4 --preset slowr", 4, "did you mean slow?");
  ExpectLine("stabilize in.mp4 out.mp4 --encoder-option tune=grian", 4, "did you mean grain?");
  if (!fs::exists("/dev/dri")) {
    ExpectLine("stabilize in.mp4 out.mp4 --codec h264_vaapi", 4, "h264_vaapi");
  }
  ExpectLine("stabilize in.mp4 no/such/folder.mp4", 4, "there is no folder no/such\n");
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "link.mp4", "ring.mp4", "there.mp4"));
  EXPECT_EQ(Content("there.mp4"), "precious");
  RunWell("stabilize in.mp4 there.mp4 --overwrite --quiet");
  EXPECT_EQ(ClipReader::Open(Path("there.mp4"))->info().frame_count, 5u);
  // An encoder that likes to talk, and the tag that players want.
  EXPECT_THAT(Run("stabilize in.mp4 there.mp4 --overwrite --quiet --codec hevc").text,
              Not(HasSubstr("x265 [")));
  EXPECT_THAT(Content("there.mp4"), HasSubstr("hvc1"));
}

TEST_F(ProgramTest, MistypedWordsAreAnsweredWithTheNearest) {
  const struct {
    const char* arguments;
    const char* part;
  } cases[] = {{"stabilise a b", "unknown command stabilise; did you mean stabilize?"},
               {"frobnicate", "unknown command frobnicate ("},
               {"help frobnicate", "unknown command frobnicate ("},
               {". b", ". is no command; to steady a clip: calmframe stabilize IN OUT"},
               {"--smoothness 3 stabilize a b", "the command comes first"},
               {"stabilize a b -q", "unknown flag -q ("},
               {"stabilize a b --smooth=3", "did you mean --smoothness?"},
               {"info a --smoothness 3", "unknown flag --smoothness (calmframe info --help"},
               {"stabilize a b c", "one word too many: c ("},
               {"stabilize a b --framing synthesise", "did you mean synthesize-edges?"},
               {"stabilize a b --smoothness 2000", "2000"},
               {"stabilize a b --smoothness nan", "nan"},
               {"stabilize a b --additional-scale=-inf", "inf"},
               {"stabilize a b --crf x", "'x' is no number"},
               {"stabilize a b --crf", "--crf takes a value"},
               {"stabilize a b --encoder-option g", "'g' is no KEY=VALUE"},
               {"stabilize a b --depth 12", "none of 8, 16, 32"},
               {"render --project a b --from -3", "0 or more"},
               {"params --param Smothness=3", "did you mean 'Smoothness'?"},
               {"params --param \"Maximum Scale=99\"", "100 to 10000"},
               {"params --param \"Method=Perspectiv\"", "did you mean Perspective?"},
               {"params --param Rank=4", "Rank: is experimental, which takes --experimental"},
               {"params --experimental --param \"Max Count, 0=auto=-1\"", "-1 is out of range: 0"},
               {"params --experimental --param \"Max Count, 0=autp=1\"", "'Max Count, 0=auto'"},
               {"params --param \"Hide Warning Banner=maybe\"", "neither on nor off"},
               {"params --param Smoothness", "NAME=VALUE"},
               {"stabilize a", "OUT"},
               {"", "calmframe stabilize IN OUT"}};
  for (const auto& c : cases) ExpectLine(c.arguments, 2, c.part);
  EXPECT_EQ(Run("stabilize --help").text, Run("help stabilize").text);
}

TEST_F(ProgramTest, ParametersAreListedWithWhatWasGiven) {
  EXPECT_THAT(RunWell("params --param smoothness=30 --method perspective"),
              ::testing::AllOf(HasSubstr("0 to 1000 (default 50), now 30\n"),
                               HasSubstr("(default Subspace Warp), now Perspective\n"),
                               Not(HasSubstr("AnalysisStatusCounter"))));
  // Each flag sets the parameter of its name, and no other one.
  const std::map<std::string, std::pair<std::string, double>> flags = {
      {"Smoothness", {"--smoothness 30", 30}},
      {"Result", {"--result no-motion", 2}},
      {"Framing", {"--framing crop", 2}},
      {"Method", {"--method position-scale-rotation", 2}},
      {"Maximum Scale", {"--maximum-scale 120", 120}},
      {"Crop Less <-> Smooth More", {"--crop-less-smooth-more 31", 31}},
      {"Additional Scale", {"--additional-scale 90", 90}},
      {"Action-safe Margin", {"--action-safe-margin 7", 7}},
      {"Detailed Analysis", {"--detailed-analysis", 1}},
      {"Rolling Shutter Ripple", {"--rolling-shutter-ripple enhanced", 2}},
      {"Synthesis Input Range (seconds)", {"--synthesis-input-range 0.25", 0.25}},
      {"Synthesis Edge Feather", {"--synthesis-edge-feather 6", 6}},
      {"Hide Warning Banner", {"--param \"Hide Warning Banner=on\"", 1}},
      {"Rank", {"--experimental --param Rank=4", 4}},
      {"Max Count, 0=auto", {"--param \"max count, 0=auto=7\"", 7}}};
  std::string all = "params --json";
  for (const auto& [name, flag] : flags) all += " " + flag.first;
  std::size_t given = 0;
  for (const auto& param : nlohmann::json::parse(Run(all).text)) {
    const auto flag = flags.find(param["name"]);
    given += flag != flags.end();
    EXPECT_EQ(param["value"],
              flag == flags.end() ? param["default"].get<double>() : flag->second.second)
        << param;
    if (param["name"] == "Rank") {
      EXPECT_EQ(param["id"], 203);
      EXPECT_EQ(param["default"], 9);
    }
  }
  EXPECT_EQ(given, flags.size());
}

// Only what the program chooses is told to differ, and numbers are those that were declared.
TEST_F(ProgramTest, SavedWorkHasTheValuesThatItWasGiven) {
  MakeClip("in.mp4", 64, 48, 5);
  RunWell("analyze in.mp4 --project p.calm --experimental --quiet");
  const std::string params = "params --experimental --project p.calm ";
  const std::string text = RunWell(params), differs = ", now ";
  EXPECT_THAT(text, HasSubstr("1 to 10 (default 5), now 3\n"));
  EXPECT_EQ(text.find(differs), text.rfind(differs)) << text;
  RunWell("analyze in.mp4 --project q.calm --experimental --param \"transition bisquare sigma=5\"");
  EXPECT_THAT(RunWell("params --experimental --project q.calm"), Not(HasSubstr(differs)));
  const std::string json = RunWell(params + "--json");
  for (const char* line : {"\"default\": 0.0045,", "\"value\": 0.0045\n", "\"min\": 0.001,"}) {
    EXPECT_THAT(json, HasSubstr(line));
  }
  RunWell(params + "--param \"Presmoothing Factor=0.001\"");
}

// A stage begins with nothing done, never falls back, and ends with all of it.
TEST_F(ProgramTest, JsonTellsHowFarEachStageIsAndHowItEnded) {
  const std::string no_utf8 = "in\xff.mp4";
  MakeClip(no_utf8, 160, 120, 30);
  const std::string told = Run("analyze " + no_utf8 + " --json").text;
  const auto last = nlohmann::json::parse(told.substr(told.rfind('\n', told.size() - 2) + 1));
  EXPECT_EQ(last["frames"], 30) << told;
  fs::rename(Path(no_utf8), Path("in.mp4"));
  std::vector<std::string> stages;
  std::map<std::string, std::vector<nlohmann::json>> shown;
  std::istringstream lines(
      RunWell("stabilize in.mp4 out.mp4 --json --detailed-analysis --param \"Maximum Scale=120\""));
  for (std::string line; std::getline(lines, line);) {
    const auto object = nlohmann::json::parse(line);
    if (!object.contains("stage")) continue;
    const std::string stage = object["stage"];
    if (shown[stage].empty()) stages.push_back(stage);
    shown[stage].push_back(object);
  }
  EXPECT_THAT(stages, ::testing::ElementsAre("analyzing", "solving", "choosing", "rendering"));
  for (const auto& [stage, of] : shown) {
    EXPECT_EQ(of.front().value("share", 0.0), 0) << of.front();
    double reached = 0;
    for (const auto& line : of) {
      EXPECT_EQ(line.value("ended", false), &line == &of.back()) << line;
      EXPECT_GE(line.value("share", 0.0), reached) << line;
      reached = line.value("share", 0.0);
      if (stage == "solving" || stage == "choosing") continue;
      EXPECT_EQ(line["total"], 30) << line;
      EXPECT_EQ(line["unit"], "frames") << line;
      EXPECT_NEAR(line["done"].get<double>() / 30, reached, 1e-9) << line;
    }
    EXPECT_EQ(reached, 1) << stage;
    // Lines are some tenths of a second apart, so that a slow machine alone has one in the middle.
    if (stage == "analyzing" && of.size() > 2) {
      EXPECT_GT(of[of.size() - 2]["done"], 0);
    }
  }
  // What the encoder still holds is written before all is said to be done.
  const std::vector<nlohmann::json>& rendering = shown["rendering"];
  EXPECT_EQ(rendering.at(rendering.size() - 2).value("says", ""), "encoding the last frames");
  // Of a quiet run nothing but what came out.
  const auto end = nlohmann::json::parse(
      RunWell("stabilize in.mp4 out.mp4 --overwrite --json --quiet --detailed-analysis"));
  EXPECT_EQ(end["window"], "follow");
  EXPECT_LT(end["shake_after"], end["shake_before"]);
  EXPECT_GT(end["width_kept"], 1 / 1.5);
  EXPECT_LE(end["most_black"], 0.001);
  for (const char* stage : {"analyzing", "solving", "rendering"}) {
    EXPECT_GT(end["seconds"][stage], 0) << stage;
  }
  const Outcome failed = Run("stabilize missing.mp4 out2.mp4 --json");
  EXPECT_EQ(failed.code, 3);
  EXPECT_EQ(nlohmann::json::parse(failed.text)["exit_code"], 3);
}

TEST_F(ProgramTest, AnalyzeTellsWithoutRendering) {
  MakeClip("in.mp4", 160, 120, 30);
  EXPECT_THAT(RunWell("analyze in.mp4 --quiet"),
              ::testing::AllOf(HasSubstr("in.mp4: 30 frames of 160x120\ncrop window "),
                               HasSubstr("Auto-scale (1")));
  // What isn't shown is no trouble.
  EXPECT_THAT(RunWell("analyze in.mp4 --quiet --maximum-scale 101"), Not(HasSubstr("black")));
  // Too little is told, and what is told is enough.
  for (const std::string additional : {"100", "102"}) {
    const std::string analyze =
        "analyze in.mp4 --project p.calm --quiet --result no-motion --additional-scale " +
        additional + " --maximum-scale ";
    const std::string black = Run(analyze + "101").text;
    ASSERT_THAT(black, HasSubstr("% of the picture stays black"));
    const std::size_t scale = black.find("--maximum-scale ");
    const int told = std::stoi(black.substr(scale + 16, 3));
    EXPECT_THAT(Run(analyze + std::to_string(told)).text, Not(HasSubstr("stays black")));
    EXPECT_THAT(Run(analyze + std::to_string(told - 4)).text, HasSubstr("stays black"));
  }
  fs::remove(Path("p.calm"));
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4"));
}

TEST_F(ProgramTest, SavedWorkIsTakenUpAsFarAsItStands) {
  media::ClipInfo made = Made(160, 120, 40, 25);
  made.time_base = {1, 1000};
  for (int f = 0; f < 40; ++f) made.times.push_back({40 * f + f * f % 30, 40});
  // What is chosen for one of the encodes that libx264 makes of this walk is not for all of them.
  media::EncodeSettings lossless;
  lossless.crf = 0;
  WriteStreet(Path("in.mp4"), made, 1, lossless);
  MakeClip("other.mp4", 160, 120, 12);
  const auto is_reused = [](const std::string& what) {
    return HasSubstr("work.calm: reused " + what + "\n");
  };
  const auto is_new = Not(HasSubstr("reused"));
  const std::string work = " --project work.calm --overwrite --crf 0 ";
  const std::string all = "the analysis, the solve and the framing";
  EXPECT_THAT(RunWell("stabilize in.mp4 whole.mkv" + work), is_new);
  EXPECT_THAT(RunWell("render again.mkv" + work), is_reused(all));
  EXPECT_THAT(RunWell("render part.mkv --from 8 --to 20" + work), is_reused(all));
  const auto whole = ClipReader::Open(Path("whole.mkv"));
  const auto again = ClipReader::Open(Path("again.mkv"));
  const auto part = ClipReader::Open(Path("part.mkv"));
  ASSERT_EQ(part->info().frame_count, 12u);
  for (std::size_t f = 0; f < 40; ++f) {
    const auto expected = ReadFrame(*whole, f);
    EXPECT_TRUE(SamePixels(ReadFrame(*again, f), expected)) << f;
    if (f < 8 || f >= 20) continue;
    const auto &times = whole->info().times, &part_times = part->info().times;
    EXPECT_EQ(part_times[f - 8].pts - part_times[0].pts, times[f].pts - times[8].pts);
    EXPECT_TRUE(SamePixels(ReadFrame(*part, f - 8), expected)) << f << " of the part";
  }
  EXPECT_THAT(RunWell("stabilize in.mp4 less.mkv --maximum-scale 101" + work),
              is_reused("the analysis and the solve"));
  EXPECT_THAT(RunWell("analyze in.mp4 --project work.calm --smoothness 10"),
              is_reused("the analysis"));
  EXPECT_THAT(Run("params --project work.calm").text, HasSubstr("(default 50), now 10\n"));
  EXPECT_THAT(RunWell("analyze in.mp4 --project work.calm --detailed-analysis"), is_new);

  // What could not be saved is told, but the work is done.
  EXPECT_EQ(Run("stabilize in.mp4 kept.mkv --quiet --project no/work.calm").code, 4);
  EXPECT_TRUE(fs::exists(Path("kept.mkv")));

  // The clip has moved beside the project; then it is another one.
  fs::create_directories(Path("away"));
  fs::rename(Path("in.mp4"), Path("away/in.mp4"));
  fs::rename(Path("work.calm"), Path("away/work.calm"));
  EXPECT_THAT(Run("info away/work.calm").text, HasSubstr("is the one that was analysed"));
  const auto fits = [this] {
    return nlohmann::json::parse(Run("info away/work.calm --json").text).at("fits").get<bool>();
  };
  EXPECT_TRUE(fits());
  // From then on it is known where the clip is, though the project alone moves on; and so it is
  // where the user tells it.
  fs::rename(Path("away/work.calm"), Path("moved.calm"));
  EXPECT_THAT(Run("info moved.calm").text, HasSubstr("away/in.mp4: 40 frames"));
  fs::rename(Path("away/in.mp4"), Path("away/named.mp4"));
  RunWell("analyze away/named.mp4 --project moved.calm");
  EXPECT_THAT(Run("info moved.calm").text, HasSubstr("away/named.mp4: 40 frames"));
  fs::rename(Path("away/named.mp4"), Path("away/in.mp4"));
  fs::rename(Path("moved.calm"), Path("away/work.calm"));
  RunWell("analyze away/in.mp4 --project away/work.calm");
  RunWell("tracks away/work.calm t.trk");
  EXPECT_EQ(fs::file_size(Path("t.trk")), 20u + 2000 * 40 * 16);
  EXPECT_EQ(Run("tracks away/work.calm away/work.calm").code, 4);  // nothing is written over
  EXPECT_EQ(Run("tracks away/work.calm t.trk").code, 4);
  ExpectLine("tracks away/work.calm no/t.trk", 4, "there is no folder no\n");
  // The old file stays where the new one can't be written whole, or at all.
  const std::string tracks = Content("t.trk");
  for (const char* blocks : {"100", "0"}) {
    const Outcome cut =
        Run("tracks away/work.calm t.trk --overwrite", std::string("ulimit -f ") + blocks + "; ");
    EXPECT_EQ(cut.code, 4) << blocks;
    ExpectOneLine(cut, "t.trk: can't be written whole");
    EXPECT_TRUE(Content("t.trk") == tracks) << blocks;
  }
  ExpectLine("analyze other.mp4 --project away/work.calm", 3, "is of another clip");
  fs::rename(Path("other.mp4"), Path("away/in.mp4"));
  ExpectLine("render --project away/work.calm x.mkv", 3, "is not the clip");
  EXPECT_FALSE(fits());
  EXPECT_EQ(Run("render --project gone.calm x.mkv").code, 3);
}

// Two streets behind each other, with sound.
TEST_F(ProgramTest, AFilmComesOutAsItsShotsDoAlone) {
  WriteStreet(Path("a.mkv"), Made(160, 120, 24, 25), 1);
  WriteStreet(Path("b.mkv"), Made(160, 120, 30, 25), 5);
  const auto ffmpeg = [this](const std::string& arguments) {
    ASSERT_EQ(Shell("cd '" + path().string() + "' && ffmpeg -v error " + arguments).code, 0);
  };
  ffmpeg(
      "-i a.mkv -i b.mkv -f lavfi -i sine=d=2.16 -filter_complex '[0:v][1:v]concat=n=2:v=1[v]' "
      "-map '[v]' -map 2:a -c:v ffv1 -c:a flac -r 25 film.mkv");
  ffmpeg("-i film.mkv -vf trim=end_frame=24 -an -c:v ffv1 first.mkv");
  ffmpeg("-i film.mkv -vf trim=start_frame=24,setpts=PTS-STARTPTS -an -c:v ffv1 second.mkv");
  // Of what is decoded of these streams, with the time stamps.
  const auto hashes = [&](const std::string& clip, const std::string& streams) {
    ffmpeg("-y -i " + clip + " -map " + streams + " -f framemd5 hashes");
    return Content("hashes");
  };
  EXPECT_EQ(RunWell("shots film.mkv --quiet"),
            "1  0:00 to 0:00.96  frames 0 to 24  start\n"
            "2  0:00.96 to 0:02.16  frames 24 to 54  cut\n");
  const std::string lossless = " --codec ffv1 --overwrite ";
  EXPECT_THAT(RunWell("stabilize film.mkv out.mkv --project p.calm" + lossless),
              HasSubstr("calmframe: 2 shots: "));
  RunWell("render --project p.calm --quiet part.mkv --from 20 --to 28" + lossless);
  RunWell("stabilize first.mkv steady0.mkv --quiet" + lossless);
  RunWell("stabilize second.mkv steady1.mkv --quiet" + lossless);
  const auto out = ClipReader::Open(Path("out.mkv")), part = ClipReader::Open(Path("part.mkv"));
  const auto first = ClipReader::Open(Path("steady0.mkv"));
  const auto second = ClipReader::Open(Path("steady1.mkv"));
  ASSERT_EQ(out->info().frame_count, 54u);
  EXPECT_EQ(out->info().times, ClipReader::Open(Path("film.mkv"))->info().times);
  for (std::size_t f = 0; f < 54; ++f) {
    const auto frame = ReadFrame(*out, f);
    EXPECT_TRUE(SamePixels(frame, f < 24 ? ReadFrame(*first, f) : ReadFrame(*second, f - 24))) << f;
    if (f >= 20 && f < 28) {
      EXPECT_TRUE(SamePixels(frame, ReadFrame(*part, f - 20))) << f;
    }
  }
  // The same by machines that share it, in stretches that are no shots.
  RunWell("analyze film.mkv --quiet --choose --to 24f --project p0.calm");
  RunWell("analyze film.mkv --quiet --choose --from 24f --project p1.calm");
  RunWell("gather --project all.calm p1.calm p0.calm");
  const std::vector<std::size_t> borders = {0, 15, 33, 54};
  const auto draw_segments = [&](const std::string& kind, const std::string& flags) {
    std::string names;
    for (std::size_t s = 0; s + 1 < borders.size(); ++s) {
      const std::string name = " s" + std::to_string(s) + kind;
      RunWell("render --project all.calm --quiet --segment" + name + flags + " --from " +
              std::to_string(borders[s]) + " --to " + std::to_string(borders[s + 1]));
      names += name;
    }
    RunWell("join --project all.calm --quiet joined" + kind + names);
    return names;
  };
  draw_segments(".mkv", lossless);
  EXPECT_EQ(hashes("joined.mkv", "0"), hashes("out.mkv", "0"));
  // Frames that come in another order than they are shown in.
  const std::string segments = draw_segments(".mp4", "");
  const auto joined = ClipReader::Open(Path("joined.mp4"));
  ASSERT_EQ(joined->info().frame_count, 54u);
  EXPECT_EQ(joined->info().warning, "");
  RunWell("stabilize film.mkv whole.mp4 --quiet");
  EXPECT_EQ(joined->info().times, ClipReader::Open(Path("whole.mp4"))->info().times);
  for (std::size_t s = 0; s + 1 < borders.size(); ++s) {
    const auto segment = ClipReader::Open(Path("s" + std::to_string(s) + ".mp4"));
    for (std::size_t f = borders[s]; f < borders[s + 1]; ++f) {
      EXPECT_TRUE(SamePixels(ReadFrame(*joined, f), ReadFrame(*segment, f - borders[s]))) << f;
    }
  }
  const std::string join = "join --project all.calm --overwrite joined.mp4 ";
  ExpectLine(join + "s0.mp4 s2.mp4", 3, "the segments hold 36 frames, the clip 54");
  ExpectLine(join + "s0.mp4 s1.mkv s2.mp4", 3, "s1.mkv: was encoded by other settings than s0.mp4");
  ExpectLine(join + "s0.mp4 s1.mp4 s2.mp4 no.mp4", 3, "no.mp4: ");
  ExpectLine(join + "joined.mp4" + segments, 4, "joined.mp4: is an input itself");
  ExpectLine("gather --project g.calm p0.calm p0.calm", 3, "begins at frame 0, and what is before");
  ExpectLine("gather --project all.calm p0.calm p1.calm", 4, "all.calm: exists");
  EXPECT_EQ(hashes("film.mkv", "0:a"), hashes("out.mkv", "0:a"));
  ExpectLine("stabilize film.mkv x.mkv --shots 0:01,0:03", 2, "--shots 0:03 lies behind the last");
  ExpectLine("tracks p.calm x.trk --shot 3", 2, "p.calm: has 2 shots");
}

TEST_F(ProgramTest, APictureIsTheSameThroughAProjectOrWithout) {
  MakeClip("in.mp4", 160, 120, 40);
  const auto drawn = [this](const std::string& flags) {
    RunWell("stabilize in.mp4 - --quiet " + flags + " >out.y4m");
    return Content("out.y4m");
  };
  const std::string fresh = drawn("");
  RunWell("analyze in.mp4 --project p.calm --quiet --smoothness 5 --framing synthesize-edges");
  const std::string same = " --smoothness 50 --framing crop-auto-scale";
  EXPECT_TRUE(drawn("--project p.calm" + same) == fresh);
  RunWell("analyze in.mp4 --project p.calm --quiet --framing stabilize-only");
  EXPECT_TRUE(drawn("--project p.calm" + same) == fresh);
  // Of frames that the analysis has decoded, or of such as are decoded anew.
  int number = 0;
  for (const std::string& flags :
       {std::string(" --from 12f --to 31f"), std::string(" --framing synthesize-edges --to 14f")}) {
    const std::string work = " --project q" + std::to_string(++number) + ".calm";
    RunWell("analyze in.mp4 --quiet" + work + flags);
    EXPECT_TRUE(drawn(work + flags) == drawn(flags)) << flags;
  }
}

// The next run of saved work doesn't decode the clip to number its frames, but says the same of it.
TEST_F(ProgramTest, ADamagedClipIsToldOfInEveryRun) {
  MakeClip("whole.avi", 160, 120, 40);
  const std::string whole = Content("whole.avi");
  MakeFile("cut.avi", whole.substr(0, whole.size() * 3 / 4));
  const std::string work = "stabilize cut.avi - --project work.calm --quiet ";
  const std::string first = Run(work + "> a.y4m").text;
  EXPECT_THAT(first, HasSubstr("cut.avi: damaged or cut short, "));
  EXPECT_EQ(Run(work + "> b.y4m").text, first);
  EXPECT_TRUE(Content("b.y4m") == Content("a.y4m"));
  EXPECT_EQ(Run(work + "--smoothness 10 > c.y4m").text, first);
}

// Damage that only decoding tells, which the analysis is the first to do: whoever watches sees one
// run, and the pipe gets one stream.
TEST_F(ProgramTest, DamageThatTheAnalysisMeetsIsToldAsIfItHadBeenSeenBefore) {
  MakeClip("in.mp4", 320, 240, 60);
  std::string bytes = Content("in.mp4");
  const auto unit_size = [&](std::size_t at) {  // behind its own size, of four bytes
    std::size_t size = 0;
    for (int i = 0; i < 4; ++i) size = 256 * size + static_cast<std::uint8_t>(bytes[at + i]);
    return size;
  };
  std::size_t unit = bytes.find("mdat") + 4;
  for (int before = 0; before < 30; ++before) unit += 4 + unit_size(unit);
  bytes.replace(unit + 4 + unit_size(unit) / 3, 40, 40, 'x');  // of one picture, and not its start
  MakeFile("in.mp4", bytes);
  const auto count = [](const std::string& text, const std::string& part) {
    std::size_t found = 0;
    for (std::size_t at = 0; (at = text.find(part, at)) != std::string::npos; ++at) ++found;
    return found;
  };
  const Outcome outcome = Run("stabilize in.mp4 - > out.y4m");
  EXPECT_EQ(outcome.code, 0) << outcome.text;
  EXPECT_EQ(count(outcome.text, "in.mp4: damaged in "), 1u) << outcome.text;
  EXPECT_EQ(count(outcome.text, "analyzing    0 %"), 1u) << outcome.text;
  EXPECT_EQ(count(outcome.text, "analyzing  100 %"), 1u) << outcome.text;
  const std::string y4m = Content("out.y4m");
  EXPECT_EQ(count(y4m, "YUV4MPEG2"), 1u);
  EXPECT_EQ(count(y4m, "FRAME\n"), 60u);
  EXPECT_EQ(Run("stabilize in.mp4 out.mp4 --quiet").code, 0);
  EXPECT_EQ(ClipReader::Open(Path("out.mp4"))->info().frame_count, 60u);
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "out.mp4", "out.y4m"));
}

TEST_F(ProgramTest, InterruptLeavesNothingBehind) {
  MakeClip("in.mp4", 160, 120, 60);
  RunWell("analyze in.mp4 --project p.calm --framing synthesize-edges --quiet");
  const struct {
    const char *stage, *run, *signal, *left;
  } cases[] = {
      {"analyzing", "stabilize in.mp4 out.mp4 --detailed-analysis", "INT", "no output was left"},
      {"analyzing", "stabilize in.mp4 out.mp4 --project new.calm --detailed-analysis", "HUP",
       "no output was left"},
      {"rendering", "render --project p.calm out.mp4", "TERM", "kept: p.calm; no other output"}};
  for (const auto& c : cases) {
    const Outcome outcome = Run(std::string(c.run) + " 2>log & until grep -qs " + c.stage +
                                " log; do sleep 0.01; done; kill -" + c.signal + " $!; wait $!");
    EXPECT_EQ(outcome.code, 130) << c.stage;
    EXPECT_THAT(Content("log"), HasSubstr("\ncalmframe: interrupted; " + std::string(c.left)));
    EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "log", "p.calm"));
    fs::remove(Path("log"));
  }
  // Nobody writes; the reader sleeps nowhere else once it is there.
  const Outcome waiting =
      Run("stabilize pipe out.mp4 & exec 3>pipe; "
          "until grep -q 'State:.S' /proc/$!/status; do sleep 0.01; done; kill -INT $!; wait $!",
          "mkfifo pipe; TMPDIR=. ");
  EXPECT_EQ(waiting.code, 130);
  ExpectOneLine(waiting, "interrupted; no output was left");
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "p.calm", "pipe"));
}

TEST_F(ProgramTest, WhatAKilledRunLeftIsSweptAndWhatARunningOneWritesIsNot) {
  MakeClip("in.mp4", 160, 120, 60);
  const std::string rendering = " 2>log & until grep -qs rendering log; do sleep 0.01; done; ";
  const std::string flags = " --synthesis-input-range 2 --framing synthesize-edges";
  const std::string run = "stabilize in.mp4 out.mp4" + flags;
  for (const std::string out : {"out.mp4", "out%d.png"}) {  // a file, a folder
    Run("stabilize in.mp4 " + out + flags + rendering + "kill -KILL $!; wait $!");
    EXPECT_EQ(Files().size(), 3u);
  }
  EXPECT_EQ(
      Run(run + rendering + CALMFRAME_PROGRAM " stabilize in.mp4 other.mp4 --quiet; wait $!").code,
      0);
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "log", "other.mp4", "out.mp4"));
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)  // these need all of it
TEST_F(ProgramTest, WithoutMemoryItEndsInOneLineAndLeavesNothing) {
  MakeClip("in.mp4", 96, 64, 6);
  bool begins = false, ends = false;
  for (int mib = 128; !ends && mib < 8192; mib += begins ? 32 : 8) {
    SCOPED_TRACE(mib);
    const std::string few =
        "ulimit -c 0; ulimit -v " + std::to_string(mib * 1024) + "; timeout -s KILL 100 ";
    begins = begins || Run("--version", few).code == 0;
    if (!begins) continue;  // it can't be loaded
    const Outcome outcome = Run("stabilize in.mp4 out.mkv --quiet", few);
    ends = outcome.code == 0;
    EXPECT_THAT(outcome.code, ::testing::AnyOf(0, 3, 4, 5)) << outcome.text;
    if (!ends) ExpectOneLine(outcome, "");
    EXPECT_EQ(Files().size(), ends ? 2u : 1u);
    if (HasFailure()) return;
  }
  EXPECT_TRUE(ends);
}
#endif

}  // namespace
}  // namespace calmframe
