#include <gmock/gmock.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <string>
#include <thread>

#include "tests/library/library_clip.h"

namespace {
std::atomic<bool> leaves_open = false;
}

// Asked by the address sanitizer before it looks for leaks. Of work that the process's end cuts off
// the plug-in's own statics, which go first, keep what they can't give back any more.
extern "C" int __lsan_is_turned_off() {
  return leaves_open ? 1 : 0;
}

// What a program does wrong is an error each, and the session goes on.
namespace calmframe {
namespace {

using ::testing::HasSubstr;

TEST(LibraryMisuseTest, OptionsThatThereAreNot) {
  const Street street;
  struct Case {
    const char* said;
    void (*change)(calmframe_options& options);
  };
  const std::int64_t descending[] = {8, 8};
  static const std::int64_t* starts = descending;
  const Case cases[] = {
      {"calmframe_options_init", [](auto& o) { o.struct_size = 0; }},
      {"at least 20", [](auto& o) { o.width = 19; }},
      {"at most 2^27", [](auto& o) { o.width = o.height = 1 << 20; }},
      {"format 9", [](auto& o) { o.format = 9; }},
      {"depth 10", [](auto& o) { o.depth = 10; }},
      {"planar formats", [](auto& o) { o.format = CALMFRAME_YUV420P, o.depth = 32; }},
      {"chroma samples", [](auto& o) { o.format = CALMFRAME_YUV420P, o.height = 121; }},
      {"frame_count is 0", [](auto& o) { o.frame_count = 0; }},
      {"frame_count is 10000001", [](auto& o) { o.frame_count = 10'000'001; }},
      {"frame rate", [](auto& o) { o.rate_den = 0; }},
      {"matrix 99", [](auto& o) { o.matrix = 99; }},
      {"aspect", [](auto& o) { o.aspect_num = -1; }},
      {"field order", [](auto& o) { o.field_order = 3; }},
      {"where frames are fetched", [](auto& o) { o.shots = CALMFRAME_SHOTS_FOUND; }},
      {"too many shot_starts",
       [](auto& o) {
         o.shots = CALMFRAME_SHOTS_LIST, o.shot_starts = starts, o.shot_start_count = SIZE_MAX;
       }},
      {"ascend",
       [](auto& o) {
         o.shots = CALMFRAME_SHOTS_LIST, o.shot_starts = starts, o.shot_start_count = 2;
       }},
  };
  for (const Case& c : cases) {
    calmframe_options options = street.Options();
    c.change(options);
    calmframe_session session = reinterpret_cast<calmframe_session>(1);
    EXPECT_EQ(calmframe_open(&options, &session), CALMFRAME_ERROR_ARGUMENT) << c.said;
    EXPECT_EQ(session, nullptr);
    EXPECT_THAT(Opened::Text(nullptr), HasSubstr(c.said));
  }
  calmframe_options options = street.Options();
  calmframe_session session;
  options.plugin = "/nowhere/calmframe.hxp";
  EXPECT_EQ(calmframe_open(&options, &session), CALMFRAME_ERROR_PLUGIN);
  EXPECT_THAT(Opened::Text(nullptr), HasSubstr("/nowhere/calmframe.hxp"));
  options = street.Options();
  options.clip = "/nowhere/clip.mp4";
  EXPECT_EQ(calmframe_open(&options, &session), CALMFRAME_ERROR_SOURCE);
  EXPECT_EQ(calmframe_open(nullptr, &session), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_open(&options, nullptr), CALMFRAME_ERROR_ARGUMENT);
  options = street.Options();
  options.width = options.height = 20;
  options.frame_count = 10'000'000;
  const Opened least(options);
  const Opened after(street.Options());  // none of these left anything open
}

TEST(LibraryMisuseTest, NoSessionThatIsClosed) {
  const Street street;
  calmframe_session first, second;
  const calmframe_options options = street.Options();
  ASSERT_EQ(calmframe_open(&options, &first), CALMFRAME_OK);
  EXPECT_EQ(calmframe_close(first), CALMFRAME_OK);
  EXPECT_EQ(calmframe_close(first), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_start(first), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_close(nullptr), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_close(reinterpret_cast<calmframe_session>(&first)), CALMFRAME_ERROR_ARGUMENT);
  ASSERT_EQ(calmframe_open(&options, &second), CALMFRAME_OK);
  EXPECT_NE(first, second);
  EXPECT_EQ(calmframe_close(second), CALMFRAME_OK);
}

TEST(LibraryMisuseTest, FramesOutOfOrderAndOfAnotherSize) {
  const Street street;
  const Opened session(street.Options());
  calmframe_image image = street.Image(0);
  std::size_t count;
  char* json = nullptr;
  // Before there is anything.
  EXPECT_EQ(calmframe_wait(session, 0), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_finish(session), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_get_shot_count(session, &count), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_render(session, 0, &image, &image), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_save_file(session, "/tmp/none"), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_push(session, 1, &image), CALMFRAME_ERROR_ARGUMENT);
  const auto expect_refused = [&](const char* said, const calmframe_image* refused) {
    EXPECT_EQ(calmframe_push(session, 0, refused), CALMFRAME_ERROR_ARGUMENT);
    EXPECT_THAT(session.Text(), HasSubstr(said));
  };
  expect_refused("null", nullptr);
  const auto refuse = [&](const char* said, auto change) {
    calmframe_image changed = image;
    change(changed);
    expect_refused(said, &changed);
  };
  refuse("161 by 120", [](calmframe_image& i) { i.width = 161; });
  refuse("plane 0 is null", [](calmframe_image& i) { i.plane[0] = nullptr; });
  refuse("639 apart", [](calmframe_image& i) { i.stride[0] = 639; });
  constexpr std::ptrdiff_t kLeast = std::numeric_limits<std::ptrdiff_t>::min();
  refuse("apart", [](calmframe_image& i) { i.stride[0] = kLeast; });
  std::int32_t state;
  ASSERT_EQ(calmframe_get_state(session, &state), CALMFRAME_OK);
  EXPECT_EQ(state, CALMFRAME_IDLE) << "nothing of it began the work";
  ASSERT_EQ(calmframe_push(session, 0, &image), CALMFRAME_OK);
  EXPECT_EQ(calmframe_push(session, 0, &image), CALMFRAME_ERROR_ARGUMENT) << "twice";
  EXPECT_EQ(calmframe_push(session, 2, &image), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_start(session), CALMFRAME_ERROR_STATE);
  EXPECT_EQ(calmframe_set(session, "Smoothness", "30"), CALMFRAME_ERROR_STATE);
  for (int f = 1; f < Street::kFrames; ++f) {
    image = street.Image(f);
    ASSERT_EQ(calmframe_push(session, f, &image), CALMFRAME_OK);
  }
  EXPECT_EQ(calmframe_push(session, Street::kFrames, &image), CALMFRAME_ERROR_STATE);
  ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
  EXPECT_EQ(calmframe_finish(session), CALMFRAME_OK) << "once more changes nothing";
  EXPECT_EQ(calmframe_render(session, 24, &image, &image), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_render(session, -1, &image, &image), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_render(session, 0, nullptr, &image), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_render(session, 0, &image, nullptr), CALMFRAME_ERROR_ARGUMENT);
  calmframe_place place;
  for (const auto& [first, frames] : {std::pair<std::int64_t, std::int64_t>(1, INT64_MAX),
                                      {INT64_MAX, 1},
                                      {24, 1},
                                      {-1, 1},
                                      {0, -1}}) {
    EXPECT_EQ(calmframe_get_path(session, first, frames, &place), CALMFRAME_ERROR_ARGUMENT);
  }
  calmframe_shot shot;
  EXPECT_EQ(calmframe_get_shot(session, 1, &shot), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_get_shot(session, 0, nullptr), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_get_report(session, nullptr), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_load(session, "bytes", 5), CALMFRAME_ERROR_FILE);
  ASSERT_EQ(calmframe_get_report(session, &json), CALMFRAME_OK);
  calmframe_free(json);
}

TEST(LibraryMisuseTest, ControlsThatThereAreNot) {
  const Street street;
  const Opened session(street.Options());
  const struct {
    const char *name, *value, *said;
  } cases[] = {{"Smothness", "50", "did you mean 'Smoothness'"},
               {"Smoothness", "1001", "0 to 1000"},
               {"Smoothness", "0,5", "0 to 1000"},
               {"Method", "Perspectiv", "did you mean Perspective"},
               {"window", "folow", "did you mean follow"},
               {"zoom-at-most", "0.5", "1 to 100"},
               {"zoom-speed", "nan", "0 to 1000"}};
  for (const auto& c : cases) {
    EXPECT_EQ(calmframe_set(session, c.name, c.value), CALMFRAME_ERROR_ARGUMENT) << c.name;
    EXPECT_THAT(session.Text(), HasSubstr(c.said));
  }
  EXPECT_EQ(calmframe_set(session, nullptr, "1"), CALMFRAME_ERROR_ARGUMENT);
  EXPECT_EQ(calmframe_set(session, "Smoothness", nullptr), CALMFRAME_ERROR_ARGUMENT);
  // Too short for it, a text is cut and its length told.
  char text[8];
  EXPECT_GT(calmframe_error_text(session, text, sizeof text), 7u);
  EXPECT_STREQ(text, "value i");
}

TEST(LibraryMisuseTest, TwoThreadsPushAndOneGetsIn) {
  const Street street;
  const Opened session(street.Options());
  const calmframe_image image = street.Image(0);
  std::atomic<int> taken = 0, busy = 0, other = 0;
  {
    // Each of them pushes what is next, as far as it knows; every frame is taken once.
    const auto push = [&] {
      for (int f = 0; f < Street::kFrames;) {
        const calmframe_result result = calmframe_push(session, f, &image);
        if (result == CALMFRAME_OK) ++taken;
        if (result == CALMFRAME_ERROR_BUSY) ++busy;
        if (result == CALMFRAME_OK || result == CALMFRAME_ERROR_ARGUMENT) ++f;
        if (result == CALMFRAME_ERROR_STATE) break;
        if (result != CALMFRAME_OK && result != CALMFRAME_ERROR_BUSY &&
            result != CALMFRAME_ERROR_ARGUMENT) {
          ++other;
          break;
        }
      }
    };
    std::jthread one(push), two(push);
  }
  EXPECT_EQ(other, 0);
  EXPECT_LE(taken, Street::kFrames);
  EXPECT_GE(taken, Street::kFrames / 2);
}

TEST(LibraryMisuseTest, ClosedInTheMiddle) {
  const Street street;
  for (const int frames : {1, 6, Street::kFrames}) {
    SCOPED_TRACE(frames);
    Opened session(street.Options());
    for (int f = 0; f < frames; ++f) {
      const calmframe_image image = street.Image(f);
      ASSERT_EQ(calmframe_push(session, f, &image), CALMFRAME_OK);
    }
    // Whoever waits for the end, or draws, hears of it.
    std::jthread waiting([handle = calmframe_session(session), &session] {
      const calmframe_result result = calmframe_wait(handle, -1);
      EXPECT_TRUE(result == CALMFRAME_ERROR_CANCELLED || result == CALMFRAME_OK ||
                  result == CALMFRAME_ERROR_ARGUMENT)
          << result;
    });
    session.Close();
  }
}

TEST(LibraryMisuseDeathTest, LeftOpenAtTheProcessesEnd) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const Street street;
  const auto leave = [&street](int frames) {
    leaves_open = true;
    const calmframe_options options = street.Options();
    calmframe_session session;
    if (calmframe_open(&options, &session) != CALMFRAME_OK) std::exit(1);
    for (int f = 0; f < frames; ++f) {
      const calmframe_image image = street.Image(f);
      if (calmframe_push(session, f, &image) != CALMFRAME_OK) std::exit(2);
    }
    calmframe_progress progress{};  // of work that has begun
    while (frames > 0 && progress.stage[0] == 0) calmframe_get_progress(session, &progress);
    std::exit(0);
  };
  for (const int frames : {0, 12}) {
    EXPECT_EXIT(leave(frames), testing::ExitedWithCode(0), "") << frames;
  }
}

TEST(LibraryMisuseTest, CallsFromTheFetchingFunction) {
  Street street;
  struct Caller {
    Street* street;
    calmframe_session session = nullptr;
    calmframe_result closed = 0, waited = 0, asked = -1, path = 0, saved = 0;
  } caller{&street};
  calmframe_options options = street.Fetching();
  const calmframe_fetch fetch = options.fetch;
  static calmframe_fetch fetch_street;
  fetch_street = fetch;
  options.user = &caller;
  options.fetch = [](void* user, std::int64_t frame, calmframe_image* image) -> std::int32_t {
    auto& c = *static_cast<Caller*>(user);
    std::int32_t state;
    c.closed = calmframe_close(c.session);
    c.waited = calmframe_wait(c.session, -1);
    c.asked = calmframe_get_state(c.session, &state);
    calmframe_place place;
    c.path = calmframe_get_path(c.session, 0, 1, &place);
    c.saved = calmframe_save_file(c.session, "/nowhere/saved.calm");
    return fetch_street(c.street, frame, image);
  };
  const Opened session(options);
  caller.session = session;
  session.Solve();
  // Once solved, a call that waits for the session's threads would wait for this one.
  const calmframe_image out = street.Image(20);
  ASSERT_EQ(calmframe_render(session, 20, nullptr, &out), CALMFRAME_OK) << session.Text();
  EXPECT_EQ(caller.path, CALMFRAME_ERROR_STATE);
  EXPECT_EQ(caller.saved, CALMFRAME_ERROR_STATE);
  EXPECT_EQ(caller.closed, CALMFRAME_ERROR_STATE);
  EXPECT_EQ(caller.waited, CALMFRAME_ERROR_STATE);
  EXPECT_EQ(caller.asked, CALMFRAME_OK);
  EXPECT_EQ(calmframe_push(session, 0, nullptr), CALMFRAME_ERROR_STATE);
}

}  // namespace
}  // namespace calmframe
