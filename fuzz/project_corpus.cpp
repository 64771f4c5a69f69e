// Writes a corpus for project_fuzz into a folder: good projects of every version and kind, and some
// whose handles tell what isn't so.

#include <filesystem>
#include <fstream>
#include <iostream>

#include "fuzz/project_input.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "tests/stabilizer/effect/state_format/samples.h"

int main(int argc, char** argv) {
  using namespace calmframe::host;
  using kelp::effect::InstanceHandleHeader;
  if (argc != 2) {
    std::cerr << "project_corpus: name the folder\n";
    return 2;
  }
  std::filesystem::create_directories(argv[1]);
  int count = 0;
  const auto add = [&](const std::string& name, const ProjectInput& input,
                       InstanceHandleHeader header, const std::string& payload) {
    header.payload_length = payload.size();
    const std::string instance(reinterpret_cast<const char*>(&header), sizeof header);
    std::ofstream(std::filesystem::path(argv[1]) / (name + "_" + std::to_string(count++)),
                  std::ios::binary)
        << BytesOf(input, instance + payload);
  };
  // The samples' two frames are 7 and 8.
  ProjectInput input{.start_frame = 7, .length = 2};
  for (const auto& file : std::filesystem::directory_iterator(CALMFRAME_SAMPLES)) {
    const std::string name = file.path().filename();
    const kelp::effect::Sample sample = kelp::effect::ReadSample(name);
    const bool raw = sample.version >= kelp::effect::state_format::kRawPayloads;
    const InstanceHandleHeader header{sample.version, 1, raw, nullptr, 0};
    for (const int path : {0, kDirectly | kTicks}) {
      input.flags = static_cast<std::uint8_t>(path | (raw ? 0 : kToBeDeflated));
      ++input.framing;
      add(name, input, header, sample.plain);
    }
  }
  auto* const nowhere = reinterpret_cast<kelp::effect::StabilizerState*>(0x4141414141414140);
  input.flags = 0;
  add("live", input, {16, 0, 1, nowhere, 0}, "\1");
  add("too_old", input, {2, 1, 1, nowhere, 0}, "\1");
  add("too_new", input, {17, 1, 1, nowhere, 0}, "\1");
  add("nothing", input, {16, 1, 1, nowhere, 0}, "");
}
