#include "apps/calmframe/batch_results.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>

#include "apps/report/batch_page.h"
#include "host/base/shown_text.h"
#include "host/media/clip.h"
#include "host/media/output_file.h"

namespace calmframe {
namespace {

using State = batch::TaskResult::State;

constexpr char kPage[] = "batch.html";

std::string Fixed(double value, int digits) {
  char text[64];
  std::snprintf(text, sizeof text, "%.*f", digits, value);
  return text;
}

std::string Plural(std::size_t count, const std::string& word) {
  return std::to_string(count) + " " + word + (count == 1 ? "" : "s");
}

// A number of the outcome; empty where it doesn't tell.
std::string FigureOf(const batch::Record& record, const char* name, int digits) {
  const auto figure = record.outcome.find(name);
  if (figure == record.outcome.end() || !figure->is_number()) return "";
  return Fixed(figure->get<double>(), digits);
}

// Of a file that others may have written: empty of what is no picture within the page.
std::string PictureIn(const nlohmann::ordered_json& object, const char* name) {
  const auto url = object.find(name);
  if (url == object.end() || !url->is_string()) return "";
  const auto text = url->get<std::string>();
  return text.starts_with("data:image/") ? text : "";
}

// The columns of the table and of the page, behind the clip's name.
struct Row {
  std::string state, seconds, zoom, shake, says;
};

Row RowOf(const batch::TaskResult& result) {
  const batch::Record& record = result.record;
  Row row;
  if (result.state == State::failed) return {"failed", "", "", "", record.error};
  row.state = result.state == State::unchanged ? "unchanged" : "done";
  row.seconds = Fixed(record.seconds, 1);
  row.zoom = FigureOf(record, "most_zoom", 2);
  if (!FigureOf(record, "shake_before", 1).empty()) {
    row.shake = FigureOf(record, "shake_before", 1) + " -> " + FigureOf(record, "shake_after", 1);
  }
  for (const std::string& warning : record.warnings) {
    row.says += (row.says.empty() ? "" : "; ") + warning;
  }
  return row;
}

// The clip's name before what is said of it, unless that begins with it.
std::string Said(const std::string& clip, const std::string& line) {
  return line.starts_with(clip + ": ") ? line : clip + ": " + line;
}

// A path in a link of a page: bytes that mean something there, and all that are no ASCII, by
// number.
std::string LinkTo(const std::string& path) {
  std::string link;
  for (const char c : path) {
    const auto byte = static_cast<unsigned char>(c);
    const bool is_plain = byte < 128 && (std::isalnum(byte) || std::strchr("-._~/", c));
    char code[4] = {c, 0};
    if (!is_plain) std::snprintf(code, sizeof code, "%%%02X", byte);
    link += code;
  }
  // What has a colon in its first part would name a kind of address.
  return "./" + link;
}

}  // namespace

BatchResults::BatchResults(const batch::Plan& plan, ProgressLine& progress)
    : plan_(plan), progress_(progress), results_(plan.tasks.size()) {}

std::size_t BatchResults::Count(State state) const {
  return static_cast<std::size_t>(
      std::count_if(results_.begin(), results_.end(),
                    [state](const auto& result) { return result && result->state == state; }));
}

std::size_t BatchResults::ended() const {
  return static_cast<std::size_t>(std::count_if(
      results_.begin(), results_.end(), [](const auto& result) { return result.has_value(); }));
}

// What a task adds to the whole: those that were done before, or can't be, add nothing.
double BatchResults::WorkOf(std::size_t task) const {
  return plan_.tasks[task].refused.empty() ? plan_.tasks[task].cost : 0;
}

void BatchResults::Show(const std::vector<double>& shares, std::size_t working) {
  double done = 0, total = 0;
  for (std::size_t n = 0; n < shares.size(); ++n) {
    done += shares[n] * WorkOf(n);
    total += WorkOf(n);
  }
  const bool over = ended() == results_.size();
  if (total <= 0 && !over) return;
  Progress shown{.stage = "steadying", .done = done, .total = total, .ends = over};
  const int percent = total > 0 ? static_cast<int>(100 * done / total) : 100;
  shown.says = (percent < 10    ? "  "
                : percent < 100 ? " "
                                : "") +
               std::to_string(percent) + " %  " + std::to_string(ended()) + "/" +
               Plural(results_.size(), "clip") + ", " + std::to_string(working) + " at work";
  progress_.Show(shown);
}

void BatchResults::Ended(std::size_t task, const batch::TaskResult& result) {
  results_[task] = result;
  const batch::Task& asked = plan_.tasks[task];
  const batch::Record& record = result.record;
  const std::string clip = Shown(asked.clip);
  nlohmann::ordered_json object;
  object["clip"] = asked.clip;
  const Row row = RowOf(result);
  object["state"] = row.state;
  if (result.state == State::failed) {
    object["error"] = record.error;
    object["exit_code"] = record.exit_code;
    progress_.Item(Said(clip, record.error), object, true);
    return;
  }
  object["output"] = plan_.OutputOf(asked);
  object["project"] = plan_.ProjectOf(asked);
  if (plan_.reports) object["report"] = plan_.ReportOf(asked);
  object["seconds"] = std::round(record.seconds * 1000) / 1000;
  if (!record.outcome.is_null()) object["outcome"] = record.outcome;
  object["warnings"] = record.warnings;
  std::string line = clip + ": " + row.state;
  if (result.state == State::done) {
    line += " in " + row.seconds + " s";
    if (!row.shake.empty()) line += ", zoom " + row.zoom + ", shake " + row.shake;
  }
  progress_.Item(line, object, false);
  if (result.state == State::unchanged) return;
  for (const std::string& warning : record.warnings) {
    progress_.Item(Said(clip, warning), {{"clip", asked.clip}, {"warning", warning}}, true);
  }
}

void BatchResults::Tell() {
  const std::size_t done = Count(State::done), unchanged = Count(State::unchanged);
  nlohmann::ordered_json object;
  object["clips"] = results_.size();
  object["done"] = done;
  object["unchanged"] = unchanged;
  object["failed"] = failed();
  object["page"] = plan_.folder + "/" + kPage;
  std::string line = Plural(results_.size(), "clip") + ": " + std::to_string(done) + " done";
  if (unchanged > 0) line += ", " + std::to_string(unchanged) + " unchanged";
  if (failed() > 0) line += ", " + std::to_string(failed()) + " failed";
  progress_.End(line, object);
}

std::string BatchResults::Table() const {
  std::vector<std::vector<std::string>> rows = {
      {"clip", "state", "seconds", "zoom", "shake", "warnings"}};
  for (std::size_t n = 0; n < results_.size(); ++n) {
    if (!results_[n]) continue;
    const Row row = RowOf(*results_[n]);
    rows.push_back(
        {Shown(plan_.tasks[n].clip), row.state, row.seconds, row.zoom, row.shake, Shown(row.says)});
  }
  std::vector<std::size_t> widths(rows[0].size());
  for (const auto& row : rows) {
    for (std::size_t c = 0; c < row.size(); ++c) widths[c] = std::max(widths[c], row[c].size());
  }
  std::string table;
  for (const auto& row : rows) {
    std::string line;
    for (std::size_t c = 0; c < row.size(); ++c) {
      line += row[c];
      if (c + 1 < row.size()) line.append(widths[c] - row[c].size() + 2, ' ');
    }
    line.erase(line.find_last_not_of(' ') + 1);
    table += line + "\n";
  }
  return table;
}

void BatchResults::WritePage() const {
  report::BatchPage page;
  page.title = std::filesystem::path(plan_.folder).filename().string();
  page.facts = {{"Clips", std::to_string(results_.size())},
                {"Done", std::to_string(Count(State::done))},
                {"Unchanged", std::to_string(Count(State::unchanged))},
                {"Failed", std::to_string(failed())}};
  for (const std::string& word : plan_.settings) {
    const std::size_t value = std::min(word.find('='), word.size());
    page.settings.push_back(
        {word.substr(0, value), value < word.size() ? word.substr(value + 1) : "on"});
  }
  for (std::size_t n = 0; n < results_.size(); ++n) {
    if (!results_[n]) continue;
    const batch::Task& task = plan_.tasks[n];
    const Row row = RowOf(*results_[n]);
    report::BatchRow told{.clip = Shown(task.clip),
                          .state = row.state,
                          .failed = results_[n]->state == State::failed,
                          .cells = {row.seconds, row.zoom, row.shake},
                          .says = row.says};
    if (!told.failed) {
      told.output = LinkTo(task.output);
      std::error_code error;
      if (std::filesystem::exists(plan_.ReportOf(task), error)) {
        told.report = LinkTo(task.output + ".html");
      }
      // Of more the page would be too large to open.
      constexpr std::size_t kMostPictures = 2000;
      const auto pictures =
          n < kMostPictures ? batch::ReadObject(plan_.FolderOf(task).pictures()) : std::nullopt;
      if (pictures) {
        told.before = PictureIn(*pictures, "before");
        told.after = PictureIn(*pictures, "after");
      }
    }
    page.rows.push_back(std::move(told));
  }
  const std::string path = plan_.folder + "/" + kPage;
  media::OutputFile file(path, "", true);
  std::ofstream out(file.temporary(), std::ios::binary | std::ios::trunc);
  out << report::HtmlOf(page);
  out.close();
  if (!out) throw media::Failure(media::Failure::Side::output, path + ": could not be written");
  file.Commit();
}

}  // namespace calmframe
