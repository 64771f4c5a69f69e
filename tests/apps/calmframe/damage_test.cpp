// What no camera writes: copies of clips with bytes flipped, cut, spliced and headers made up. The
// program ends with a result or one clear line.

#include <cstdint>
#include <cstring>
#include <iterator>
#include <random>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

using Bytes = std::string;

// The number alone decides what becomes of a file: its remainder by 5 how it is damaged.
Bytes Damaged(const Bytes& whole, const Bytes& other, unsigned number) {
  std::mt19937 random(number);
  const auto below = [&random](std::size_t end) {
    return random() % std::max<std::size_t>(end, 1);
  };
  Bytes bytes = whole;
  switch (number % 5) {
    case 0:  // flipped
      for (std::size_t i = below(64) + 1; i-- > 0;) {
        bytes[below(bytes.size())] ^= static_cast<char>(1 << below(8));
      }
      break;
    case 1:  // cut at its end, or a piece of its middle missing
      if (below(2) == 0) {
        bytes.resize(below(bytes.size()));
      } else {
        bytes.erase(below(bytes.size()), below(bytes.size() / 2));
      }
      break;
    case 2: {  // spliced, from itself or another clip
      const Bytes& from = below(2) == 0 ? whole : other;
      const std::size_t length = std::min(below(20000) + 1, from.size() / 2);
      const std::size_t at = below(bytes.size());
      bytes.replace(at, below(2) == 0 ? length : 0, from, below(from.size() - length), length);
      break;
    }
    case 3: {  // numbers of a header, which stand at a file's start or at its end
      constexpr std::uint32_t kWrong[] = {0, 1, 0x7fffffff, 0x80000000, 0xffffffff, 0x00ffffff};
      for (std::size_t i = below(6) + 1; i-- > 0;) {
        const std::size_t reach = std::min<std::size_t>(bytes.size() - 4, 3000);
        const std::size_t at = below(2) == 0 ? below(reach) : bytes.size() - 4 - below(reach);
        std::memcpy(bytes.data() + at, &kWrong[below(std::size(kWrong))], 4);
      }
      break;
    }
    default:  // the bytes about its start and end
      for (std::size_t i = below(12) + 1; i-- > 0;) {
        const std::size_t reach = std::min<std::size_t>(bytes.size(), 1500);
        const std::size_t at = below(2) == 0 ? below(reach) : bytes.size() - 1 - below(reach);
        bytes[at] = static_cast<char>(random());
      }
  }
  return bytes;
}

class DamageTest : public ProgramTest {
 protected:
  Bytes Content(const std::string& path) const {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  void Ffmpeg(const std::string& arguments) const {
    const std::string command = "cd '" + folder_.string() + "' && ffmpeg -v error -y " + arguments;
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
  }

  // Steadies and analyses damaged copies of a clip in turn.
  void ExpectClearEnds(const std::string& name, const Bytes& other, unsigned first, unsigned end) {
    const Bytes whole = Content(Path(name));
    ASSERT_GT(whole.size(), 100u);
    for (unsigned number = first; number < end; ++number) {
      SCOPED_TRACE("damage " + std::to_string(number) + " of " + name);
      const std::string damaged = "damaged" + fs::path(name).extension().string();
      std::ofstream(Path(damaged), std::ios::binary) << Damaged(whole, other, number);
      const bool steadies = number % 2 == 0;
      const Outcome outcome = RunAfter(
          "timeout 100 ",
          (steadies ? "stabilize " + damaged + " out.mkv" : "analyze " + damaged) + " --quiet");
      EXPECT_THAT(outcome.code, ::testing::AnyOf(0, 3, 5)) << outcome.text;
      if (outcome.code != 0) ExpectOneLine(outcome, "");
      std::vector<std::string> expected = {damaged, name};
      if (steadies && outcome.code == 0) expected.push_back("out.mkv");
      EXPECT_THAT(Files(), ::testing::IsSupersetOf(expected));
      EXPECT_EQ(Files().size(), expected.size()) << "something is left behind";
      if (steadies && outcome.code == 0) {
        EXPECT_GT(ClipReader::Open(Path("out.mkv"))->info().frame_count, 0u);
        fs::remove(Path("out.mkv"));
      }
      fs::remove(Path(damaged));
      if (HasFailure()) {
        ADD_FAILURE() << outcome.code << ": " << outcome.text;
        return;
      }
    }
  }
};

TEST_F(DamageTest, CopiesOfManyFormats) {
  const struct {
    const char* name;
    const char* encode;
  } clips[] = {{"a.mp4", "-c:v libx264 -bf 2 -g 6"},
               {"b.mkv", "-c:v ffv1"},
               {"c.avi", "-c:v mpeg4"},
               {"d.ts", "-c:v mpeg2video"},
               {"e.mov", "-c:v prores_ks -pix_fmt yuv422p10le"},
               {"f.webm", "-c:v libvpx-vp9 -deadline realtime -cpu-used 8"}};
  Bytes other;
  unsigned first = 0;
  for (const auto& clip : clips) {
    Ffmpeg(std::string("-f lavfi -i testsrc2=size=128x96:rate=25 -frames:v 8 ") + clip.encode +
           " " + clip.name);
    ExpectClearEnds(clip.name, other, first, first + 10);
    other = Content(Path(clip.name));
    fs::remove(Path(clip.name));
    first += 50;
  }
}

// All of them with CALMFRAME_ALL_DAMAGE set, which takes some minutes.
TEST_F(DamageTest, CopiesOfRealClips) {
  const fs::path clips = CALMFRAME_CLIPS;
  if (!fs::exists(clips)) GTEST_SKIP() << "no clips";
  const bool all = std::getenv("CALMFRAME_ALL_DAMAGE") != nullptr;
  std::vector<fs::path> paths;
  for (const auto& entry : fs::directory_iterator(clips)) {
    if (entry.path().extension() != ".md") paths.push_back(entry.path());
  }
  std::sort(paths.begin(), paths.end());
  Bytes other;
  unsigned first = 1000;
  for (const fs::path& path : paths) {
    const std::string name = "excerpt" + path.extension().string();
    Ffmpeg("-i '" + path.string() + "' -map 0:v -frames:v 10 -c copy " + name);
    ExpectClearEnds(name, other, first, first + (all ? 50 : 2));
    other = Content(Path(name));
    fs::remove(Path(name));
    first += 50;
  }
}

}  // namespace
}  // namespace calmframe
