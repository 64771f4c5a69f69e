#include "host/shots/moment.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <set>
#include <stdexcept>
#include <string_view>

namespace calmframe::host {
namespace {

// People write milliseconds, of times that have more digits.
constexpr double kSame = 0.0005;
constexpr double kLatest = 1e9;  // more than any clip has, of seconds and of frames

bool IsNumber(std::string_view text, bool whole) {
  const auto points = std::count(text.begin(), text.end(), '.');
  const auto digits =
      std::count_if(text.begin(), text.end(), [](unsigned char c) { return std::isdigit(c) != 0; });
  return digits > 0 && digits + points == static_cast<std::ptrdiff_t>(text.size()) &&
         points <= (whole ? 0 : 1);
}

double NumberOf(std::string_view text) {
  double number = 0;
  std::from_chars(text.data(), text.data() + text.size(), number);
  return number;
}

// "M:SS.f" and "H:MM:SS.f", below 60 where another unit stands in front.
std::optional<double> ClockSeconds(std::string_view text) {
  std::vector<std::string_view> parts;
  for (std::size_t colon; (colon = text.find(':')) != std::string_view::npos;) {
    parts.push_back(text.substr(0, colon));
    text.remove_prefix(colon + 1);
  }
  parts.push_back(text);
  if (parts.size() > 3) return {};
  double seconds = 0;
  for (std::size_t i = 0; i < parts.size(); ++i) {
    const bool last = i + 1 == parts.size();
    if (!IsNumber(parts[i], !last)) return {};
    const std::size_t digits = std::min(parts[i].find('.'), parts[i].size());
    if (i > 0 && (digits != 2 || NumberOf(parts[i]) >= 60)) return {};
    seconds = 60 * seconds + NumberOf(parts[i]);
  }
  return seconds;
}

}  // namespace

std::optional<Moment> ParseMoment(const std::string& text, BareNumber bare) {
  Moment moment{text};
  std::string_view number = text;
  const char unit = text.empty() ? '\0' : text.back();
  if (unit == 'f' || unit == 's') number.remove_suffix(1);
  moment.is_frame =
      unit == 'f' || (unit != 's' && bare == BareNumber::frame && IsNumber(text, true));
  if (number.find(':') != std::string_view::npos) {
    const std::optional<double> seconds = ClockSeconds(text);
    if (!seconds) return {};
    moment.value = *seconds;
  } else {
    if (!IsNumber(number, moment.is_frame)) return {};
    moment.value = NumberOf(number);
  }
  if (moment.value > kLatest) return {};
  return moment;
}

double SecondsAt(const media::ClipInfo& clip, std::size_t frame) {
  const auto& times = clip.times;
  if (times.empty()) {
    return static_cast<double>(frame) * static_cast<double>(clip.frame_rate.den) /
           static_cast<double>(clip.frame_rate.num);
  }
  const std::int64_t at =
      frame < times.size() ? times[frame].pts : times.back().pts + times.back().duration;
  return static_cast<double>(at - times[0].pts) * static_cast<double>(clip.time_base.num) /
         static_cast<double>(clip.time_base.den);
}

std::size_t FrameAt(const Moment& moment, const media::ClipInfo& clip) {
  if (moment.is_frame) return static_cast<std::size_t>(moment.value);
  std::size_t first = 0, end = clip.frame_count;
  while (first < end) {
    const std::size_t middle = first + (end - first) / 2;
    if (SecondsAt(clip, middle) < moment.value - kSame) {
      first = middle + 1;
    } else {
      end = middle;
    }
  }
  return first;
}

std::vector<std::int64_t> ParseBorders(const std::string& list, const media::ClipInfo& clip) {
  std::set<std::int64_t> frames;
  for (std::size_t at = 0; at <= list.size();) {
    const std::size_t comma = std::min(list.find(',', at), list.size());
    std::string item = list.substr(at, comma - at);
    at = comma + 1;
    item.erase(0, item.find_first_not_of(' '));
    item.erase(item.find_last_not_of(' ') + 1);
    const std::optional<Moment> moment = ParseMoment(item, BareNumber::seconds);
    if (!moment) {
      throw std::invalid_argument("'" + item +
                                  "' is no time such as 12.5, 1:30 or 0:01:30.5, and no frame such "
                                  "as 300f");
    }
    const std::size_t frame = FrameAt(*moment, clip);
    if (frame == 0) {
      throw std::invalid_argument(item + " is where the clip begins: no shot lies before it");
    }
    if (frame >= clip.frame_count) {
      throw std::invalid_argument(item + " lies behind the last of the clip's " +
                                  std::to_string(clip.frame_count) + " frames");
    }
    frames.insert(static_cast<std::int64_t>(frame));
  }
  return {frames.begin(), frames.end()};
}

}  // namespace calmframe::host
