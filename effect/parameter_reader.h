#pragma once

#include <cstdint>

namespace kelp::effect {

// How an effect reads its parameters, by id or index: one that is not declared has its default, and
// nobody is asked for it.
class ParameterReader {
 public:
  virtual ~ParameterReader() = default;

  double GetFloatParam(std::int32_t id) const;
  // The value + 0.5, truncated; a default is truncated as it is.
  std::int32_t GetIntParam(std::int32_t id) const;
  bool GetBoolParam(std::int32_t id) const;
  std::int32_t GetPopupParam(std::int32_t id) const;

 private:
  // An id that has no index is taken for one.
  virtual std::int32_t IndexOf(std::int32_t id) const = 0;
  virtual bool IsAbsent(std::int32_t index) const = 0;
  virtual double Default(std::int32_t index) const = 0;
  // The present value of a declared parameter; see ValueOf. Failures are thrown.
  virtual double Value(std::int32_t index) const = 0;
};

// Whether the experimental parameters are declared; asked of the debug options once a process.
bool ShowsExperimentalParameters();

}  // namespace kelp::effect
