// Whatever a project holds, a host can open it, draw a frame of it, save it and close it, and
// nothing of it is left.

#include <boost/make_shared.hpp>
#include <cstdlib>
#include <cstring>
#include <iostream>

#include "fuzz/project_input.h"
#include "host/base/operations.h"
#include "host/effects/session.h"
#include "platform/hx/hx_controls.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "tests/stabilizer/effect/state_format/samples.h"
#include "tests/support/linked_plugin.h"
#include "tests/support/shaky_clip.h"

namespace {

using namespace calmframe::host;
using kelp::effect::InstanceHandleHeader;

struct Stage {
  Host host{LinkedPlugin()};
  Session session{host};
};

std::vector<std::uint8_t> InstanceIn(const ProjectInput& input, const char* bytes,
                                     std::size_t size) {
  std::string instance(bytes, size);
  if ((input.flags & kToBeDeflated) && size >= sizeof(InstanceHandleHeader)) {
    InstanceHandleHeader header;
    std::memcpy(&header, bytes, sizeof header);
    const std::string payload = kelp::effect::Deflated(instance.substr(sizeof header));
    header.raw = 0;
    header.payload_length = payload.size();
    instance.assign(reinterpret_cast<const char*>(&header), sizeof header);
    instance += payload;
  }
  return {instance.begin(), instance.end()};
}

void Expect(bool holds, const char* what) {
  if (holds) return;
  std::cerr << what << '\n' << Ledger::Get().Report();
  std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static Stage& stage = *new Stage;
  ProjectInput input;
  if (size < sizeof input) return 0;
  std::memcpy(static_cast<void*>(&input), data, sizeof input);

  const std::vector<HX_ParamDef>& declared = stage.host.declarations();
  SavedEffect saved;
  saved.match_name = stage.host.library().properties().match_name;
  saved.values[declared[1 + input.control % (declared.size() - 1)].disk_id] = input.value;
  saved.values[HX_FRAMING.disk_id] = 1 + input.framing % 4;
  saved.instance =
      InstanceIn(input, reinterpret_cast<const char*>(data) + sizeof input, size - sizeof input);
  ShakyClip clip{64, 36, 16};
  if (input.flags & kOnePixel) clip.width = clip.height = 1;
  if (input.flags & kWidePixels) clip.aspect = {2, 1};
  const auto layer = boost::make_shared<Layer>(MakeShakyClip(clip));
  layer->Change([&input](LayerState& state) {
    state.start_frame = input.start_frame;
    state.length = input.length;
  });

  Effect& effect = stage.session.Load(layer, saved);
  if (input.flags & kTicks) effect.Tick();
  const RenderRequest request{.frame = input.frame, .bit_depth = input.flags & kDeeply ? 16 : 8};
  {
    const auto renderer = effect.MakeRenderer();
    if (input.flags & kDirectly) {
      renderer->Direct(request);
    } else {
      renderer->Planned(request);
    }
  }
  SavedEffect again;
  effect.Save(&again);
  stage.session.Remove(effect);
  Expect(stage.host.handles().count() == 1, "handles are left");  // the plug-in's global data
  Expect(stage.host.worlds().count() == 0, "frames are left");
  Expect(Ledger::Get().mistakes().empty(), "mistakes were made");
  return 0;
}
