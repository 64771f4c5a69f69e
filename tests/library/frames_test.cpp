#include <gmock/gmock.h>

#include <algorithm>
#include <thread>

#include "tests/library/library_clip.h"
#include "tests/support/shell.h"

// Frames through the library are those that the program writes of the same clip and controls.
namespace calmframe {
namespace {

using Bytes = std::vector<std::uint8_t>;

// The program's frames, by its own file.
std::vector<std::vector<HX_Pixel8>> OfTheProgram(const Street& street, const std::string& flags) {
  const std::string to = street.folder.In("steady.mkv");
  const Outcome run = Shell(CALMFRAME_PROGRAM " stabilize '" + street.path + "' '" + to +
                            "' --codec ffv1 --overwrite " + flags + " 2>&1");
  EXPECT_EQ(run.code, 0) << run.text;
  const auto reader = media::ClipReader::Open(to);
  std::vector<std::vector<HX_Pixel8>> frames;
  for (std::size_t f = 0; f < reader->info().frame_count; ++f) {
    frames.push_back(ReadFrame(*reader, f));
  }
  return frames;
}

TEST(LibraryFramesTest, PushedFetchedAndOfTheProgramTheyAreEqual) {
  Street street;
  const auto expected = OfTheProgram(street, "");
  ASSERT_EQ(expected.size(), street.frames.size());
  {
    // One may be opened for more than come.
    calmframe_options options = street.Options();
    options.frame_count = 100;
    const Opened pushed(options);
    street.PushAll(pushed);
    EXPECT_EQ(calmframe_finish(pushed), CALMFRAME_OK);
    ASSERT_EQ(calmframe_wait(pushed, -1), CALMFRAME_OK) << pushed.Text();
    for (int f = Street::kFrames - 1; f >= 0; --f) {
      EXPECT_TRUE(SamePixels(street.Steady(pushed, f), expected[f])) << f;
    }
  }
  const Opened fetched(street.Fetching());
  fetched.Solve();
  std::vector<std::int64_t> in_order(Street::kFrames);
  for (int f = 0; f < Street::kFrames; ++f) in_order[f] = f;
  EXPECT_EQ(street.asked, in_order);
  for (int f = 0; f < Street::kFrames; ++f) {
    EXPECT_TRUE(SamePixels(street.Steady(fetched, f, false), expected[f])) << f;
  }
}

TEST(LibraryFramesTest, ControlsAreThoseOfTheProgram) {
  Street street;
  const Opened session(street.Fetching());
  session.Solve();
  // A second solve asks for no frame.
  street.asked.clear();
  EXPECT_EQ(calmframe_set(session, "smoothness", "80"), CALMFRAME_OK);
  EXPECT_EQ(calmframe_set(session, "Method", "Position"), CALMFRAME_OK);
  EXPECT_EQ(calmframe_set(session, "as-set", "on"), CALMFRAME_OK);
  session.Solve();
  EXPECT_EQ(street.asked, std::vector<std::int64_t>());
  const auto expected = OfTheProgram(street, "--smoothness 80 --method position --as-set");
  for (const int f : {0, 11, 23}) {
    EXPECT_TRUE(SamePixels(street.Steady(session, f), expected[f])) << f;
  }
  // Edges are filled from frames around, which are fetched.
  EXPECT_EQ(calmframe_set(session, "Framing", "Stabilize, Synthesize Edges"), CALMFRAME_OK)
      << session.Text();
  session.Solve();
  const auto filled =
      OfTheProgram(street, "--smoothness 80 --method position --as-set --framing synthesize-edges");
  for (const int f : {0, 12}) {
    EXPECT_TRUE(SamePixels(street.Steady(session, f), filled[f])) << f;
  }
}

TEST(LibraryFramesTest, PlanarFramesAreThoseOfTheProgram) {
  constexpr int kWidth = 160, kHeight = 120, kFrames = 12;
  constexpr std::size_t kLuma = kWidth * kHeight, kChroma = kLuma / 4, kBytes = 3 * kLuma / 2;
  const Street street;
  const auto raw = [&](const std::string& from, const std::string& to) {
    EXPECT_EQ(Shell("ffmpeg -v error -y -i '" + street.folder.In(from) + "' -f rawvideo '" +
                    street.folder.In(to) + "' 2>&1")
                  .code,
              0);
    return street.folder.Content(to);
  };
  ASSERT_EQ(Shell("cd '" + street.folder.path().string() +
                  "' && ffmpeg -v error -i street.mkv -frames:v 12 -pix_fmt yuv420p -c:v ffv1 "
                  "yuv.mkv && " CALMFRAME_PROGRAM
                  " stabilize yuv.mkv steady.mkv --codec ffv1 --quiet 2>&1")
                .code,
            0);
  std::string given = raw("yuv.mkv", "given"), expected = raw("steady.mkv", "expected");
  ASSERT_EQ(given.size(), kFrames * kBytes);
  const auto image = [&](std::string& frames, int f) {
    char* const at = frames.data() + f * kBytes;
    return calmframe_image{
        kWidth, kHeight, {at, at + kLuma, at + kLuma + kChroma}, {kWidth, kWidth / 2, kWidth / 2}};
  };
  calmframe_options options = street.Options();
  options.format = CALMFRAME_YUV420P;
  options.frame_count = kFrames;
  const Opened session(options);
  for (int f = 0; f < kFrames; ++f) {
    const calmframe_image in = image(given, f);
    ASSERT_EQ(calmframe_push(session, f, &in), CALMFRAME_OK);
  }
  ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
  std::string steady(given.size(), 0);
  for (int f = 0; f < kFrames; ++f) {
    const calmframe_image in = image(given, f), out = image(steady, f);
    ASSERT_EQ(calmframe_render(session, f, &in, &out), CALMFRAME_OK) << session.Text();
  }
  EXPECT_TRUE(steady == expected);
}

// The same picture in any order of components, depth and direction of rows comes out as such.
TEST(LibraryFramesTest, EveryPackedFormatHoldsTheSamePicture) {
  const Street street;
  std::vector<std::vector<HX_Pixel8>> expected;
  {
    const Opened session(street.Options());
    street.PushAll(session);
    ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK);
    for (const int f : {0, 9}) expected.push_back(street.Steady(session, f));
  }
  struct Case {
    int format;
    std::vector<int> order;  // of A R G B, by place
    bool bottom_up;
  };
  const Case cases[] = {{CALMFRAME_RGBA, {1, 2, 3, 0}, false},
                        {CALMFRAME_BGRA, {3, 2, 1, 0}, true},
                        {CALMFRAME_RGB, {1, 2, 3}, false},
                        {CALMFRAME_BGR, {3, 2, 1}, true}};
  const int width = Street::kWidth, height = Street::kHeight;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.format);
    calmframe_options options = street.Options();
    options.format = c.format;
    const std::size_t step = c.order.size();
    const std::ptrdiff_t stride = width * static_cast<std::ptrdiff_t>(step) + 5;
    const auto image = [&](Bytes& bytes) {
      return c.bottom_up
                 ? calmframe_image{width, height, {bytes.data() + stride * (height - 1)}, {-stride}}
                 : calmframe_image{width, height, {bytes.data()}, {stride}};
    };
    const auto packed = [&](const std::vector<HX_Pixel8>& pixels) {
      Bytes bytes(stride * height);
      for (int y = 0; y < height; ++y) {
        const int row = c.bottom_up ? height - 1 - y : y;
        for (int x = 0; x < width; ++x) {
          const HX_Pixel8& pixel = pixels[std::size_t{1} * y * width + x];
          const std::uint8_t values[] = {pixel.alpha, pixel.red, pixel.green, pixel.blue};
          for (std::size_t i = 0; i < step; ++i) {
            bytes[row * stride + x * step + i] = values[c.order[i]];
          }
        }
      }
      return bytes;
    };
    const Opened session(options);
    for (int f = 0; f < Street::kFrames; ++f) {
      Bytes bytes = packed(street.frames[f]);
      const calmframe_image in = image(bytes);
      ASSERT_EQ(calmframe_push(session, f, &in), CALMFRAME_OK) << session.Text();
    }
    ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
    for (const int f : {0, 9}) {
      Bytes in = packed(street.frames[f]), out(in.size());
      const calmframe_image source = image(in), to = image(out);
      ASSERT_EQ(calmframe_render(session, f, &source, &to), CALMFRAME_OK) << session.Text();
      EXPECT_TRUE(out == packed(expected[f == 0 ? 0 : 1])) << f;
    }
  }
}

// A plain picture stays what it is wherever a warp takes it, to a step of the host's, of 32768.
TEST(LibraryFramesTest, DeepFramesKeepTheirDepth) {
  const Street street;
  const int width = Street::kWidth, height = Street::kHeight;
  const std::uint16_t colour[] = {12345, 40001, 777, 65535};
  std::vector<std::uint16_t> words(std::size_t{4} * width * height), words_out(words.size());
  std::vector<float> units(words.size()), units_out(words.size());
  for (std::size_t i = 0; i < words.size(); ++i) {
    words[i] = colour[i % 4];
    units[i] = static_cast<float>(colour[i % 4]) / 65535;
  }
  const auto image = [&](auto& of) {
    const auto row = static_cast<std::ptrdiff_t>(width * 4 * sizeof of[0]);
    return calmframe_image{width, height, {of.data()}, {row}};
  };
  for (const int depth : {16, 32}) {
    SCOPED_TRACE(depth);
    calmframe_options options = street.Options();
    options.depth = depth;
    options.format = CALMFRAME_RGBA;
    options.frame_count = 6;
    const Opened session(options);
    const calmframe_image in = depth == 16 ? image(words) : image(units);
    const calmframe_image out = depth == 16 ? image(words_out) : image(units_out);
    for (int f = 0; f < 6; ++f) ASSERT_EQ(calmframe_push(session, f, &in), CALMFRAME_OK);
    ASSERT_EQ(calmframe_wait(session, -1), CALMFRAME_OK) << session.Text();
    ASSERT_EQ(calmframe_render(session, 3, &in, &out), CALMFRAME_OK) << session.Text();
    const std::size_t middle = std::size_t{4} * (width * (height / 2) + width / 2);
    for (std::size_t c = 0; c < 4; ++c) {
      if (depth == 16) {
        EXPECT_NEAR(words_out[middle + c], colour[c], 1) << c;
      } else {
        EXPECT_NEAR(units_out[middle + c], units[c], 1e-6) << c;
      }
    }
  }
}

}  // namespace
}  // namespace calmframe
