#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>

#include "platform/hx/hx_controls.h"
#include "platform/hx/hx_params.h"

// A parameter as it is declared to the host, as data.
namespace kelp::effect {

// A text of a row: an entry of the string table, or a literal, which may be keyed.
struct ParameterText {
  constexpr ParameterText() = default;
  constexpr ParameterText(const char* text) : literal(text) {}
  constexpr ParameterText(std::int32_t string_number) : number(string_number) {}

  const char* literal = "";
  std::int32_t number = -1;  // -1: the literal
};

// Plain texts for rows. What it hands out lives as long as it and the string table, and records of
// the host point at it, so it must live until the plug-in is stopped. User interface thread.
class ParameterTexts {
 public:
  // numbered: the string table's text of a number, null where there is none.
  explicit ParameterTexts(std::function<const char*(std::int32_t)> numbered);
  const char* Get(const ParameterText& text);

 private:
  const std::function<const char*(std::int32_t)> numbered_;
  std::map<std::string, std::string> localized_;  // by literal
};

struct ParameterRange {
  float min = 0, max = 0;
};

// How a slider's number is shown: decimals, and HX_FloatSlider.display.
struct ParameterFormat {
  std::int16_t precision = 0, display = 0;
};
inline constexpr ParameterFormat kPercent = {0, 1};
constexpr ParameterFormat Decimals(std::int16_t count) {
  return {count, 0};
}

struct ParameterRow {
  std::int32_t disk_id = 0;
  std::int32_t kind = HX_PARAM_LAYER;
  ParameterText name = {};
  ParameterText text = {};                 // a popup's items or a button's label
  ParameterRange valid = {}, slider = {};  // of a float slider
  double default_value = 0;                // a popup's item from 1, a checkbox's 0 or 1
  ParameterFormat format = {};
  std::uint32_t flags = 0, ui_flags = 0;
};

constexpr ParameterRow SliderRow(std::int32_t disk_id, ParameterText name, ParameterRange valid,
                                 ParameterRange slider, double default_value,
                                 ParameterFormat format, std::uint32_t flags,
                                 std::uint32_t ui_flags = 0) {
  return {disk_id, HX_PARAM_FLOAT_SLIDER, name,   {},    valid,
          slider,  default_value,         format, flags, ui_flags};
}
constexpr ParameterRow SliderRow(const HX_SliderControl& control, ParameterText name,
                                 ParameterRange slider, ParameterFormat format, std::uint32_t flags,
                                 std::uint32_t ui_flags = 0) {
  return SliderRow(control.disk_id, name,
                   {static_cast<float>(control.min), static_cast<float>(control.max)}, slider,
                   control.default_value, format, flags, ui_flags);
}
constexpr ParameterRow PopupRow(const HX_PopupControl& control, ParameterText name,
                                ParameterText items, std::uint32_t flags) {
  return {.disk_id = control.disk_id,
          .kind = HX_PARAM_POPUP,
          .name = name,
          .text = items,
          .default_value = double(control.default_item),
          .flags = flags};
}
constexpr ParameterRow CheckboxRow(const HX_CheckboxControl& control, ParameterText name,
                                   std::uint32_t flags) {
  return {.disk_id = control.disk_id,
          .kind = HX_PARAM_CHECKBOX,
          .name = name,
          .default_value = double(control.default_value),
          .flags = flags};
}
constexpr ParameterRow ButtonRow(std::int32_t disk_id, ParameterText label, std::uint32_t flags,
                                 std::uint32_t ui_flags = 0) {
  return {disk_id, HX_PARAM_BUTTON, {}, label, {}, {}, 0, {}, flags, ui_flags};
}
constexpr ParameterRow GroupStartRow(std::int32_t disk_id, ParameterText name,
                                     std::uint32_t flags = 0) {
  return {disk_id, HX_PARAM_GROUP_START, name, {}, {}, {}, 0, {}, flags};
}
constexpr ParameterRow GroupEndRow(std::int32_t disk_id) {
  return {disk_id, HX_PARAM_GROUP_END};
}

// The record that declares the row, at its default. A name that is too long is cut.
HX_ParamDef MakeParamDef(const ParameterRow& row, ParameterTexts& texts);

// What the user set: a slider's number, a popup's item from 1, a checkbox's 0 or 1; else 0.
double ValueOf(const HX_ParamDef& param);

}  // namespace kelp::effect
