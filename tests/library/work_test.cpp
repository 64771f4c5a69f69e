#include <gmock/gmock.h>

#include <atomic>
#include <string>
#include <thread>

#include "tests/library/library_clip.h"

namespace calmframe {
namespace {

using ::testing::HasSubstr;

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
