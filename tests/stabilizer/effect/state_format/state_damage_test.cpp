#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/allocation_meter.h"
#include "tests/stabilizer/effect/state_format/samples.h"

// Whatever has become of a payload: it is refused, or it loads; no more memory is taken than a
// small multiple of it.

namespace kelp::effect {
namespace {

constexpr SourceShape kPresent{64, 36, 1, 1};
// A record's buffer, a piece of the table, a stream's buffers.
constexpr std::int64_t kScratch = 1 << 20;

// Whether it loads; `written`, if given, is what is then written. Fails the test for anything else
// than that or a refusal, for memory beyond `expanded` bytes many times, and for a state that can't
// be written.
bool Loads(const std::string& payload, std::uint32_t version, bool raw, std::size_t expanded,
           std::string* written = nullptr) {
  const AllocationMeter meter;
  bool loads = false;
  try {
    const SavedState state = ReadState(payload.data(), payload.size(), version, raw, kPresent);
    loads = true;
    EXPECT_LE(meter.Peak(), kScratch + 6 * static_cast<std::int64_t>(expanded));
    const auto& table = state.result->all_features;
    EXPECT_EQ(table.features->size(), static_cast<std::size_t>(table.frame_count) *
                                          static_cast<std::size_t>(table.feature_count));
    if (state.solve_result->warper) {
      EXPECT_EQ(static_cast<int>(state.solve_result->warper->frameWarpCount()), table.frame_count);
    }
    tessel::filesupport::OStringByteStream out;
    WriteState(out, state);
    if (written) *written = out.Take();
  } catch (const StateRefused&) {
    EXPECT_LE(meter.Peak(), kScratch + 6 * static_cast<std::int64_t>(expanded));
  }
  return loads;
}

TEST(StateDamageTest, EveryTruncationIsRefused) {
  for (const char* const name : {"v16_solved", "v16_failed"}) {
    const auto& [version, deflated, plain] = ReadSample(name);
    ASSERT_TRUE(Loads(plain, 16, true, plain.size()));
    for (std::size_t size = 0; size<plain.size(); size += size> 4000 ? 7 : 1) {
      ASSERT_FALSE(Loads(plain.substr(0, size), 16, true, size)) << size;
    }
    EXPECT_FALSE(Loads(plain + '\0', 16, true, plain.size()));
    for (std::size_t size = 0; size < deflated.size(); ++size) {
      ASSERT_FALSE(Loads(deflated.substr(0, size), 16, false, plain.size())) << size;
    }
  }
}

TEST(StateDamageTest, EveryFlippedByteIsRefusedOrLoads) {
  auto [version, deflated, plain] = ReadSample("v16_solved");
  int loaded = 0, refused = 0;
  for (std::size_t i = 0; i < plain.size(); ++i) {
    // Within a record's offsets all bytes are alike.
    const bool offsets = i > 3000 && i + 1000 < plain.size();
    for (const int flip : {0x01, 0x80, 0xff}) {
      if (offsets && (i + flip) % 8 != 0) continue;
      plain[i] ^= static_cast<char>(flip);
      ++(Loads(plain, 16, true, plain.size()) ? loaded : refused);
      plain[i] ^= static_cast<char>(flip);
    }
  }
  EXPECT_GT(loaded, 1000);   // numbers
  EXPECT_GT(refused, 1000);  // what holds them together
  // A check value guards a deflated one.
  for (std::size_t i = 0; i < deflated.size(); ++i) {
    for (int bit = 0; bit < 8; ++bit) {
      deflated[i] ^= static_cast<char>(1 << bit);
      std::string written = plain;
      Loads(deflated, 16, false, 1032 * deflated.size(), &written);
      ASSERT_TRUE(written == plain) << i << " " << bit;  // bits that fill up a byte mean nothing
      deflated[i] ^= static_cast<char>(1 << bit);
    }
  }
}

TEST(StateDamageTest, CountsBeyondTheDataTakeNoMemory) {
  const std::string plain = ReadSample("v16_solved").plain;
  const auto with = [&plain](std::size_t offset, const std::string& bytes) {
    std::string changed = plain;
    return changed.replace(offset, bytes.size(), bytes);
  };
  const auto frames = [](std::int32_t count) { return BytesOf(count); };
  constexpr std::size_t kFrames = 20, kSlots = 24;
  for (const std::int32_t count : {-1, 0, 1, 3, 1 << 20, 0x7fffffff}) {
    EXPECT_FALSE(Loads(with(kFrames, frames(count)), 16, true, 0)) << count;
    EXPECT_FALSE(Loads(Deflated(with(kFrames, frames(count))), 16, false, plain.size()));
  }
  for (const std::uint64_t slots :
       {std::uint64_t{0}, std::uint64_t{1} << 31, std::uint64_t{1} << 62, ~std::uint64_t{0}}) {
    EXPECT_FALSE(Loads(with(kSlots, BytesOf(slots)), 16, true, 0)) << slots;
  }
  // A table that would need more than any machine has, of zeros that deflate to little.
  EXPECT_FALSE(
      Loads(Deflated(with(kSlots, BytesOf(std::uint64_t{0x7fffffff}))), 16, false, plain.size()));
  const std::size_t map = plain.find("NotM"), crop = plain.find("porC");
  for (const std::size_t offset : {map + 4, map + 8, crop + 5, crop + 9}) {
    for (const std::int32_t count : {-1, 0x7fffffff}) {
      const bool span = offset == map + 8, mask = offset == crop + 9;
      EXPECT_EQ(Loads(with(offset, frames(count)), 16, true, 0), (span || mask) && count > 0)
          << offset << " " << count;
    }
  }
  // Keys of the map: frames of the clip, two different ones, each pair once.
  for (const auto& [m, n] : {std::pair{0, 0}, {0, 2}, {-1, 0}, {1, 0}}) {
    EXPECT_FALSE(Loads(with(map + 12, BytesOf(m) + BytesOf(n)), 16, true, plain.size()));
  }
  EXPECT_FALSE(Loads(with(crop + 5, frames(1)), 16, true, 0)) << "a crop of another clip";
}

// A bounded pass of what fuzz/ does at length.
TEST(StateDamageTest, RandomMutationsOfEveryVersion) {
  std::mt19937 random(20260101);
  const auto below = [&random](std::size_t n) { return random() % n; };
  int refused = 0;
  for (std::uint32_t version = 3; version <= 16; ++version) {
    const std::string samples[] = {ReadSample(version, "solved").plain,
                                   ReadSample(version, "failed").plain,
                                   ReadSample(version, "unsolved").plain};
    for (int round = 0; round < 120; ++round) {
      std::string plain = samples[round % 3];
      for (std::size_t change = 0; change <= below(4); ++change) {
        const std::size_t at =
            below(below(2) ? plain.size() : std::min<std::size_t>(900, plain.size()));
        switch (below(5)) {
          case 0:
            plain[at] = static_cast<char>(random());
            break;
          case 1:
            plain.erase(at, 1 + below(9));
            break;
          case 2:
            plain.insert(at, 1 + below(9), static_cast<char>(random()));
            break;
          case 3:
            plain.replace(at, 4, BytesOf(below(2) ? 0x7fffffff : -1));
            break;
          default:
            plain.resize(at + 1);
        }
      }
      const bool raw = version >= 13 && below(2);
      refused += !Loads(raw ? plain : Deflated(plain), version, raw, plain.size());
    }
  }
  EXPECT_GT(refused, 500);
}

}  // namespace
}  // namespace kelp::effect
