#pragma once

#include <array>
#include <cstdint>

#include "effect/parameter_reader.h"
#include "stabilizer/effect/src/parameter_table.h"

namespace kelp::effect {

// The present value of a declared parameter; see ValueOf. Failures are thrown, an unknown index
// among them.
class ParameterSource {
 public:
  virtual ~ParameterSource() = default;
  virtual double Value(std::int32_t index) const = 0;
};

// Values without a host, each at its default until set.
class ParameterValues final : public ParameterSource {
 public:
  ParameterValues();
  double& operator[](std::int32_t index) { return values_.at(static_cast<std::size_t>(index)); }
  double Value(std::int32_t index) const override {
    return values_.at(static_cast<std::size_t>(index));
  }

 private:
  std::array<double, kParamCount> values_{};
};

// Reads the source, but for experimental parameters that are not shown: those have their defaults,
// and the source is not asked.
class TableReader final : public ParameterReader {
 public:
  // Keeps a reference to the source.
  TableReader(const ParameterSource& source, bool shows_experimental)
      : source_(source), shows_experimental_(shows_experimental) {}

  double GetFloatParam(std::int32_t id) const override;
  // The source's value + 0.5, truncated; a default is truncated as it is.
  std::int32_t GetIntParam(std::int32_t id) const override;
  bool GetBoolParam(std::int32_t id) const override;
  std::int32_t GetPopupParam(std::int32_t id) const override;

 private:
  bool IsParamAbsent(std::int32_t index) const {
    return !shows_experimental_ && IsExperimentalIndex(index);
  }

  const ParameterSource& source_;
  const bool shows_experimental_;
};

}  // namespace kelp::effect
