#pragma once

#include <cstdint>
#include <optional>

#include "effect/host_context.h"

// What an effect asks of its host. Each throws the host's code, and HX_ERR_MISSING_SUITE with its
// message.
namespace kelp::effect {

// A re-render, later; calls nothing. Any thread.
void ForceRerender(const HostContext& context);

// The following ones are for the user interface thread.

void RefreshAllWindows(const HostContext& context);
// UTF-8; two nulls clear the panel.
void ShowInfoText(const HostContext& context, const char* line1, const char* line2);

// How a parameter stands in the panel; what has no value stays.
struct ParamAppearance {
  std::optional<bool> enabled;
  const char* name = nullptr;  // UTF-8, cut between characters to the room of the record
};

// Asks for a change where the parameter looks otherwise.
void UpdateParamUI(const HostContext& context, std::int32_t index,
                   const ParamAppearance& appearance);
// Writes a slider's value back.
void SetSliderValue(const HostContext& context, std::int32_t index, double value);

}  // namespace kelp::effect
