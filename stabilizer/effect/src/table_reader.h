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

// The parameters of the table, with or without the experimental ones.
class TableReader final : public VisibleParameterReader {
 public:
  // Keeps a reference to the source.
  TableReader(const ParameterSource& source, bool shows_experimental)
      : source_(source), shows_experimental_(shows_experimental) {}

 private:
  std::int32_t IndexOf(std::int32_t id) const override;
  bool IsAbsent(std::int32_t index) const override {
    return !shows_experimental_ && IsExperimentalIndex(index);
  }
  double Default(std::int32_t index) const override { return GetParamDefault(index); }
  double Value(std::int32_t index) const override { return source_.Value(index); }

  const ParameterSource& source_;
  const bool shows_experimental_;
};

}  // namespace kelp::effect
