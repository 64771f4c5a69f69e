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

// How an effect reads its parameters: one that is not declared has its default, and nobody is asked
// for it.
class VisibleParameterReader : public ParameterReader {
 public:
  double GetFloatParam(std::int32_t id) const final;
  // The value + 0.5, truncated; a default is truncated as it is.
  std::int32_t GetIntParam(std::int32_t id) const final;
  bool GetBoolParam(std::int32_t id) const final;
  std::int32_t GetPopupParam(std::int32_t id) const final;

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
