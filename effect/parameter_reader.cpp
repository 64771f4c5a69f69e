#include "effect/parameter_reader.h"

#include "platform/tessel/debug.h"

namespace kelp::effect {

bool ShowsExperimentalParameters() {
  static const bool shows =
      tessel::debug::DebugDatabase::GetBool("ShowExperimentalEffectParameters");
  return shows;
}

}  // namespace kelp::effect
