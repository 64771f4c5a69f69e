#include "apps/calmframe/stretch.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <string_view>
#include <vector>

#include "apps/calmframe/failures.h"

namespace calmframe {
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

CLI::Option* AddMoment(CLI::App& command, const std::string& flag, std::optional<Moment>& moment,
                       BareNumber bare, const std::string& description) {
  return command
      .add_option_function<std::string>(
          flag, [&moment, bare](const std::string& text) { moment = MomentOf(text, bare); },
          description)
      ->check([bare](const std::string& text) { return MomentTrouble(text, bare); })
      ->take_last()
      ->type_name("TIME");
}

[[noreturn]] void FailForOrder(const Stretch& stretch) {
  throw UsageFailure("--to " + stretch.to->text + " must lie behind " +
                     (stretch.from ? "--from " + stretch.from->text : "the clip's first frame") +
                     ", by a frame at least");
}

}  // namespace

std::optional<Moment> MomentOf(const std::string& text, BareNumber bare) {
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

std::string MomentTrouble(const std::string& text, BareNumber bare) {
  if (MomentOf(text, bare)) return "";
  if (text.size() > 1 && text[0] == '-' && MomentOf(text.substr(1), bare)) {
    return text + " is out of range: 0 or more";
  }
  return "'" + text + "' is no time such as 12.5, 1:30 or 0:01:30.5, and no frame such as 300f";
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

void AddStretchFlags(CLI::App& command, Stretch& stretch, BareNumber bare) {
  const std::string forms = bare == BareNumber::frame
                                ? "a frame, counted from 0 (300, 300f), or a time (12.5, 1:30, 12s)"
                                : "seconds (12.5), M:SS or H:MM:SS, or a frame (300f)";
  PutInGroup("Stretch",
             {AddMoment(command, "--from", stretch.from, bare, "Where to begin: " + forms),
              AddMoment(command, "--to", stretch.to, bare,
                        "Where to end, this frame left out; the clip's end at first")});
}

void CheckOrder(const Stretch& stretch) {
  const bool alike =
      stretch.to && (!stretch.from || stretch.from->is_frame == stretch.to->is_frame);
  if (alike && stretch.to->value <= (stretch.from ? stretch.from->value : 0)) FailForOrder(stretch);
}

media::FrameRange FramesOf(const Stretch& stretch, const media::ClipInfo& clip) {
  media::FrameRange range{0, clip.frame_count};
  const std::string ends = ": the clip has " + std::to_string(clip.frame_count) +
                           (clip.frame_count == 1 ? " frame" : " frames") + " and ends at " +
                           TimeText(clip, clip.frame_count);
  if (stretch.from) range.first = FrameAt(*stretch.from, clip);
  if (range.first >= clip.frame_count) {
    throw UsageFailure("--from " + stretch.from->text + " lies behind the last frame" + ends);
  }
  if (stretch.to) range.end = FrameAt(*stretch.to, clip);
  if (range.end > clip.frame_count) {
    throw UsageFailure("--to " + stretch.to->text + " lies behind the last frame" + ends);
  }
  if (range.end <= range.first) FailForOrder(stretch);
  return range;
}

media::ClipReader::Part PartFor(const Stretch& stretch) {
  if (!stretch.is_given()) return {};
  return [stretch](const media::ClipInfo& clip) { return FramesOf(stretch, clip); };
}

std::string TimeText(const media::ClipInfo& clip, std::size_t frame) {
  const auto thousandths = std::llround(SecondsAt(clip, frame) * 1000);
  const auto minutes = thousandths / 60000;
  char text[64];
  const int length =
      minutes < 60 ? std::snprintf(text, sizeof text, "%lld:%02lld.%03lld", minutes,
                                   thousandths / 1000 % 60, thousandths % 1000)
                   : std::snprintf(text, sizeof text, "%lld:%02lld:%02lld.%03lld", minutes / 60,
                                   minutes % 60, thousandths / 1000 % 60, thousandths % 1000);
  std::string shown(text, static_cast<std::size_t>(length));
  while (shown.back() == '0') shown.pop_back();
  if (shown.back() == '.') shown.pop_back();
  return shown;
}

}  // namespace calmframe
