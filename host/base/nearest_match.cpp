#include "host/base/nearest_match.h"

#include <algorithm>
#include <numeric>

namespace calmframe {
namespace {

// Or, where it is less, one more than the distance to the best beginning of `b`: who stops early
// means the whole word.
std::size_t EditDistance(const std::string& a, const std::string& b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 1; i <= a.size(); ++i) {
    std::size_t diagonal = row[0];
    row[0] = i;
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i - 1] == b[j - 1] ? 0 : 1);
      diagonal = row[j];
      row[j] = std::min({replaced, row[j] + 1, row[j - 1] + 1});
    }
  }
  return std::min(row.back(), *std::min_element(row.begin(), row.end()) + 1);
}

}  // namespace

std::string NearestMatch(const std::string& name, const std::vector<std::string>& candidates) {
  std::string nearest;
  std::size_t least = name.size() / 2 + 1;
  for (const std::string& candidate : candidates) {
    const std::size_t distance = EditDistance(name, candidate);
    if (distance < least) {
      least = distance;
      nearest = candidate;
    }
  }
  return nearest;
}

std::string NearestHint(const std::string& name, const std::vector<std::string>& candidates) {
  const std::string nearest = NearestMatch(name, candidates);
  return nearest.empty() ? "" : "; did you mean " + nearest + "?";
}

std::string NoneOf(const std::string& text, const std::vector<std::string>& names) {
  std::string list;
  for (const std::string& name : names) list += (list.empty() ? "" : ", ") + name;
  return "'" + text + "' is none of " + list + NearestHint(text, names);
}

}  // namespace calmframe
