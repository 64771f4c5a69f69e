#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "tests/library/library_clip.h"
#include "tests/support/shell.h"

// What a session tells and saves is what the program tells, saves and takes up.
namespace calmframe {
namespace {

using ::testing::HasSubstr;

TEST(LibraryProgramTest, TellsWhatItDoesAndWhatWasSolved) {
  Street street;
  const Opened session(street.Fetching());
  session.Solve();
  calmframe_progress progress;
  ASSERT_EQ(calmframe_get_progress(session, &progress), CALMFRAME_OK);
  EXPECT_STREQ(progress.stage, "choosing");
  std::size_t count;
  ASSERT_EQ(calmframe_get_shot_count(session, &count), CALMFRAME_OK);
  ASSERT_EQ(count, 1u);
  calmframe_shot shot;
  calmframe_outcome outcome;
  ASSERT_EQ(calmframe_get_shot(session, 0, &shot), CALMFRAME_OK);
  ASSERT_EQ(calmframe_get_outcome(session, &outcome), CALMFRAME_OK);
  EXPECT_EQ(shot.first, 0);
  EXPECT_EQ(shot.end, Street::kFrames);
  EXPECT_EQ(shot.solved, 1);
  EXPECT_EQ(shot.outcome.decibels, outcome.decibels);
  EXPECT_LT(outcome.after.mean, outcome.before.mean / 2);
  EXPECT_GT(outcome.decibels, 20 * std::log10(2));
  EXPECT_LE(outcome.most_zoom, 1.5 + 1e-3);
  EXPECT_LT(outcome.most_black, 1e-3);
  // The path tells the same, and the program the same again.
  std::vector<calmframe_place> path(Street::kFrames);
  ASSERT_EQ(calmframe_get_path(session, 0, Street::kFrames, path.data()), CALMFRAME_OK);
  double most = 0, before = 0, after = 0;
  for (int f = 0; f < Street::kFrames; ++f) {
    most = std::max(most, path[f].zoom);
    if (f < 2) continue;
    const auto jerk = [&](const calmframe_similarity calmframe_place::*which) {
      return std::hypot((path[f].*which).dx - (path[f - 1].*which).dx,
                        (path[f].*which).dy - (path[f - 1].*which).dy);
    };
    before += jerk(&calmframe_place::before);
    after += jerk(&calmframe_place::after);
  }
  EXPECT_NEAR(most, outcome.most_zoom, 1e-9);
  EXPECT_LT(after, before / 2);
  calmframe_place one;
  ASSERT_EQ(calmframe_get_path(session, 7, 1, &one), CALMFRAME_OK);
  EXPECT_EQ(one.centre_x, path[7].centre_x);
  EXPECT_EQ(calmframe_get_path(session, 20, 5, path.data()), CALMFRAME_ERROR_ARGUMENT);
  char* json;
  ASSERT_EQ(calmframe_get_report(session, &json), CALMFRAME_OK);
  const auto report = nlohmann::json::parse(json);
  calmframe_free(json);
  const auto told = nlohmann::json::parse(Shell(CALMFRAME_PROGRAM " stabilize '" + street.path +
                                                "' '" + street.folder.In("o.mkv") +
                                                "' --codec ffv1 --json --quiet 2>&1 | tail -1")
                                              .text);
  EXPECT_EQ(report["shots"][0]["choice"], told["choice"]) << report << told;
  EXPECT_EQ(report["width_kept"], told["width_kept"]);
  ASSERT_EQ(calmframe_get_controls(session, &json), CALMFRAME_OK);
  const auto controls = nlohmann::json::parse(json);
  calmframe_free(json);
  EXPECT_EQ(controls[0]["value"], nullptr);
  EXPECT_GT(controls.size(), 20u);
}

TEST(LibraryProgramTest, ShotsAreFoundWhereFramesAreFetchedAndSavedWithTheWork) {
  Street film({7, 8});
  void* bytes;
  std::size_t size, count;
  calmframe_shot shot;
  std::vector<HX_Pixel8> first, last;
  {
    const Opened session(film.Fetching());
    session.Solve();
    ASSERT_EQ(calmframe_get_shot_count(session, &count), CALMFRAME_OK);
    ASSERT_EQ(count, 2u);
    ASSERT_EQ(calmframe_get_shot(session, 1, &shot), CALMFRAME_OK);
    EXPECT_EQ(shot.first, 24);
    EXPECT_EQ(shot.end, 48);
    for (const char* const smoothness : {"50", "20"}) {
      SCOPED_TRACE(smoothness);
      const std::string steady = film.folder.In(smoothness) + ".mkv";
      const std::string flags = std::string(smoothness) == "50" ? "" : " --smoothness 20";
      ASSERT_EQ(Shell(CALMFRAME_PROGRAM " stabilize '" + film.path + "' '" + steady +
                      "' --codec ffv1 --quiet" + flags + " 2>&1")
                    .code,
                0);
      if (!flags.empty()) {
        ASSERT_EQ(calmframe_set(session, "Smoothness", smoothness), CALMFRAME_OK);
        session.Solve();
      }
      const auto reader = media::ClipReader::Open(steady);
      for (const int f : {0, 23, 24, 47}) {
        EXPECT_TRUE(SamePixels(film.Steady(session, f, false), ReadFrame(*reader, f))) << f;
      }
    }
    first = film.Steady(session, 0);
    last = film.Steady(session, 47);
    ASSERT_EQ(calmframe_save(session, &bytes, &size), CALMFRAME_OK);
  }
  const Opened session(film.Options());  // its frames would be pushed
  ASSERT_EQ(calmframe_load(session, bytes, size), CALMFRAME_OK) << session.Text();
  calmframe_free(bytes);
  session.Solve();
  EXPECT_TRUE(SamePixels(film.Steady(session, 47), last));
  EXPECT_TRUE(SamePixels(film.Steady(session, 0), first));
}

TEST(LibraryProgramTest, SavedWorkIsTakenUpByAnotherSessionAndOfTheProgram) {
  Street street;
  void* bytes;
  std::size_t size;
  std::vector<HX_Pixel8> expected;
  {
    const Opened session(street.Options());
    EXPECT_EQ(calmframe_set(session, "Smoothness", "70"), CALMFRAME_OK);
    street.PushAll(session);
    ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK);
    expected = street.Steady(session, 5);
    ASSERT_EQ(calmframe_save(session, &bytes, &size), CALMFRAME_OK) << session.Text();
  }
  {
    const Opened session(street.Options());
    ASSERT_EQ(calmframe_load(session, bytes, size), CALMFRAME_OK) << session.Text();
    session.Solve();
    EXPECT_TRUE(SamePixels(street.Steady(session, 5), expected));
  }
  calmframe_options other = street.Options();
  other.identity = "another clip";
  {
    const Opened session(other);
    EXPECT_EQ(calmframe_load(session, bytes, size), CALMFRAME_ERROR_FILE);
    static_cast<char*>(bytes)[size / 2] ^= 1;
    EXPECT_EQ(calmframe_load(session, bytes, size), CALMFRAME_ERROR_FILE);
    EXPECT_EQ(calmframe_load_file(session, "/nowhere/p"), CALMFRAME_ERROR_FILE);
  }
  calmframe_free(bytes);
  // A project of the file that the frames are of, made by the program, and back.
  const std::string project = street.folder.In("p");
  const auto run = [&](const std::string& arguments) {
    const Outcome outcome = Shell("cd '" + street.folder.path().string() +
                                  "' && " CALMFRAME_PROGRAM " " + arguments + " 2>&1");
    EXPECT_EQ(outcome.code, 0) << outcome.text;
    return outcome.text;
  };
  run("stabilize street.mkv steady.mkv --codec ffv1 --project p");
  calmframe_options options = street.Fetching();
  options.clip = street.path.c_str();
  const Opened session(options);
  ASSERT_EQ(calmframe_load_file(session, project.c_str()), CALMFRAME_OK) << session.Text();
  session.Solve();
  EXPECT_EQ(street.asked, std::vector<std::int64_t>());
  const auto reader = media::ClipReader::Open(street.folder.In("steady.mkv"));
  EXPECT_TRUE(SamePixels(street.Steady(session, 9), ReadFrame(*reader, 9)));
  ASSERT_EQ(calmframe_save_file(session, street.folder.In("q").c_str()), CALMFRAME_OK);
  EXPECT_THAT(run("stabilize street.mkv again.mkv --codec ffv1 --project q"),
              HasSubstr("reused the analysis"));
}

}  // namespace
}  // namespace calmframe
