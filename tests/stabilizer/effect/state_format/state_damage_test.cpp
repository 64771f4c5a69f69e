#include <gtest/gtest.h>
#include <malloc.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <filesystem>
#include <new>

#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"

// Whatever has become of a payload: it is refused, or it loads; no more memory is taken than a
// small multiple of it.

// Bytes that this thread holds, and the most of them so far.
static thread_local std::int64_t live = 0, most = 0;

void* operator new(std::size_t size) {
  void* const block = std::malloc(size);
  if (!block) throw std::bad_alloc();
  live += static_cast<std::int64_t>(malloc_usable_size(block));
  most = std::max(most, live);
  return block;
}
void operator delete(void* block) noexcept {
  if (block) live -= static_cast<std::int64_t>(malloc_usable_size(block));
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  operator delete(block);
}

namespace kelp::effect {
namespace {

constexpr SourceShape kDamagedShape{64, 36, 1, 1};
// A record's buffer, a piece of the table, a stream's buffers.
constexpr std::int64_t kScratch = 1 << 20;

// Whether it loads; `written`, if given, is what is then written. Fails the test for anything else
// than that or a refusal, for memory beyond `expanded` bytes many times, and for a state that can't
// be written.
bool Loads(const std::string& payload, std::uint32_t version, int raw, std::size_t expanded,
           std::string* written = nullptr) {
  const std::int64_t limit = live + kScratch + 6 * static_cast<std::int64_t>(expanded);
  most = live;
  try {
    const SavedState state = ReadState(payload.data(), payload.size(), version,
                                       static_cast<std::uint8_t>(raw), kDamagedShape);
    EXPECT_LE(most, limit);
    const auto& table = state.result->all_features;
    EXPECT_EQ(marrow::tracking::CellsOf(table)->size(),
              static_cast<std::size_t>(table.frame_count) *
                  static_cast<std::size_t>(table.feature_count));
    if (state.solve_result->warper) {
      EXPECT_EQ(static_cast<int>(state.solve_result->warper->frameWarpCount()), table.frame_count);
    }
    tessel::filesupport::OStringByteStream out;
    WriteState(out, state);
    if (written) *written = out.Take();
    return true;
  } catch (const StateRefused&) {
    EXPECT_LE(most, limit);
    return false;
  }
}

TEST(StateDamageTest, WhatIsCutIsRefusedAndWhatIsFlippedIsRefusedOrLoads) {
  int loaded = 0, refused = 0;
  for (const auto& file : std::filesystem::directory_iterator(CALMFRAME_SAMPLES)) {
    SCOPED_TRACE(file.path().filename());
    auto [version, deflated, plain] = ReadSample(file.path().filename());
    const bool raw = version >= 13;
    const auto loads = [raw, version = version](const std::string& bytes) {
      return Loads(raw ? bytes : Deflated(bytes), version, raw, bytes.size());
    };
    ASSERT_TRUE(loads(plain));
    EXPECT_FALSE(loads(plain + '\0'));
    const std::size_t step = version == 16 ? 3 : 11;
    // Within a record's offsets all bytes are alike.
    const auto alike = [end = plain.size()](std::size_t i) { return i > 3000 && i + 1000 < end; };
    for (std::size_t i = 0; i < plain.size(); i += alike(i) ? 397 : step) {
      ASSERT_FALSE(loads(plain.substr(0, i))) << i;
      std::string flipped = plain;
      flipped[i] ^= static_cast<char>(std::array{0x01, 0x80, 0xff}[i / step % 3]);
      ++(loads(flipped) ? loaded : refused);
    }
    if (version == 16) {
      tessel::filesupport::OStringByteStream out;
      WriteState(out, ReadState(plain.data(), plain.size(), 16, 1, kDamagedShape),
                 state_format::PayloadForm::packed);
      const std::string packed = out.Take();
      ASSERT_TRUE(Loads(packed, 16, 2, plain.size()));
      for (std::size_t i = 0; i < packed.size(); ++i) {
        std::string flipped = packed;
        flipped[i] ^= static_cast<char>(std::array{0x01, 0x80, 0xff}[i % 3]);
        ++(Loads(flipped, 16, 2, plain.size()) ? loaded : refused);
      }
    }
    // A check value guards a deflated one.
    for (std::size_t i = 0; i < deflated.size(); i += step) {
      ASSERT_FALSE(Loads(deflated.substr(0, i), version, false, plain.size())) << i;
    }
  }
  EXPECT_GT(loaded, 1000);   // numbers
  EXPECT_GT(refused, 1000);  // what holds them together
}

TEST(StateDamageTest, ABitOfADeflatedOneIsNeverAnotherState) {
  auto [version, deflated, plain] = ReadSample("v16_solved");
  for (std::size_t bit = 0; bit < 8 * deflated.size(); ++bit) {
    std::string flipped = deflated, written = plain;
    flipped[bit / 8] ^= static_cast<char>(1 << bit % 8);
    Loads(flipped, 16, false, 1032 * deflated.size(), &written);
    ASSERT_TRUE(written == plain) << bit;  // bits that fill up a byte mean nothing
  }
}

TEST(StateDamageTest, CountsBeyondTheDataTakeNoMemory) {
  const std::string plain = ReadSample("v16_solved").plain;
  const auto with = [&plain](std::size_t offset, const std::string& bytes) {
    std::string changed = plain;
    return changed.replace(offset, bytes.size(), bytes);
  };
  constexpr std::size_t kFrames = 20, kSlots = 24;
  for (const std::int32_t count : {-1, 0, 1, 3, 1 << 20, 0x7fffffff}) {
    EXPECT_FALSE(Loads(with(kFrames, BytesOf(count)), 16, true, 0)) << count;
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
      EXPECT_EQ(Loads(with(offset, BytesOf(count)), 16, true, 0), (span || mask) && count > 0)
          << offset << " " << count;
    }
  }
  // Keys of the map: frames of the clip, two different ones, each pair once.
  for (const auto& [m, n] : {std::pair{0, 0}, {0, 2}, {-1, 0}, {1, 0}}) {
    EXPECT_FALSE(Loads(with(map + 12, BytesOf(m) + BytesOf(n)), 16, true, plain.size()));
  }
  EXPECT_FALSE(Loads(with(crop + 5, BytesOf(1)), 16, true, 0)) << "a crop of another clip";
}

}  // namespace
}  // namespace kelp::effect
