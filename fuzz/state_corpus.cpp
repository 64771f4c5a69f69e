// Writes a corpus for state_fuzz into a folder: payloads of every version.

#include <filesystem>

#include "fuzz/seeds.h"
#include "fuzz/state_input.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"

int main(int argc, char** argv) {
  using namespace kelp::effect;
  const calmframe::fuzz::SeedFolder folder(argc, argv);
  int count = 0;
  const auto add = [&](std::uint32_t version, std::uint8_t flags, const std::string& payload) {
    const std::string name = "v" + std::to_string(version) + "_" + std::to_string(count++);
    folder.Add(name, StateInput(version, flags, payload));
  };
  for (const auto& file : std::filesystem::directory_iterator(CALMFRAME_SAMPLES)) {
    const Sample sample = ReadSample(file.path().filename());
    add(sample.version, kAsItStands, sample.deflated);
    add(sample.version, 0, sample.plain);
    add(sample.version, kOneByOne, sample.plain);
    try {
      const SourceShape present{64, 36, 1, 1};
      tessel::filesupport::OStringByteStream out;
      WriteState(out,
                 ReadState(sample.plain.data(), sample.plain.size(), sample.version, HX_PAYLOAD_RAW,
                           present),
                 state_format::PayloadForm::packed);
      add(state_format::kPresentVersion, kPacked, out.Take());
    } catch (const StateRefused&) {  // one of the samples that are
    }
  }
}
