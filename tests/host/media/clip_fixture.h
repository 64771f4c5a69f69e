#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::media {

// What a command prints; fails the test if the command fails.
inline std::string Output(const std::string& command) {
  std::string text;
  FILE* pipe = popen(command.c_str(), "r");
  char buffer[4096];
  while (std::size_t n = fread(buffer, 1, sizeof buffer, pipe)) text.append(buffer, n);
  EXPECT_EQ(pclose(pipe), 0) << command;
  return text;
}

// A folder of its own for each test, with small clips and their pixels.
class ClipTest : public testing::Test {
 protected:
  std::string In(const std::string& name) const { return folder_.In(name); }
  std::string Content(const std::string& name) const { return folder_.Content(name); }

  static void Ffmpeg(const std::string& arguments) {
    Output("ffmpeg -nostdin -y -v error " + arguments);
  }
  static ClipInfo Made(int width, int height, std::size_t frames, int bit_depth = 8) {
    ClipInfo info;
    info.width = width;
    info.height = height;
    info.frame_rate = {25, 1};
    info.frame_count = frames;
    info.bit_depth = bit_depth;
    return info;
  }

  template <class Pixel>
  static std::vector<Pixel> ReadFrame(ClipReader& reader, std::size_t frame) {
    const ClipInfo& info = reader.info();
    std::vector<Pixel> pixels(static_cast<std::size_t>(info.width) * info.height);
    reader.Read(frame, pixels.data(), static_cast<std::ptrdiff_t>(sizeof(Pixel)) * info.width);
    return pixels;
  }

  template <class Pixel>
  static void WriteFrame(ClipWriter& writer, std::size_t frame, int width,
                         const std::vector<Pixel>& pixels) {
    writer.Write(frame, pixels.data(), static_cast<std::ptrdiff_t>(sizeof(Pixel)) * width);
  }

  // Line of the failure; the wrong side or none fails the test.
  template <class Action>
  static std::string LineOf(Failure::Side side, Action action) {
    try {
      action();
    } catch (const Failure& failure) {
      EXPECT_EQ(failure.side, side);
      const std::string line = failure.what();
      EXPECT_EQ(line.find('\n'), std::string::npos);
      return line;
    }
    ADD_FAILURE() << "nothing was refused";
    return {};
  }

 private:
  const ScratchFolder folder_;
};

template <class Pixel>
bool SamePixels(const std::vector<Pixel>& a, const std::vector<Pixel>& b) {
  return a.size() == b.size() && std::memcmp(a.data(), b.data(), a.size() * sizeof(Pixel)) == 0;
}

}  // namespace calmframe::media
