// Writes a corpus for project_fuzz into a folder: good projects of every version and kind, and some
// whose handles tell what isn't so.

#include <filesystem>
#include <stdexcept>
#include <string>

#include "fuzz/project_input.h"
#include "fuzz/seeds.h"
#include "platform/hx/hx_types.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "tests/stabilizer/effect/state_format/samples.h"

namespace {

// Has each vertex of the two frames where its frame's corners put it, for the zeros pack.
std::string Smooth(std::string payload) {
  constexpr std::size_t kCorners = 4 * 2 * 8, kOffsets = 64 * 36 * 2 * 4;
  if (payload.size() < 2 * (kCorners + kOffsets)) return payload;
  const std::string grid("\x40\0\0\0\x24\0\0\0", 8);
  std::size_t place = payload.rfind(grid) + grid.size();
  for (int frame = 0; frame < 2; ++frame) {
    place += kCorners;
    payload.replace(place, kOffsets, kOffsets, '\0');
    place += kOffsets;
  }
  return payload;
}

// The controls' defaults, but for the framing.
class Defaults final : public kelp::effect::ParameterReader {
 public:
  explicit Defaults(int framing) : framing_(framing) {}

 private:
  std::int32_t IndexOf(std::int32_t id) const override { return id; }
  bool IsAbsent(std::int32_t) const override { return false; }
  double Default(std::int32_t) const override { return 0; }
  double Value(std::int32_t index) const override {
    return index == kelp::effect::kFramingIndex ? framing_ : kelp::effect::GetParamDefault(index);
  }

  const int framing_;
};

// The parameters' hashes stand behind the phase.
std::string WithHashes(std::string payload, int framing) {
  const auto record =
      kelp::effect::GetSolverParams(Defaults(framing), {64, 36, 1, 1}, 24000 / 1001.0);
  const std::int64_t hashes[] = {kelp::effect::SolveHash(record), kelp::effect::CropHash(record)};
  return payload.replace(payload.find("vloS") + 8, sizeof hashes,
                         reinterpret_cast<const char*>(hashes), sizeof hashes);
}

}  // namespace

int main(int argc, char** argv) {
  using namespace calmframe::host;
  using kelp::effect::InstanceHandleHeader;
  const calmframe::fuzz::SeedFolder folder(argc, argv);
  const auto add = [&](const std::string& name, const ProjectInput& input,
                       const InstanceHandleHeader& header, const std::string& payload) {
    const std::string instance = calmframe::fuzz::BytesOf(header) + payload;
    std::string packed = Packed(instance);
    if (Unpacked(packed.data(), packed.size()) != instance) throw std::logic_error(name);
    // The samples' analysis is told to begin elsewhere than its table does.
    const std::string begin = R"("StartTime":{"value":0,"scale":1})";
    if (const std::size_t place = packed.find(begin); place != std::string::npos) {
      packed.replace(place, begin.size(), R"("StartTime":{"value":7007,"scale":24000})");
    }
    folder.Add(name, calmframe::fuzz::BytesOf(input) + packed);
  };
  // The samples' two frames are 7 and 8, of 24000 in 1001 seconds.
  ProjectInput input{.ticks_per_frame = HX_TICKS_PER_SECOND * 1001 / 24000 - 1,
                     .start_frame = 7,
                     .length = 2,
                     .frame = 1};
  for (const auto& file : std::filesystem::directory_iterator(CALMFRAME_SAMPLES)) {
    const std::string name = file.path().filename();
    const kelp::effect::Sample sample = kelp::effect::ReadSample(name);
    const bool raw = sample.version >= kelp::effect::state_format::kRawPayloads;
    const InstanceHandleHeader header{sample.version, 1, raw, nullptr, kAllThatFollow};
    const auto add_with = [&](const char* path, int flags, int work) {
      input.flags = static_cast<std::uint8_t>(flags | (raw ? 0 : kToBeDeflated));
      input.work = static_cast<std::uint8_t>(work);
      ++input.framing;
      add(name + path, input, header, Smooth(sample.plain));
    };
    add_with("", 0, 0);
    add_with("_direct", kDirectly | kBanner, 0);
    add_with("_begun", 0, kBegins);
    if (sample.version == 16) add_with("_settled", kDeeply, kSettles);
  }
  const InstanceHandleHeader present{16, 1, 1, nullptr, kAllThatFollow};
  // Solved for just what is asked for, of just the layer, so that it is drawn and nothing begins.
  const std::string solved = Smooth(kelp::effect::ReadSample("v16_solved_no_job").plain);
  input.work = 0;
  for (const int flags : {0, int{kDirectly}, kDeeply | kWhole, int{kFields}, int{kWidePixels}}) {
    for (std::uint8_t framing = 0; framing < 4; ++framing) {
      input.flags = static_cast<std::uint8_t>(flags);
      input.framing = framing;
      add("ready_" + std::to_string(flags) + "_" + std::to_string(framing), input, present,
          WithHashes(solved, framing + 1));
    }
  }
  input.flags = 0;
  // Of a job that is still to begin.
  std::string waiting = kelp::effect::ReadSample("v16_empty").plain;
  const std::string stage("e\0\"\0:\0", 6);
  waiting.replace(waiting.rfind(stage) + stage.size(), 1, "0");
  for (std::uint8_t work = 0; work <= kSettles; ++work) {
    input.work = work;
    add("waiting_" + std::to_string(work), input, present, waiting);
  }
  input.work = 0;
  auto* const nowhere = reinterpret_cast<kelp::effect::StabilizerState*>(0x4141414141414140);
  input.flags = 0;
  add("live", input, {16, 0, 1, nowhere, 1}, std::string(1, '\1'));
  add("too_old", input, {2, 1, 1, nowhere, 1}, std::string(1, '\1'));
  add("too_new", input, {17, 1, 1, nowhere, 1}, std::string(1, '\1'));
  add("nothing", input, {16, 1, 1, nowhere, 0}, "");
}
