#include "host/shots/digest_match.h"

#include <gtest/gtest.h>

#include "tests/host/shots/drawn_digest.h"

namespace calmframe::host {
namespace {

FrameDigest Drawn(int seed, double dx = 0, double dy = 0, double gain = 1, double lift = 0) {
  return DrawDigest([=](double x, double y) { return lift + gain * Waves(seed, x - dx, y - dy); });
}

TEST(DigestMatchTest, TheSamePictureElsewhereAndInOtherLight) {
  const struct {
    double dx, dy, gain, lift;
    double most;  // where half of the frame is left, its edges are smoothed otherwise
  } cases[] = {{0, 0, 1, 0, 0.01},   {3, -2, 1, 0, 0.01},   {-30, 4, 1, 0, 0.07},
               {20, 14, 1, 0, 0.07}, {2, 1, 0.4, 90, 0.03}, {0, 0, 0.5, 0, 0.03}};
  for (const auto& c : cases) {
    const DigestMatch match = MatchOf(Drawn(1), Drawn(1, c.dx, c.dy, c.gain, c.lift));
    EXPECT_EQ(match.shift, (CellShift{static_cast<int>(c.dx), static_cast<int>(c.dy)}));
    EXPECT_LT(match.difference, c.most) << c.dx << " " << c.gain;
    EXPECT_LT(match.common, c.most);
  }
}

TEST(DigestMatchTest, AnotherPictureDiffersEverywhere) {
  for (const int seed : {2, 3, 4}) {
    const DigestMatch match = MatchOf(Drawn(1), Drawn(seed));
    EXPECT_GT(match.difference, 0.25) << seed;
    EXPECT_GT(match.common, 0.1);
  }
}

TEST(DigestMatchTest, ATitleLeavesWhatIsCommon) {
  const auto titled = DrawDigest([](double x, double y) {
    return y > 20 && y < 28 ? 20 + 200 * (static_cast<int>(x) % 3 / 2) : Waves(1, x, y);
  });
  const DigestMatch match = MatchOf(Drawn(1), titled);
  EXPECT_GT(match.difference, 0.1);
  EXPECT_LT(match.common, 0.02);
  EXPECT_EQ(match.shift, CellShift{});
}

TEST(DigestMatchTest, PlainFramesAreAlikeAndUnlikeAPicture) {
  const auto plain = [](double value) { return DrawDigest([=](double, double) { return value; }); };
  EXPECT_LT(MatchOf(plain(0), plain(0)).difference, 0.01);
  EXPECT_LT(MatchOf(plain(90), plain(200)).difference, 0.01);
  EXPECT_GT(MatchOf(plain(0), Drawn(1)).difference, 0.8);
}

TEST(DigestMatchTest, ALampThatGoesOnIsTakenForLight) {
  // The upper half of the tones is too bright to be seen then; and back.
  const FrameDigest dark = Drawn(1), lit = Drawn(1, 0, 0, 2.5, -40), other = Drawn(2);
  for (const auto& [first, second] : {std::pair{dark, lit}, {lit, dark}}) {
    const DigestMatch match = MatchOf(first, second);
    EXPECT_LT(DifferenceButForLight(first, second, match), 0.05);
    EXPECT_LT(DifferenceButForLight(first, second, match), 0.6 * match.difference);
  }
  const DigestMatch match = MatchOf(dark, other);
  EXPECT_GT(DifferenceButForLight(dark, other, match), 0.15);
  EXPECT_LE(DifferenceButForLight(dark, other, match), match.difference);
}

}  // namespace
}  // namespace calmframe::host
