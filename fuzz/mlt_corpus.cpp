// Writes a corpus for mlt_fuzz into a folder: properties beside saved work, of which one is whole.

#include <cmath>
#include <vector>

#include "fuzz/mlt_input.h"
#include "fuzz/saved_work_seeds.h"
#include "library/calmframe.hpp"

namespace {

using namespace calmframe;
using namespace std::string_literals;

constexpr int kFrames = 5;

// What a session saves of a plane that shakes, as `work` tells of it.
std::string SolvedInstance(const fuzz::SavedWork& work) {
  setenv("CALMFRAME_PLUGIN", CALMFRAME_PLUGIN, 1);
  Options options;
  options.width = work.width;
  options.height = work.height;
  options.rate_num = 24000;
  options.rate_den = 1001;
  options.frame_count = kFrames;
  options.identity = "clip";
  options.shots = CALMFRAME_SHOTS_ONE;
  Session session(options);
  std::vector<std::uint8_t> pixels(4 * static_cast<std::size_t>(work.width * work.height));
  calmframe_image image{};
  image.width = work.width;
  image.height = work.height;
  image.plane[0] = pixels.data();
  image.stride[0] = 4 * work.width;
  for (int frame = 0; frame < kFrames; ++frame) {
    for (int y = 0; y < work.height; ++y) {
      for (int x = 0; x < 4 * work.width; ++x) {
        const double u = x / 4 + 2 * std::sin(frame), v = y + std::cos(2 * frame);
        pixels[static_cast<std::size_t>(4 * work.width * y + x)] =
            static_cast<std::uint8_t>(127 + 60 * std::sin(u * 0.9) + 60 * std::sin(v * 0.7 + u));
      }
    }
    session.Push(frame, image);
  }
  session.Wait();
  const fuzz::ScratchFile file;
  session.Save(file.path());
  const host::Project project = host::LoadProject(file.path());
  const auto& bytes = project.shots.front().effect.instance;
  return host::Packed({bytes.begin(), bytes.end()});
}

}  // namespace

int main(int argc, char** argv) {
  const fuzz::SeedFolder folder(argc, argv);
  fuzz::MltInput input{
      .rate_num = 24000, .rate_den = 1001, .display_num = 16, .display_den = 9, .frame = 2};
  const std::string properties = "results\0a.calm@3\0smoothness\0"s + "80\0\0"s;
  fuzz::AddSavedWork([&](const std::string& name, const std::string& work) {
    input.is_packed ^= 1;
    folder.Add(name, fuzz::BytesOf(input) + properties + work);
  });
  fuzz::SavedWork solved = fuzz::SampleWork();
  solved.length = solved.end_frame = kFrames;
  const std::string work = fuzz::WorkInput(solved, "", "", SolvedInstance(solved));
  for (const std::uint8_t is_packed : {0, 1}) {
    input.is_packed = is_packed;
    folder.Add("solved_" + std::to_string(is_packed), fuzz::BytesOf(input) + properties + work);
    folder.Add("items_" + std::to_string(is_packed),
               fuzz::BytesOf(input) + "method\0position\0zoom_speed\0"s + "1e3\0as_set\0"s +
                   "1\0steady\0subject\0\0"s + work);
  }
}
