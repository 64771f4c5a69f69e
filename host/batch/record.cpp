#include "host/batch/record.h"

#include <algorithm>
#include <cmath>
#include <iterator>

#include "host/batch/clip_names.h"

namespace calmframe::batch {
namespace {

constexpr const char* kStates[] = {"begun", "failed", "done"};  // as Record::State counts

nlohmann::ordered_json JsonOfList(const std::vector<std::string>& words) {
  auto list = nlohmann::ordered_json::array();
  for (const std::string& word : words) list.push_back(JsonOfBytes(word));
  return list;
}

std::vector<std::string> ListOf(const nlohmann::ordered_json& json) {
  std::vector<std::string> words;
  for (const auto& word : json) words.push_back(BytesOf(word));
  return words;
}

// None of a state that there is not.
std::optional<Record> RecordOf(const nlohmann::ordered_json& json) {
  Record record;
  const auto state = std::find(std::begin(kStates), std::end(kStates), json.at("state"));
  if (state == std::end(kStates)) return std::nullopt;
  record.state = static_cast<Record::State>(state - std::begin(kStates));
  record.run = json.value("run", "");
  record.source = BytesOf(json.at("source"));
  record.source_identity = IdentityOf(json.at("source_identity"));
  record.settings = ListOf(json.at("settings"));
  record.output = BytesOf(json.at("output"));
  if (json.contains("output_identity")) {
    record.output_identity = IdentityOf(json.at("output_identity"));
  }
  record.error = json.value("error", "");
  record.exit_code = static_cast<int>(WholeOf(json.at("exit_code")));
  record.seconds = json.at("seconds").get<double>();
  if (json.contains("outcome")) record.outcome = json.at("outcome");
  record.warnings = ListOf(json.at("warnings"));
  return record;
}

}  // namespace

std::string TextOf(const Record& record) {
  nlohmann::ordered_json json;
  json["state"] = kStates[static_cast<std::size_t>(record.state)];
  json["run"] = record.run;
  json["source"] = JsonOfBytes(record.source);
  json["source_identity"] = JsonOf(record.source_identity);
  json["settings"] = JsonOfList(record.settings);
  json["output"] = JsonOfBytes(record.output);
  if (record.output_identity) json["output_identity"] = JsonOf(*record.output_identity);
  if (!record.error.empty()) json["error"] = record.error;
  json["exit_code"] = record.exit_code;
  json["seconds"] = std::round(record.seconds * 1000) / 1000;
  if (!record.outcome.is_null()) json["outcome"] = record.outcome;
  json["warnings"] = JsonOfList(record.warnings);
  return json.dump(1, ' ', false, nlohmann::json::error_handler_t::replace) + "\n";
}

std::optional<Record> ReadRecord(const std::string& path) {
  const std::optional<nlohmann::ordered_json> json = ReadObject(path);
  if (!json) return std::nullopt;
  try {
    return RecordOf(*json);
  } catch (const nlohmann::json::exception&) {
    return std::nullopt;
  }
}

}  // namespace calmframe::batch
