#include "host/shots/shot_list.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <nlohmann/json.hpp>

namespace calmframe::host {
namespace {

double RateOf(const ListedFilm& film) {
  return static_cast<double>(film.rate_num) / static_cast<double>(film.rate_den);
}

bool DropsNumbers(const ListedFilm& film) {
  return film.rate_den == 1001 && (film.rate_num == 30000 || film.rate_num == 60000);
}

std::string TimeCode(std::int64_t frame, const ListedFilm& film) {
  const auto rate = std::max<std::int64_t>(std::llround(RateOf(film)), 1);
  const bool drops = DropsNumbers(film);
  if (drops) {
    // Every minute but each tenth begins without its first numbers.
    const std::int64_t dropped = rate / 15;  // 2 of 30, 4 of 60
    const std::int64_t minute = 60 * rate - dropped, ten_minutes = 10 * minute + dropped;
    const std::int64_t tens = frame / ten_minutes, rest = frame % ten_minutes;
    frame += 9 * dropped * tens;
    if (rest >= 60 * rate) frame += dropped * (1 + (rest - 60 * rate) / minute);
  }
  const std::int64_t seconds = frame / rate;
  char text[64];
  std::snprintf(text, sizeof text, "%02lld:%02lld:%02lld%c%02lld",
                static_cast<long long>(seconds / 3600), static_cast<long long>(seconds / 60 % 60),
                static_cast<long long>(seconds % 60), drops ? ';' : ':',
                static_cast<long long>(frame % rate));
  return text;
}

// A spreadsheet computes what begins with one of these, quoted or not, unless it is told so.
std::string Quoted(const std::string& text) {
  std::string quoted = "\"";
  if (!text.empty() && std::strchr("=+-@\t\r", text[0])) quoted += '\'';
  for (const char c : text) {
    if (c == '"') quoted += '"';
    quoted += c;
  }
  return quoted + '"';
}

// A line of an edit decision list holds no other; what is none of its signs is left out.
std::string OneLine(std::string text) {
  std::replace_if(
      text.begin(), text.end(), [](unsigned char c) { return std::iscntrl(c) != 0; }, '_');
  return text;
}

double Thousandths(double seconds) {
  return std::round(seconds * 1000) / 1000;
}

}  // namespace

nlohmann::ordered_json JsonOf(const ListedFilm& film, const std::vector<ListedShot>& shots) {
  nlohmann::ordered_json object;
  object["clip"] = film.name;
  object["rate"] = RateOf(film);
  object["shots"] = nlohmann::ordered_json::array();
  for (const ListedShot& shot : shots) {
    nlohmann::ordered_json told;
    told["first_frame"] = shot.first;
    told["end_frame"] = shot.end;
    told["begins"] = Thousandths(shot.begins);
    told["ends"] = Thousandths(shot.ends);
    told["how"] = shot.how;
    object["shots"].push_back(told);
  }
  return object;
}

std::string CsvOf(const ListedFilm& film, const std::vector<ListedShot>& shots) {
  std::string text = "clip,shot,first_frame,end_frame,begins,ends,how\r\n";
  for (std::size_t s = 0; s < shots.size(); ++s) {
    char times[96];
    std::snprintf(times, sizeof times, "%.3f,%.3f", shots[s].begins, shots[s].ends);
    text += Quoted(film.name) + "," + std::to_string(s + 1) + "," + std::to_string(shots[s].first) +
            "," + std::to_string(shots[s].end) + "," + times + "," + shots[s].how + "\r\n";
  }
  return text;
}

std::string EdlOf(const ListedFilm& film, const std::vector<ListedShot>& shots) {
  std::string text = "TITLE: " + OneLine(film.name) +
                     "\nFCM: " + (DropsNumbers(film) ? "DROP FRAME" : "NON-DROP FRAME") + "\n";
  for (std::size_t s = 0; s < shots.size(); ++s) {
    const std::string in = TimeCode(shots[s].first, film), out = TimeCode(shots[s].end, film);
    char event[64];
    std::snprintf(event, sizeof event, "\n%03zu  AX       V     C        ", s + 1);
    text += event + in + " " + out + " " + in + " " + out +
            "\n* FROM CLIP NAME: " + OneLine(film.name) + "\n";
  }
  return text;
}

}  // namespace calmframe::host
