#include "tests/apps/calmframe/program_fixture.h"

#include <csignal>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>
#include <vector>

namespace calmframe {
namespace {

TEST_F(ProgramTest, ClipsOfAnyShapeKeepTheirFramesAndSize) {
  const struct {
    int width, height, frames;
    const char* flags;
  } cases[] = {{160, 120, 45, ""},
               {160, 120, 1, ""},
               {90, 160, 6, "--method position --framing crop"},
               {161, 121, 12, "--result no-motion --framing stabilize-only --depth 16"},
               {20, 20, 3, "--depth 32 --crop-less-smooth-more 100"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::to_string(c.width) + "x" + std::to_string(c.height) + " " + c.flags);
    MakeClip("in.mp4", c.width, c.height, c.frames);
    const Outcome outcome = Run(std::string("stabilize in.mp4 out.mp4 --quiet ") + c.flags);
    EXPECT_EQ(outcome.code, 0) << outcome.text;
    EXPECT_EQ(outcome.text, "");
    const auto reader = ClipReader::Open(Path("out.mp4"));
    EXPECT_EQ(reader->info().frame_count, static_cast<std::size_t>(c.frames));
    EXPECT_EQ(reader->info().width, c.width);
    EXPECT_EQ(reader->info().height, c.height);
    EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "out.mp4"));
    fs::remove(Path("in.mp4"));
    fs::remove(Path("out.mp4"));
  }
}

TEST_F(ProgramTest, InputThatIsNoClip) {
  MakeFile("empty.mp4", "");
  MakeFile("garbage.mp4", std::string(5000, 'x'));
  MakeFile("notes.txt", "no video here\n");
  MakeClip("tiny.mp4", 2, 2, 4);
  for (const std::string input :
       {"missing.mp4", "empty.mp4", "garbage.mp4", "notes.txt", ".", "tiny.mp4"}) {
    const Outcome outcome = Run("stabilize " + input + " out.mp4");
    EXPECT_EQ(outcome.code, 3) << input;
    ExpectOneLine(outcome, input);
    EXPECT_FALSE(fs::exists(Path("out.mp4")));
  }
}

TEST_F(ProgramTest, OutputThatMayNotBeWrittenCostsNoAnalysis) {
  MakeClip("in.mp4", 64, 48, 5);
  MakeFile("there.mp4", "precious");
  fs::create_symlink("in.mp4", Path("link.mp4"));
  for (const std::string output :
       {"there.mp4", "in.mp4 --overwrite", "link.mp4 --overwrite", "no/such/folder.mp4",
        "out.unknown", "out.mp4 --codec nosuch", "out.mp4 --pixel-format nosuch"}) {
    const Outcome outcome = Run("stabilize in.mp4 " + output);
    EXPECT_EQ(outcome.code, 4) << output;
    ExpectOneLine(outcome, "");
  }
  ExpectOneLine(Run("stabilize in.mp4 out.mp4 --codec libx624"), "did you mean libx264?");
  ExpectOneLine(Run("stabilize in.mp4 out.mp4 --pixel-format yuv420"), "did you mean yuv420p?");
  ExpectOneLine(Run("stabilize in.mp4 no/such/folder.mp4"), "there is no folder no/such\n");
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4", "link.mp4", "there.mp4"));
  EXPECT_EQ(Content("there.mp4"), "precious");
  EXPECT_EQ(Run("stabilize in.mp4 there.mp4 --overwrite --quiet").code, 0);
  EXPECT_EQ(ClipReader::Open(Path("there.mp4"))->info().frame_count, 5u);
  // An encoder that likes to talk, and the tag that players want.
  EXPECT_THAT(Run("stabilize in.mp4 there.mp4 --overwrite --quiet --codec hevc").text,
              ::testing::Not(HasSubstr("x265 [")));
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
               {"stabilize a b --smothness 3", "did you mean --smoothness?"},
               {"stabilize a b --smooth=3", "did you mean --smoothness?"},
               {"info a --smoothness 3", "unknown flag --smoothness (calmframe info --help"},
               {"stabilize a b c", "one word too many: c ("},
               {"stabilize a b --method perspectiv", "did you mean perspective?"},
               {"stabilize a b --framing synthesise", "did you mean synthesize-edges?"},
               {"stabilize a b --smoothness 2000", "2000"},
               {"stabilize a b --smoothness nan", "nan"},
               {"stabilize a b --additional-scale=-inf", "inf"},
               {"stabilize a b --crf x", "'x' is no number"},
               {"stabilize a b --crf", "--crf takes a value"},
               {"stabilize a b --depth 12", "none of 8, 16, 32"},
               {"render --project a b --from -3", "0 or more"},
               {"stabilize a b --json --quiet", "--quiet"},
               {"params --param Smothness=3", "did you mean 'Smoothness'?"},
               {"params --param \"Maximum Scale=99\"", "100 to 10000"},
               {"params --param \"Method=Perspectiv\"", "did you mean Perspective?"},
               {"params --param Rank=4", "no parameter 'Rank'"},
               {"params --param \"Hide Warning Banner=maybe\"", "neither on nor off"},
               {"params --param Smoothness", "NAME=VALUE"},
               {"stabilize a", "OUT"},
               {"", "calmframe stabilize IN OUT"}};
  for (const auto& c : cases) {
    const Outcome outcome = Run(c.arguments);
    EXPECT_EQ(outcome.code, 2) << c.arguments;
    ExpectOneLine(outcome, c.part);
  }
  EXPECT_EQ(Run("stabilize --help").text, Run("help stabilize").text);
}

TEST_F(ProgramTest, ParametersAreListedWithWhatWasGiven) {
  const Outcome plain = Run("params --param smoothness=30 --method perspective");
  EXPECT_EQ(plain.code, 0) << plain.text;
  EXPECT_THAT(plain.text, HasSubstr("0 to 1000 (default 50), now 30\n"));
  EXPECT_THAT(plain.text, HasSubstr("(default Subspace Warp), now Perspective\n"));
  EXPECT_THAT(plain.text, ::testing::Not(HasSubstr("AnalysisStatusCounter")));
  const auto json = nlohmann::json::parse(Run("params --json --experimental --param Rank=4").text);
  const auto rank = std::find_if(json.begin(), json.end(),
                                 [](const nlohmann::json& p) { return p["name"] == "Rank"; });
  ASSERT_NE(rank, json.end());
  EXPECT_EQ((*rank)["id"], 203);
  EXPECT_EQ((*rank)["value"], 4);
  EXPECT_EQ((*rank)["default"], 9);
}

TEST_F(ProgramTest, JsonTellsEachStageAndHowItEnded) {
  const std::string no_utf8 = "in\xff.mp4";
  MakeClip(no_utf8, 160, 120, 30);
  const std::string told = Run("analyze " + no_utf8 + " --json").text;
  const auto last = nlohmann::json::parse(told.substr(told.rfind('\n', told.size() - 2) + 1));
  EXPECT_EQ(last["frames"], 30) << told;
  fs::rename(Path(no_utf8), Path("in.mp4"));
  const Outcome outcome = Run("stabilize in.mp4 out.mp4 --json --param \"Maximum Scale=120\"");
  EXPECT_EQ(outcome.code, 0) << outcome.text;
  std::vector<std::string> ended;
  std::istringstream lines(outcome.text);
  for (std::string line; std::getline(lines, line);) {
    const auto object = nlohmann::json::parse(line);
    if (object.value("ended", false)) ended.push_back(object["stage"]);
  }
  EXPECT_THAT(ended, ::testing::ElementsAre("analyzing", "solving", "rendering"));
  const Outcome failed = Run("stabilize missing.mp4 out2.mp4 --json");
  EXPECT_EQ(failed.code, 3);
  EXPECT_EQ(nlohmann::json::parse(failed.text)["exit_code"], 3);
}

TEST_F(ProgramTest, AnalyzeTellsWithoutRendering) {
  MakeClip("in.mp4", 160, 120, 30);
  const Outcome plain = Run("analyze in.mp4 --quiet");
  EXPECT_EQ(plain.code, 0) << plain.text;
  EXPECT_THAT(plain.text, HasSubstr("in.mp4: 30 frames of 160x120\ncrop window "));
  EXPECT_THAT(plain.text, HasSubstr("Auto-scale (1"));
  // Too little is told, and what is told is enough.
  const std::string analyze = "analyze in.mp4 --project p.calm --quiet --maximum-scale ";
  const std::string black = Run(analyze + "101").text;
  ASSERT_THAT(black, HasSubstr("% of the picture stays black"));
  const std::size_t scale = black.find("--maximum-scale ");
  EXPECT_THAT(Run(analyze + black.substr(scale + 16, 3)).text,
              ::testing::Not(HasSubstr("stays black")));
  fs::remove(Path("p.calm"));
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4"));
}

TEST_F(ProgramTest, SavedWorkIsTakenUpAsFarAsItStands) {
  MakeClip("in.mp4", 160, 120, 40);
  MakeClip("other.mp4", 160, 120, 12);
  const auto run = [&](const std::string& arguments, const std::string& told) {
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.code, 0) << arguments << "\n" << outcome.text;
    if (told.empty()) {
      EXPECT_THAT(outcome.text, ::testing::Not(HasSubstr("reused"))) << arguments;
    } else {
      EXPECT_THAT(outcome.text, HasSubstr("work.calm: reused " + told + "\n")) << arguments;
    }
  };
  const std::string work = " --project work.calm --overwrite --crf 0 ";
  run("stabilize in.mp4 whole.mkv" + work, "");
  run("render again.mkv" + work, "the analysis, the solve and the framing");
  run("render part.mkv --from 8 --to 20" + work, "the analysis, the solve and the framing");
  const auto whole = ClipReader::Open(Path("whole.mkv"));
  const auto again = ClipReader::Open(Path("again.mkv"));
  const auto part = ClipReader::Open(Path("part.mkv"));
  ASSERT_EQ(part->info().frame_count, 12u);
  std::vector<HX_Pixel8> a(160 * 120), b(160 * 120);
  const auto same = [&] { return std::memcmp(a.data(), b.data(), a.size() * sizeof a[0]) == 0; };
  for (std::size_t f = 0; f < 40; ++f) {
    whole->Read(f, a.data(), 160 * 4);
    again->Read(f, b.data(), 160 * 4);
    EXPECT_TRUE(same()) << f;
    if (f < 8 || f >= 20) continue;
    part->Read(f - 8, b.data(), 160 * 4);
    EXPECT_TRUE(same()) << f << " of the part";
  }
  run("stabilize in.mp4 less.mkv --maximum-scale 101" + work, "the analysis and the solve");
  run("analyze in.mp4 --project work.calm --smoothness 10", "the analysis");
  EXPECT_THAT(Run("params --project work.calm").text, HasSubstr("(default 50), now 10\n"));
  run("analyze in.mp4 --project work.calm --detailed-analysis", "");

  // The clip has moved beside the project; then it is another one.
  fs::create_directories(Path("away"));
  fs::rename(Path("in.mp4"), Path("away/in.mp4"));
  fs::rename(Path("work.calm"), Path("away/work.calm"));
  EXPECT_THAT(Run("info away/work.calm").text, HasSubstr("is the one that was analysed"));
  const Outcome tracks = Run("tracks away/work.calm t.trk");
  EXPECT_EQ(tracks.code, 0) << tracks.text;
  EXPECT_EQ(fs::file_size(Path("t.trk")), 20u + 2000 * 40 * 16);
  EXPECT_EQ(Run("tracks away/work.calm away/work.calm").code, 4);  // nothing is written over
  EXPECT_EQ(Run("tracks away/work.calm t.trk").code, 4);
  ExpectOneLine(Run("tracks away/work.calm no/t.trk"), "there is no folder no\n");
  const Outcome other = Run("analyze other.mp4 --project away/work.calm");
  EXPECT_EQ(other.code, 3);
  ExpectOneLine(other, "is of another clip");
  fs::rename(Path("other.mp4"), Path("away/in.mp4"));
  const Outcome changed = Run("render --project away/work.calm x.mkv");
  EXPECT_EQ(changed.code, 3);
  ExpectOneLine(changed, "is not the clip");
  EXPECT_EQ(Run("render --project gone.calm x.mkv").code, 3);
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
  bytes.replace(bytes.find("mdat") + (bytes.size() / 3), 40, 40, 'x');
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
  MakeClip("in.mp4", 320, 240, 90);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    const std::string in = Path("in.mp4");
    const std::string out = Path("out.mp4");
    freopen("/dev/null", "w", stderr);
    execl(CALMFRAME_PROGRAM, "calmframe", "stabilize", in.c_str(), out.c_str(), nullptr);
    _exit(127);
  }
  // The temporary output shows that the run is under way.
  while (Files().size() < 2) usleep(1000);
  kill(child, SIGINT);
  int status = 0;
  waitpid(child, &status, 0);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 130);
  EXPECT_THAT(Files(), ::testing::ElementsAre("in.mp4"));
}

TEST_F(ProgramTest, TheDemoShowsAShakyAndASteadyClip) {
  const Outcome outcome = Run("demo here --frames 12 --quiet");
  EXPECT_EQ(outcome.code, 0) << outcome.text;
  const auto both = ClipReader::Open(Path("here/side-by-side.mp4"));
  EXPECT_EQ(both->info().width, 2560);
  EXPECT_EQ(both->info().frame_count, 12u);
  EXPECT_EQ(ClipReader::Open(Path("here/steady.mp4"))->info().frame_count, 12u);
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)  // these need all of it
TEST_F(ProgramTest, WithoutMemoryItEndsInOneLineAndLeavesNothing) {
  MakeClip("in.mp4", 96, 64, 6);
  bool begins = false, ends = false;
  for (int mib = 128; !ends && mib < 8192; mib += begins ? 32 : 8) {
    SCOPED_TRACE(mib);
    const std::string few = "ulimit -c 0; ulimit -v " + std::to_string(mib * 1024) + "; ";
    begins = begins || RunAfter(few, "--version").code == 0;
    if (!begins) continue;  // it can't be loaded
    const Outcome outcome =
        RunAfter(few + "timeout -s KILL 100 ", "stabilize in.mp4 out.mkv --quiet");
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
