// What no camera writes: copies of clips with bytes flipped, cut, spliced and headers made up. The
// program ends with a result or one clear line.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <random>
#include <set>

#include "tests/apps/calmframe/program_fixture.h"

namespace calmframe {
namespace {

using Bytes = std::string;

// The number alone decides what becomes of a file; of two, which are damaged in one way, one is
// steadied and one analysed.
Bytes Damaged(const Bytes& whole, const Bytes& other, unsigned number) {
  std::mt19937 random(number);
  const auto below = [&random](std::size_t end) {
    return random() % std::max<std::size_t>(end, 1);
  };
  Bytes bytes = whole;
  switch (number / 2 % 4) {
    case 0:  // flipped
      for (std::size_t i = below(64) + 1; i-- > 0;) {
        bytes[below(bytes.size())] ^= static_cast<char>(1 << below(8));
      }
      break;
    case 1:  // cut at its end, or a piece of its middle missing
      bytes.erase(below(bytes.size()), below(2) == 0 ? Bytes::npos : below(bytes.size() / 2));
      break;
    case 2: {  // spliced, from itself or another clip
      const Bytes& from = below(2) == 0 ? whole : other;
      const std::size_t length = std::min(below(20000) + 1, from.size() / 2);
      const std::size_t at = below(bytes.size());
      bytes.replace(at, below(2) == 0 ? length : 0, from, below(from.size() - length), length);
      break;
    }
    default: {  // numbers of a header, which stand at a file's start or at its end
      constexpr std::uint32_t kWrong[] = {0, 1, 0x7fffffff, 0x80000000, 0xffffffff, 0x00ffffff};
      for (std::size_t i = below(12) + 1; i-- > 0;) {
        const std::size_t reach = std::min<std::size_t>(bytes.size() - 4, 3000);
        const std::size_t at = below(2) == 0 ? below(reach) : bytes.size() - 4 - below(reach);
        std::uint32_t wrong = random();
        if (below(2) == 0) wrong = kWrong[below(std::size(kWrong))];
        std::memcpy(bytes.data() + at, &wrong, 1 + below(4));
      }
    }
  }
  return bytes;
}

class DamageTest : public ProgramTest {
 protected:
  // Steadies and analyses damaged copies of a clip in turn.
  void ExpectClearEnds(const std::string& name, const Bytes& other, unsigned first, unsigned end) {
    const Bytes whole = Content(name);
    ASSERT_GT(whole.size(), 100u);
    for (unsigned number = first; number < end; ++number) {
      SCOPED_TRACE("damage " + std::to_string(number) + " of " + name);
      const std::string damaged = "damaged" + fs::path(name).extension().string();
      MakeFile(damaged, Damaged(whole, other, number));
      const bool steadies = number % 2 == 0;
      const std::string task =
          steadies ? "stabilize " + damaged + " out.mkv" : "analyze " + damaged;
      const Outcome outcome = Run(task + " --quiet", "timeout 100 ");
      SCOPED_TRACE(outcome.text);
      EXPECT_THAT(outcome.code, ::testing::AnyOf(0, 3, 5));
      if (outcome.code != 0) {  // a warning of what was read around may stand before
        const bool warned = outcome.text.find(": damaged ") != std::string::npos;
        ExpectOneLine({0, outcome.text.substr(warned ? outcome.text.find('\n') + 1 : 0)}, "");
      }
      if (steadies && outcome.code == 0) {
        EXPECT_GT(ClipReader::Open(Path("out.mkv"))->info().frame_count, 0u);
        fs::remove(Path("out.mkv"));
      }
      EXPECT_EQ(Files(), (std::set{damaged, name}));
      fs::remove(Path(damaged));
      if (HasFailure()) return;
    }
  }
};

// Of clips of many formats, and of the first frames of what cameras shot where that is there; of
// these some copies alone, unless CALMFRAME_ALL_DAMAGE is set, which takes some minutes.
TEST_F(DamageTest, CopiesEndInAResultOrOneLine) {
  struct Clip {
    std::string name, made;  // by ffmpeg
    unsigned copies;
  };
  const std::string drawn = "-f lavfi -i testsrc2=size=64x48:rate=25 -frames:v 8 -c:v ";
  std::vector<Clip> clips = {{"a.mp4", drawn + "libx264 -bf 2 -g 6", 10},
                             {"b.mkv", drawn + "ffv1", 10},
                             {"c.avi", drawn + "mpeg4", 10},
                             {"d.ts", drawn + "mpeg2video", 10},
                             {"e.mov", drawn + "prores_ks -pix_fmt yuv422p10le", 10},
                             {"f.webm", drawn + "libvpx-vp9 -deadline realtime -cpu-used 8", 10}};
  std::error_code none;
  std::set<fs::path> shot;
  for (const auto& entry : fs::directory_iterator(CALMFRAME_CLIPS, none)) {
    if (entry.path().extension() != ".md") shot.insert(entry.path());
  }
  for (const fs::path& path : shot) {
    clips.push_back({"excerpt" + path.extension().string(),
                     "-i '" + path.string() + "' -map 0:v -frames:v 5 -c copy",
                     std::getenv("CALMFRAME_ALL_DAMAGE") ? 50u : 2u});
  }
  Bytes other;
  unsigned first = 0;
  for (const Clip& clip : clips) {
    const std::string command = "ffmpeg -v error -y " + clip.made + " " + Path(clip.name);
    ASSERT_EQ(Shell(command).code, 0) << command;
    ExpectClearEnds(clip.name, other, first, first + clip.copies);
    other = Content(clip.name);
    fs::remove(Path(clip.name));
    first += 50;
  }
}

}  // namespace
}  // namespace calmframe
