#pragma once

#include <cstdint>
#include <initializer_list>
#include <stdexcept>
#include <string>

#include "effect/source_shape.h"
#include "platform/hx/hx_effect.h"

namespace kelp::analysis {

// Persisted state that cannot be taken over.
class StateDeserializationFailed : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Whether the reader that reports a failure has to end by StateDeserializationFailed.
enum class AfterReport { GoOn, Throw };

// Tells the user why a stored state is refused: by the return message, the last one of a call wins,
// and by the trace. Puts values[0] for each "^1" of the literal's text and so on.
void ReportStateError(HX_InData* host_in, HX_OutData* host_out, const char* literal,
                      std::initializer_list<std::string> values, AfterReport after);

// The stored state is of a source of another size.
void ReportSizeMismatch(HX_InData* host_in, HX_OutData* host_out, const std::string& effect_name,
                        const kelp::effect::SourceShape& stored,
                        const kelp::effect::SourceShape& present, AfterReport after);

}  // namespace kelp::analysis
