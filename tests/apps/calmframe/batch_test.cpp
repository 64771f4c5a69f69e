#include <nlohmann/json.hpp>
#include <sstream>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

using ::testing::ElementsAre;
using ::testing::Not;

class BatchTest : public ProgramTest {
 protected:
  // The objects that a run with --json says, by their state, each with its clip's name.
  static std::map<std::string, std::set<std::string>> States(const std::string& said) {
    std::map<std::string, std::set<std::string>> states;
    std::istringstream lines(said);
    for (std::string line; std::getline(lines, line);) {
      const auto json = nlohmann::json::parse(line);
      if (json.contains("state")) states[json["state"]].insert(json["clip"]);
    }
    return states;
  }
  std::set<std::string> In(const std::string& folder) const {
    std::set<std::string> names;
    for (const auto& entry : fs::directory_iterator(Path(folder))) {
      names.insert(entry.path().filename());
    }
    return names;
  }
};

TEST_F(BatchTest, AFolderWithABrokenClipIsSteadiedAndGoneOnWith) {
  const std::string odd = "line\nbreak \"q\" 'p' %d.mp4";
  fs::create_directories(Path("c/sub"));
  MakeClip("c/a.mp4", 96, 64, 8);
  MakeClip("c/" + odd, 96, 64, 8);
  MakeClip("c/sub/b.mkv", 64, 96, 8);
  MakeFile("c/broken.mp4", std::string(5000, 'x'));
  const std::string batch =
      "batch c --recursive --to c/out --crf 30 --encoder-option g=7 --encoder-option bf=0 ";
  const Outcome first = Run(batch);
  EXPECT_EQ(first.code, 6);
  for (const char* part :
       {"calmframe: c/broken.mp4: not a video file", "calmframe: c/a.mp4: done in ",
        "calmframe: c/line\\nbreak \"q\" 'p' %d.mp4: done in ",
        "calmframe: 4 clips: 3 done, 1 failed", "\nclip ", "calmframe: 1 of 4 clips failed\n"}) {
    EXPECT_THAT(first.text, HasSubstr(part));
  }
  const std::string odd_out = "line\nbreak \"q\" 'p' %d-steady.mp4";
  EXPECT_THAT(In("c/out"), ElementsAre(".calmframe", "a-steady.mp4", "a-steady.mp4.calm",
                                       "batch.html", odd_out, odd_out + ".calm", "sub"));
  EXPECT_THAT(In("c/out/sub"), ElementsAre("b-steady.mkv", "b-steady.mkv.calm"));
  // What x264 tells of itself.
  EXPECT_THAT(
      Content("c/out/a-steady.mp4"),
      ::testing::AllOf(HasSubstr(" keyint=7 "), HasSubstr(" bframes=0 "), HasSubstr(" crf=30.0 ")));
  // As stabilize has it; lossless, since x264's bytes go by what its memory held before.
  RunWell("stabilize c/a.mp4 alone.mkv --codec ffv1 --quiet --smoothness 20");
  RunWell("batch c/a.mp4 --to one --name '{stem}.mkv' --codec ffv1 --quiet --smoothness 20");
  for (const std::size_t frame : {0, 7}) {
    EXPECT_TRUE(SamePixels(ReadFrame(*ClipReader::Open(Path("one/a.mkv")), frame),
                           ReadFrame(*ClipReader::Open(Path("alone.mkv")), frame)));
  }
  const std::string page = Content("c/out/batch.html");
  EXPECT_THAT(page, HasSubstr("<a href=\"./line%0Abreak%20%22q%22%20%27p%27%20%25d-steady.mp4\">"));
  EXPECT_THAT(page, HasSubstr("not a video file"));
  std::size_t pictures = 0;
  for (std::size_t at = 0; (at = page.find("<img src=\"data:image/jpeg", at)) != page.npos; ++at) {
    ++pictures;
  }
  EXPECT_EQ(pictures, 6u);

  // Nothing changed; then one clip, and the broken one is whole.
  Outcome again = Run(batch + "--json --quiet");
  EXPECT_EQ(again.code, 6);
  EXPECT_THAT(States(again.text)["unchanged"], ElementsAre("c/a.mp4", "c/" + odd, "c/sub/b.mkv"));
  fs::remove(Path("c/broken.mp4"));
  MakeClip("c/broken.mp4", 64, 64, 4);
  fs::remove(Path("c/a.mp4"));
  MakeClip("c/a.mp4", 64, 64, 6);
  again = Run(batch + "--json");
  EXPECT_EQ(again.code, 0) << again.text;
  EXPECT_THAT(States(again.text)["done"], ElementsAre("c/a.mp4", "c/broken.mp4"));
  EXPECT_EQ(ClipReader::Open(Path("c/out/a-steady.mp4"))->info().frame_count, 6u);
  const auto last = nlohmann::json::parse(
      again.text.substr(again.text.rfind('{', again.text.rfind("\"clips\""))));
  EXPECT_EQ(last["clips"], 4);
  EXPECT_EQ(last["unchanged"], 2);
  // Other flags; the shell has named the outputs too.
  EXPECT_THAT(RunWell("batch c/*.mp4 c/out/*.mp4 --to c/out --crf 31 --reports --jobs 1"),
              HasSubstr("left out 3 files that are outputs of a batch"));
  EXPECT_THAT(In("c/out").count("a-steady.mp4.html"), 1u);
  EXPECT_THAT(Content("c/out/batch.html"), HasSubstr("<a href=\"./a-steady.mp4.html\">report</a>"));
}

// Two shots, analysed apart; stretches of frames that are no shots, drawn apart.
TEST_F(BatchTest, AFilmInPiecesComesOutAsAWhole) {
  MakeClip("film.mp4", 160, 120, 40);
  const std::string whole =
      "film.mp4 --shots 18f --codec ffv1 --smoothness 30 --zoom-at-most 1.4 --quiet ";
  const std::string split =
      "batch " + whole + " --to out --name '{stem}.mkv' --split --frames-a-piece 15 ";
  RunWell("stabilize " + whole + "out.mkv");
  const Outcome outcome = Run(split + "--pixel-format nosuch");
  EXPECT_EQ(outcome.code, 6);
  EXPECT_THAT(outcome.text, HasSubstr("film.mp4: "));
  EXPECT_THAT(outcome.text, HasSubstr("nosuch"));
  RunWell(split);
  EXPECT_THAT(In("out"), ElementsAre(".calmframe", "batch.html", "film.mkv", "film.mkv.calm"));
  const auto a = ClipReader::Open(Path("out.mkv")), b = ClipReader::Open(Path("out/film.mkv"));
  ASSERT_EQ(b->info().frame_count, 40u);
  EXPECT_EQ(a->info().times, b->info().times);
  for (std::size_t frame = 0; frame < 40; ++frame) {
    EXPECT_TRUE(SamePixels(ReadFrame(*a, frame), ReadFrame(*b, frame))) << frame;
  }
  for (const char* again : {"--split --json", "--json"}) {
    EXPECT_THAT(
        States(RunWell("batch " + whole + " --to out --name '{stem}.mkv' " + again))["unchanged"],
        ElementsAre("film.mp4"));
  }
}

TEST_F(BatchTest, WhatCantBeBegunIsOneLine) {
  MakeClip("a.mp4", 64, 48, 4);
  MakeFile("empty.mp4", "");
  MakeFile("file", "");
  fs::create_directory(Path("none"));
  ExpectLine("batch a.mp4 --quiet", 2, "--to is required");
  ExpectLine("batch --to out", 2, "IN is required");
  ExpectLine("batch a.mp4 --to out --name '{stm}'", 2, "'{stm}' has a word in braces");
  ExpectLine("batch a.mp4 --to out --param Rnk=3", 2, "Rnk");
  ExpectLine("batch a.mp4 --to file", 4, "file");
  EXPECT_THAT(Files(), ElementsAre("a.mp4", "empty.mp4", "file", "none"));
  const auto fails = [this](const std::string& arguments, const std::string& line) {
    const Outcome outcome = Run("batch " + arguments + " --quiet");
    EXPECT_EQ(outcome.code, 6) << arguments;
    EXPECT_THAT(outcome.text, HasSubstr("calmframe: " + line));
    EXPECT_THAT(outcome.text, HasSubstr(" failed\n"));
  };
  fails("empty.mp4 --to out", "empty.mp4: is empty");
  fails("none --to out", "none: has no clips in it");
  fails("gone.mp4 --to out", "gone.mp4: No such file");
  fails("a.mp4 --to . --name '{stem}{ext}'", "a.mp4: would be written over a.mp4, which is an");
  RunWell("analyze a.mp4 --project p.calm --quiet");
  fs::copy_file(Path("p.calm"), Path("out/b-steady.mp4.calm"));
  MakeClip("b.mp4", 96, 48, 4);
  fails("b.mp4 --to out", "b.mp4: b-steady.mp4.calm: is of another clip, ");
  // A disk that is full.
  const Outcome full =
      Run("batch a.mp4 --to full --quiet --codec ffv1 --name '{stem}.mkv'", "ulimit -f 8; ");
  EXPECT_EQ(full.code, 4) << full.text;  // its page has no room either
  EXPECT_THAT(full.text, HasSubstr("calmframe: a.mp4: "));
  EXPECT_FALSE(fs::exists(Path("full/a.mkv")));
}

TEST_F(BatchTest, StoppedItKeepsWhatIsWholeAndGoesOn) {
  MakeClip("a.mp4", 64, 48, 4);
  MakeClip("long.mp4", 240, 180, 90);
  const auto stopped = [this](const std::string& signal) {
    return Run(
        "batch a.mp4 long.mp4 --to out --jobs 2 --json --detailed-analysis 2>log & until "
        "grep -qs a.mp4 log; do :; done; kill -" +
        signal + " $!; wait $!");
  };
  EXPECT_EQ(stopped("INT").code, 130);
  EXPECT_THAT(Content("log"), HasSubstr("interrupted; kept: out; no other output was left"));
  // What was analysed by then may be kept too, for the next run.
  EXPECT_TRUE(fs::exists(Path("out/a-steady.mp4")));
  EXPECT_FALSE(fs::exists(Path("out/long-steady.mp4")));
  // Killed, it takes its programs with it; the next run waits for them and goes on.
  stopped("KILL");
  const Outcome whole = Run("batch a.mp4 long.mp4 --to out --json --detailed-analysis");
  EXPECT_EQ(whole.code, 0) << whole.text;
  EXPECT_THAT(States(whole.text)["unchanged"], ElementsAre("a.mp4"));
  for (const auto& entry : fs::recursive_directory_iterator(Path("out/.calmframe"))) {
    EXPECT_THAT(entry.path().string(), Not(::testing::EndsWith(".part")));
  }
}

}  // namespace
}  // namespace calmframe
