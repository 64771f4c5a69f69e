#pragma once

#include <cstdint>
#include <string>

#include "analysis/src/rational_time.h"
#include "platform/tessel/guid.h"

namespace kelp::analysis {

// What is analysed. Field names are also the persisted keys.
struct JobInput {
  std::u16string ProjectPath;
  tessel::utility::Guid SourceID;
  std::int32_t FieldType = -1;  // HX_FIELD_*; -1 until set
  RationalTime StartTime;
  RationalTime Duration;
  RationalTime StepTime;  // of one frame, fields or not
};

// Whether the fields of a frame are analysed as frames of their own.
inline bool CountsFields(const JobInput& input) {
  return input.FieldType == 1 || input.FieldType == 2;
}

// From one row of the track table to the next: StepTime, or half of it where fields are counted.
inline RationalTime RowDuration(const JobInput& input) {
  return CountsFields(input) ? input.StepTime / 2 : input.StepTime;
}

}  // namespace kelp::analysis
