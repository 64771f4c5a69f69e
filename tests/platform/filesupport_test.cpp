#include "platform/tessel/filesupport.h"

#include <gtest/gtest.h>

#include <boost/logic/tribool.hpp>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <tuple>

namespace tessel::filesupport {
namespace {

using boost::logic::tribool;

using OneOfEach = std::tuple<std::int32_t, std::uint32_t, std::int64_t, std::uint64_t, bool,
                             tribool, tribool, std::u16string, utility::Guid>;
const OneOfEach kOneOfEach = {-2,
                              0x53746162,
                              -3,
                              4,
                              true,
                              false,
                              boost::logic::indeterminate,
                              u"h\u00e9",
                              utility::Guid::FromText("00112233-4455-6677-8899-aabbccddeeff")};
using namespace std::string_literals;
const std::string kBytes =
    "\xfe\xff\xff\xff"s
    "batS"
    "\xfd\xff\xff\xff\xff\xff\xff\xff"
    "\4\0\0\0\0\0\0\0"s
    "\1\0\2"s
    "\2\0\0\0h\0\xe9\0"s
    "\x00\x11\x22\x33\x44\x55\x66\x77\x88\x99\xaa\xbb\xcc\xdd\xee\xff"s;

void WriteOneOfEach(OutputByteStream& out, const OneOfEach& values = kOneOfEach) {
  std::apply([&](const auto&... value) { (out << ... << value); }, values);
}

void ReadOneOfEach(InputByteStream& in) {
  OneOfEach values;
  std::apply([&](auto&... value) { (in >> ... >> value); }, values);
  OStringByteStream again;
  WriteOneOfEach(again, values);
  EXPECT_EQ(again.bytes(), kBytes);
}

TEST(ByteStreamTest, EveryTypeHasItsBytes) {
  OStringByteStream out;
  WriteOneOfEach(out);
  EXPECT_EQ(out.bytes(), kBytes);
  IStringByteStream in(kBytes.data(), kBytes.size());
  ReadOneOfEach(in);
  EXPECT_EQ(in.MaxBytesLeft(), 0u);
}

TEST(ByteStreamTest, CutAndAbsurdDataThrows) {
  for (std::size_t size = 0; size < kBytes.size(); ++size) {
    IStringByteStream in(kBytes.data(), size);
    EXPECT_THROW(ReadOneOfEach(in), StreamError) << size;
  }
  bool flag = false;
  tribool maybe;
  IStringByteStream two("\2", 1), three("\3", 1);
  EXPECT_THROW(two >> flag, StreamError);
  EXPECT_THROW(three >> maybe, StreamError);
  std::u16string text;
  IStringByteStream huge(
      "\xff\xff\xff\xff"
      "ab",
      6);  // 8 GiB of text
  EXPECT_THROW(huge >> text, StreamError);
}

// Bytes of two kinds: such as deflate shortens much and such as it can't.
std::string Sample(std::size_t size) {
  std::mt19937 random(1);
  std::string bytes(size, 'a');
  for (std::size_t i = size / 2; i < size; ++i) bytes[i] = static_cast<char>(random());
  return bytes;
}

std::string Zipped(const std::string& bytes) {
  OStringByteStream out;
  OZipByteStream zip(out);
  WriteOneOfEach(zip);
  for (std::size_t i = 0; i < bytes.size(); i += 1000) {  // in pieces
    zip.Write(bytes.data() + i, std::min<std::size_t>(1000, bytes.size() - i));
  }
  zip.Close();
  zip.Close();
  EXPECT_THROW(zip.Write("x", 1), StreamError);
  return out.Take();
}

std::string Unzipped(const std::string& zipped) {
  IStringByteStream in(zipped.data(), zipped.size());
  IZipByteStream zip(in);
  std::string all;
  char piece[64];
  while (const std::size_t got = zip.ReadSome(piece, sizeof piece)) all.append(piece, got);
  return all;
}

TEST(ZipStreamTest, SmallAndLargeDataRoundTrips) {
  for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{300000}}) {
    const std::string bytes = Sample(size), zipped = Zipped(bytes);
    EXPECT_EQ(zipped.front(), 0x78);  // zlib's format, window of 32 KiB
    EXPECT_LT(zipped.size(), size * 6 / 10 + 100);
    IStringByteStream in(zipped.data(), zipped.size());
    IZipByteStream zip(in);
    ReadOneOfEach(zip);
    if (size > 0) {
      EXPECT_THROW(zip.Finish(), StreamError) << "more than was read";
    } else {
      zip.Finish();
    }
    EXPECT_EQ(Unzipped(zipped), kBytes + bytes);
  }
}

// Cut at every byte, or with one bit flipped. A few bits of the format mean nothing; all others
// must be missed by somebody.
TEST(ZipStreamTest, DamageNeverGivesOtherData) {
  const std::string zipped = Zipped(Sample(200)), whole = Unzipped(zipped);
  for (std::size_t size = 0; size < zipped.size(); ++size) {
    EXPECT_THROW(Unzipped(zipped.substr(0, size)), StreamError) << size;
  }
  std::size_t found = 0;
  for (std::size_t i = 0; i < zipped.size() * 8; ++i) {
    std::string damaged = zipped;
    damaged[i / 8] = static_cast<char>(damaged[i / 8] ^ 1 << i % 8);
    try {
      EXPECT_EQ(Unzipped(damaged), whole) << "bit " << i;
    } catch (const StreamError&) {
      ++found;
    }
  }
  EXPECT_GT(found, zipped.size() * 8 - 16);
}

TEST(ZipStreamTest, TheBoundHoldsForTheMostCompactData) {
  OStringByteStream out;
  OZipByteStream writer(out);
  constexpr std::size_t kSize = 20 << 20;
  writer.Write(std::string(kSize, '\0').data(), kSize);
  writer.Close();
  IStringByteStream in(out.bytes().data(), out.bytes().size());
  IZipByteStream zip(in);
  std::string piece(1 << 16, 'x');
  for (std::size_t read = 0; read < kSize; read += piece.size()) {
    ASSERT_GE(zip.MaxBytesLeft(), kSize - read);
    zip.Read(piece.data(), piece.size());
  }
  zip.Finish();
  EXPECT_EQ(zip.MaxBytesLeft(), 0u);
}

TEST(FileTest, TruncatesAndTellsOfFailures) {
  const std::string path = ::testing::TempDir() + "calmframe_\u00e9.bin";
  for (const std::string text : {"longer text", "text"}) {
    File file;
    ASSERT_TRUE(file.OpenForWriting(path));
    EXPECT_TRUE(file.Write(text.data(), text.size()));
    EXPECT_TRUE(file.Close());
    std::ifstream in(path, std::ios::binary);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(in), {}), text);
  }
  std::remove(path.c_str());
  File file;
  EXPECT_FALSE(file.OpenForWriting(path + "/no/such/folder"));
  EXPECT_FALSE(file.Write("x", 1));
  if (file.OpenForWriting("/dev/full")) {
    file.Write("x", 1);
    EXPECT_FALSE(file.Close());
  }
}

}  // namespace
}  // namespace tessel::filesupport
