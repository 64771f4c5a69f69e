#pragma once

#include <cstdint>

// Reading parameters by id or index.
namespace kelp::effect {

class ParameterReader {
 public:
  virtual ~ParameterReader() = default;
  virtual double GetFloatParam(std::int32_t id) const = 0;
  virtual std::int32_t GetIntParam(std::int32_t id) const = 0;
  virtual bool GetBoolParam(std::int32_t id) const = 0;
  virtual std::int32_t GetPopupParam(std::int32_t id) const = 0;
};

// Whether the experimental parameters are declared; asked of the debug options once a process.
bool ShowsExperimentalParameters();

}  // namespace kelp::effect
