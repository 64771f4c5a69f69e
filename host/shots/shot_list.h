#pragma once

#include <cstddef>
#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <vector>

namespace calmframe::host {

// A shot of a film.
struct ListedShot {
  std::int64_t first = 0, end = 0;  // frames of the film, the end left out
  double begins = 0, ends = 0;      // seconds, as the film shows them
  std::string how;                  // it begins: "start", "cut", "dissolve" or "fade"
};

// What the forms of a list tell of the film itself.
struct ListedFilm {
  std::string name;                          // of its file
  std::int64_t rate_num = 25, rate_den = 1;  // frames a second
};

// An object: "clip", "rate", and "shots" with "first_frame", "end_frame", "begins", "ends", "how".
nlohmann::ordered_json JsonOf(const ListedFilm& film, const std::vector<ListedShot>& shots);
// A line of names, then one a shot (RFC 4180).
std::string CsvOf(const ListedFilm& film, const std::vector<ListedShot>& shots);
// An edit decision list of CMX 3600 form: an event a shot, each a cut, at whose place in the record
// it stands in the source. Time codes count frames from 0 at the nearest whole rate; at 30000/1001
// and 60000/1001 frames a second they drop numbers (SMPTE 12M), so that they keep to the clock.
std::string EdlOf(const ListedFilm& film, const std::vector<ListedShot>& shots);

}  // namespace calmframe::host
