#pragma once

#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <string>

namespace calmframe::batch {

// What an output is called, by a template in which {stem} and {ext} stand for the clip's name
// without its extension and for that, with its dot. `below`: the folder beneath the one that was
// searched, which the output keeps; may be empty. Relative.
std::string OutputName(const std::string& name_template, const std::string& below,
                       const std::string& clip);

// Why a template can't be one, in words; empty of one that can.
std::string TemplateTrouble(const std::string& name_template);

// A name for a folder, unique for an output's: letters, digits and few signs, at most 81 bytes.
std::string TaskId(const std::string& output);

// A file's name may be any bytes, JSON's text may not: what is no UTF-8 is an array of numbers.
nlohmann::ordered_json JsonOfBytes(const std::string& bytes);
// Throws nlohmann::json::exception.
std::string BytesOf(const nlohmann::ordered_json& json);

// Throws nlohmann::json::exception for what is no whole number, which a conversion would make one
// of in ways that are not defined.
std::int64_t WholeOf(const nlohmann::ordered_json& json);

}  // namespace calmframe::batch
