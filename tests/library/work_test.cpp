#include <gmock/gmock.h>

#include <atomic>
#include <cmath>
#include <nlohmann/json.hpp>
#include <string>
#include <thread>

#include "tests/library/library_clip.h"
#include "tests/support/shell.h"

namespace calmframe {
namespace {

using ::testing::HasSubstr;

TEST(LibraryWorkTest, TellsWhatItDoesAndWhatWasSolved) {
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

TEST(LibraryWorkTest, EachOfTwoToldShotsIsAsAlone) {
  Street street;
  const std::int64_t start = 12;
  calmframe_options options = street.Options();
  options.shots = CALMFRAME_SHOTS_LIST;
  options.shot_starts = &start;
  options.shot_start_count = 1;
  std::vector<std::vector<HX_Pixel8>> alone;
  for (const int first : {0, 12}) {
    calmframe_options half = street.Options();
    half.frame_count = 12;
    const Opened session(half);
    for (int f = 0; f < 12; ++f) {
      const calmframe_image image = street.Image(first + f);
      ASSERT_EQ(calmframe_push(session, f, &image), CALMFRAME_OK);
    }
    ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
    for (int f = 0; f < 12; ++f) {
      std::vector<HX_Pixel8> pixels(street.frames[0].size());
      const calmframe_image in = street.Image(first + f),
                            out = ImageOf(pixels, Street::kWidth, Street::kHeight);
      ASSERT_EQ(calmframe_render(session, f, &in, &out), CALMFRAME_OK);
      alone.push_back(pixels);
    }
  }
  const Opened session(options);
  street.PushAll(session);
  ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
  std::size_t count;
  ASSERT_EQ(calmframe_get_shot_count(session, &count), CALMFRAME_OK);
  EXPECT_EQ(count, 2u);
  std::vector<calmframe_place> path(Street::kFrames);
  EXPECT_EQ(calmframe_get_path(session, 0, Street::kFrames, path.data()), CALMFRAME_OK);
  // Several threads, each with frames of both.
  std::atomic<int> equal = 0;
  {
    std::vector<std::jthread> threads;
    for (int t = 0; t < 3; ++t) {
      threads.emplace_back([&, t] {
        for (const int f : {t, 23 - t, 3 + t, 12 + t}) {
          if (SamePixels(street.Steady(session, f), alone[f])) ++equal;
        }
      });
    }
  }
  EXPECT_EQ(equal, 12);
}

TEST(LibraryWorkTest, ShotsAreFoundWhereFramesAreFetchedAndSavedWithTheWork) {
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

TEST(LibraryWorkTest, SavedWorkIsTakenUpByAnotherSessionAndOfTheProgram) {
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

TEST(LibraryWorkTest, CancelledItMayBeStartedAgain) {
  Street street;
  calmframe_options options = street.Fetching();
  struct Canceller {
    Street* street;
    calmframe_session session;
    std::int64_t at = 6;
  } canceller{&street, nullptr};
  static calmframe_fetch fetch_street;
  fetch_street = options.fetch;
  options.user = &canceller;
  options.fetch = [](void* user, std::int64_t frame, calmframe_image* image) -> std::int32_t {
    auto& c = *static_cast<Canceller*>(user);
    if (frame == std::exchange(c.at, frame == c.at ? -1 : c.at)) calmframe_cancel(c.session);
    return fetch_street(c.street, frame, image);
  };
  const Opened session(options);
  canceller.session = session;
  ASSERT_EQ(calmframe_start(session), CALMFRAME_OK);
  EXPECT_EQ(calmframe_wait(session, -1), CALMFRAME_ERROR_CANCELLED);
  std::int32_t state;
  ASSERT_EQ(calmframe_get_state(session, &state), CALMFRAME_OK);
  EXPECT_EQ(state, CALMFRAME_CANCELLED);
  EXPECT_EQ(calmframe_cancel(session), CALMFRAME_OK) << "of nothing";
  session.Solve();
}

TEST(LibraryWorkTest, AFrameThatCanNotBeHadIsTold) {
  Street street;
  street.refused = 10;
  const Opened session(street.Fetching());
  ASSERT_EQ(calmframe_start(session), CALMFRAME_OK);
  EXPECT_EQ(calmframe_wait(session, -1), CALMFRAME_ERROR_SOURCE);
  EXPECT_THAT(session.Text(), HasSubstr("frame 10 could not be fetched: code 7"));
  street.refused = -1;
  session.Solve();
  // A render that goes without its frame draws nothing; the next one has it.
  street.refused = 15;
  std::vector<HX_Pixel8> pixels(street.frames[0].size());
  const calmframe_image out = ImageOf(pixels, Street::kWidth, Street::kHeight);
  EXPECT_EQ(calmframe_render(session, 15, nullptr, &out), CALMFRAME_ERROR_SOURCE);
  EXPECT_THAT(session.Text(), HasSubstr("frame 15"));
  street.refused = -1;
  const auto own = street.Steady(session, 15, false);
  EXPECT_TRUE(SamePixels(own, street.Steady(session, 15)));
}

// What is not steadied in time comes back; what was pushed is gone with the work.
TEST(LibraryWorkTest, APushedClipThatIsCancelledIsGone) {
  const Street street;
  const Opened session(street.Options());
  const calmframe_image image = street.Image(0);
  EXPECT_EQ(calmframe_try_push(session, 0, &image), CALMFRAME_OK);
  // Nobody pushes the next one: it waits, and in time a frame finds no room or all are taken.
  EXPECT_EQ(calmframe_wait(session, 10), CALMFRAME_AGAIN);
  EXPECT_EQ(calmframe_cancel(session), CALMFRAME_OK);
  EXPECT_EQ(calmframe_wait(session, -1), CALMFRAME_ERROR_CANCELLED);
  EXPECT_EQ(calmframe_push(session, 1, &image), CALMFRAME_ERROR_CANCELLED);
  EXPECT_EQ(calmframe_start(session), CALMFRAME_ERROR_STATE);
}

}  // namespace
}  // namespace calmframe
