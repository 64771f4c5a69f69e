#include <gtest/gtest.h>

#include <latch>
#include <thread>

#include "tests/library/library_clip.h"

// Sessions at once in one process. Nobody told what their clips are, so that all of one size have
// one identity: what they share by it would be another clip's.
namespace calmframe {
namespace {

using Frames = std::vector<std::vector<HX_Pixel8>>;

Frames SteadyOf(const Street& street, calmframe_session session) {
  Frames steady;
  for (int f = 0; f < Street::kFrames; ++f) steady.push_back(street.Steady(session, f));
  return steady;
}

Frames Alone(const Street& street, const char* smoothness) {
  const Opened session(street.Options());
  EXPECT_EQ(calmframe_set(session, "Smoothness", smoothness), CALMFRAME_OK);
  street.PushAll(session);
  EXPECT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
  return SteadyOf(street, session);
}

void ExpectEqual(const Frames& is, const Frames& should) {
  ASSERT_EQ(is.size(), should.size());
  for (std::size_t f = 0; f < is.size(); ++f) EXPECT_TRUE(SamePixels(is[f], should[f])) << f;
}

TEST(LibrarySideBySideTest, EachComesOutAsItDoesAlone) {
  const Street one({7}), other({8});
  const struct {
    const Street& street;
    const char* smoothness;
  } clips[] = {{one, "50"}, {other, "50"}, {one, "20"}};
  Frames alone[3], together[3];
  for (int c = 0; c < 3; ++c) alone[c] = Alone(clips[c].street, clips[c].smoothness);
  {
    std::latch all(3);
    std::vector<std::jthread> threads;
    for (int c = 0; c < 3; ++c) {
      threads.emplace_back([&, c] {
        all.arrive_and_wait();
        together[c] = Alone(clips[c].street, clips[c].smoothness);
      });
    }
  }
  EXPECT_FALSE(SamePixels(alone[0][12], alone[1][12]));
  EXPECT_FALSE(SamePixels(alone[0][12], alone[2][12]));
  for (int c = 0; c < 3; ++c) {
    SCOPED_TRACE(c);
    ExpectEqual(together[c], alone[c]);
  }
}

// One whose frames don't come holds up nobody, and what the other does and how it ends is nothing
// to it.
TEST(LibrarySideBySideTest, WhatAnotherDoesInTheMiddleChangesNothing) {
  const Street one({7});
  Street other({8});
  const Frames alone = Alone(one, "50"), other_alone = Alone(other, "50");
  const Opened session(one.Options());
  ASSERT_EQ(calmframe_set(session, "Smoothness", "50"), CALMFRAME_OK);
  int pushed = 0;
  const auto push_to = [&](int end) {
    for (; pushed < end; ++pushed) {
      const calmframe_image image = one.Image(pushed);
      ASSERT_EQ(calmframe_push(session, pushed, &image), CALMFRAME_OK) << session.Text();
    }
  };
  push_to(8);
  {
    Opened solved(other.Fetching());
    ASSERT_EQ(calmframe_set(solved, "Smoothness", "50"), CALMFRAME_OK);
    solved.Solve();
    push_to(10);
    ExpectEqual(SteadyOf(other, solved), other_alone);
  }
  other.refused = 5;
  {
    const Opened failing(other.Fetching());
    ASSERT_EQ(calmframe_start(failing), CALMFRAME_OK);
    EXPECT_EQ(calmframe_wait(failing, -1), CALMFRAME_ERROR_SOURCE);
    push_to(14);
  }
  {
    Opened cut(other.Options());
    const calmframe_image image = other.Image(0);
    ASSERT_EQ(calmframe_push(cut, 0, &image), CALMFRAME_OK);
  }
  push_to(Street::kFrames);
  ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
  ExpectEqual(SteadyOf(one, session), alone);
}

// The same clip, and its frames half had.
TEST(LibrarySideBySideTest, ClosedInTheMiddleOfAnothersAnalysis) {
  Street street({7});
  const Frames alone = Alone(street, "50");
  struct Meeting {
    Street* street;
    std::latch reached{1}, closed{1};
  } meeting{&street};
  static calmframe_fetch fetch_street;
  calmframe_options options = street.Fetching();
  fetch_street = options.fetch;
  options.user = &meeting;
  options.fetch = [](void* user, std::int64_t frame, calmframe_image* image) -> std::int32_t {
    auto& m = *static_cast<Meeting*>(user);
    if (frame == 12 && !m.closed.try_wait()) {
      m.reached.count_down();
      m.closed.wait();
    }
    return fetch_street(m.street, frame, image);
  };
  Opened first(street.Options());
  for (int f = 0; f < 6; ++f) {
    const calmframe_image image = street.Image(f);
    ASSERT_EQ(calmframe_push(first, f, &image), CALMFRAME_OK);
  }
  const Opened second(options);
  ASSERT_EQ(calmframe_set(second, "Smoothness", "50"), CALMFRAME_OK);
  ASSERT_EQ(calmframe_start(second), CALMFRAME_OK);
  meeting.reached.wait();
  first.Close();
  meeting.closed.count_down();
  ASSERT_EQ(calmframe_wait(second, -1), CALMFRAME_OK) << second.Text();
  ExpectEqual(SteadyOf(street, second), alone);
}

}  // namespace
}  // namespace calmframe
