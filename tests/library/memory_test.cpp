#include <algorithm>
#include <random>
#include <vector>

#include "tests/contract/failing_memory.h"
#include "tests/library/library_clip.h"

// A session in a process whose memory runs out: each call ends with a code, and with memory again
// all is as if nothing had been.
namespace calmframe {
namespace {

constexpr int kShort = 8;

class LibraryMemoryTest : public testing::Test {
 protected:
  calmframe_options Options() const {
    calmframe_options options = street_.Options();
    options.frame_count = kShort;
    return options;
  }

  // All that a session does; a bit for each code below 0 that its calls ended with, which takes no
  // memory.
  unsigned Play(std::vector<HX_Pixel8>& drawn) const {
    unsigned ends = 0;
    const auto end = [&ends](calmframe_result result) {
      if (result != CALMFRAME_OK) ends |= BitOf(result);
      return result == CALMFRAME_OK;
    };
    calmframe_session session;
    const calmframe_options options = Options();
    if (!end(calmframe_open(&options, &session))) return ends;
    end(calmframe_set(session, "Smoothness", "60"));
    bool pushed = true;
    for (int f = 0; f < kShort && pushed; ++f) {
      const calmframe_image image = street_.Image(f);
      pushed = end(calmframe_push(session, f, &image));
    }
    if (pushed && end(calmframe_wait(session, -1))) {
      const calmframe_image in = street_.Image(3),
                            out = ImageOf(drawn, Street::kWidth, Street::kHeight);
      end(calmframe_render(session, 3, &in, &out));
      char* json = nullptr;
      void* bytes = nullptr;
      std::size_t size;
      if (end(calmframe_get_report(session, &json))) calmframe_free(json);
      if (end(calmframe_save(session, &bytes, &size))) calmframe_free(bytes);
    }
    end(calmframe_close(session));
    return ends;
  }

  static unsigned BitOf(calmframe_result result) { return 1u << -result; }

  const Street street_;
};

TEST_F(LibraryMemoryTest, EveryCallEndsWithACode) {
  std::vector<HX_Pixel8> expected(street_.frames[0].size()), drawn(expected.size());
  FailingMemory::Arm(0, 0);
  ASSERT_EQ(Play(expected), 0u);
  const std::int64_t all = FailingMemory::Disarm();
  std::mt19937 random(5);
  unsigned seen = 0;
  // Some places, more at the start, where the session itself is made; one allocation, or a lasting
  // want.
  for (int n = 0; n < 24; ++n) {
    const std::int64_t first = n < 8 ? 1 + static_cast<std::int64_t>(random() % 400)
                                     : 1 + static_cast<std::int64_t>(random()) % all;
    SCOPED_TRACE(first);
    FailingMemory::Arm(first, n % 2 == 0 ? 1 : 20);
    const unsigned ends = Play(drawn);
    FailingMemory::Disarm();
    seen |= ends;
    // The plug-in's own failures are told in its words; and an analysis that failed is begun once
    // more, when its frames are gone.
    EXPECT_EQ(ends & ~(BitOf(CALMFRAME_ERROR_MEMORY) | BitOf(CALMFRAME_ERROR_SOLVE) |
                       BitOf(CALMFRAME_ERROR_PLUGIN) | BitOf(CALMFRAME_ERROR_SOURCE)),
              0u);
  }
  EXPECT_NE(seen & BitOf(CALMFRAME_ERROR_MEMORY), 0u);
  std::fill(drawn.begin(), drawn.end(), HX_Pixel8{});
  EXPECT_EQ(Play(drawn), 0u);
  EXPECT_TRUE(SamePixels(drawn, expected));
}

}  // namespace
}  // namespace calmframe
