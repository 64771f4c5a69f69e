// Steadies a file of raw frames into another one, on all processors: RGBA of 8 bits, one frame
// behind the other.
//
//   steady_threads IN OUT WIDTH HEIGHT RATE
//
// Frames are fetched from where they lie in the file, and drawn to where they lie in the other, so
// that any of them may come at any time, and no more than a few are in memory.
#include <calmframe.hpp>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <thread>
#include <vector>

namespace {

void Expect(bool holds, const char* what) {
  if (!holds) throw std::runtime_error(what);
}

}  // namespace

int main(int argc, char** argv) try {
  Expect(argc == 6, "usage: steady_threads IN OUT WIDTH HEIGHT RATE");
  const int in = open(argv[1], O_RDONLY), out = open(argv[2], O_RDWR | O_CREAT | O_TRUNC, 0666);
  Expect(in >= 0 && out >= 0, "a file can't be opened");
  const int width = std::atoi(argv[3]), height = std::atoi(argv[4]);
  const auto bytes = static_cast<std::size_t>(width) * height * 4;
  struct stat info {};
  Expect(fstat(in, &info) == 0 && bytes > 0, "the file has no size");

  calmframe::Options options(width, height, info.st_size / static_cast<std::int64_t>(bytes));
  options.rate_num = std::atoi(argv[5]);
  calmframe::Session session(options, [&](std::int64_t frame, const calmframe_image& image) {
    for (int y = 0; y < height; ++y) {
      const auto row = static_cast<std::size_t>(width) * 4;
      Expect(pread(in, static_cast<char*>(image.plane[0]) + image.stride[0] * y, row,
                   frame * static_cast<off_t>(bytes) + y * static_cast<off_t>(row)) ==
                 static_cast<ssize_t>(row),
             "a frame can't be read");
    }
  });

  session.Start();
  while (!session.Wait(500)) {
    const calmframe_progress progress = session.progress();
    std::cerr << progress.stage << " " << progress.done << " of " << progress.total << "\n";
  }
  std::cerr << session.outcome().decibels << " dB calmer, " << 100 * session.outcome().width_kept
            << " % of the width kept\n";

  std::atomic<std::int64_t> next = 0;
  std::atomic<bool> failed = false;
  const auto draw = [&] {
    try {
      std::vector<unsigned char> pixels(bytes);
      const calmframe_image image = calmframe::Image(pixels.data(), width * 4, width, height);
      for (std::int64_t f = next++; f < options.frame_count && !failed; f = next++) {
        session.Render(f, image);
        Expect(pwrite(out, pixels.data(), bytes, f * static_cast<off_t>(bytes)) ==
                   static_cast<ssize_t>(bytes),
               "a frame can't be written");
      }
    } catch (const std::exception& error) {
      failed = true;
      std::cerr << error.what() << "\n";
    }
  };
  std::vector<std::thread> threads;
  for (unsigned t = 0; t < std::max(2u, std::thread::hardware_concurrency()); ++t) {
    threads.emplace_back(draw);
  }
  for (std::thread& thread : threads) thread.join();
  return failed ? 1 : 0;
} catch (const std::exception& error) {
  std::cerr << "steady_threads: " << error.what() << "\n";
  return 1;
}
