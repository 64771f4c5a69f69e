#include "host/shots/shot_list.h"

#include <cmath>
#include <cstdio>

#include "host/shots/moment.h"

namespace calmframe::host {
namespace {

const char* NameOf(ShotBorder::Kind kind) {
  switch (kind) {
    case ShotBorder::Kind::dissolve:
      return "dissolve";
    case ShotBorder::Kind::fade:
      return "fade";
    case ShotBorder::Kind::cut:
      break;
  }
  return "cut";
}

double RateOf(media::Ratio rate) {
  return static_cast<double>(rate.num) / static_cast<double>(rate.den);
}

double Rounded(double seconds) {
  return std::round(seconds * 1000) / 1000;
}

std::string Seconds(double seconds) {
  char text[40];
  std::snprintf(text, sizeof text, "%.3f", seconds);
  return text;
}

// The last part of a path, on one line.
std::string NameOf(const std::string& path) {
  std::string name = path.substr(path.find_last_of('/') + 1);
  for (char& c : name) {
    if (static_cast<unsigned char>(c) < ' ') c = ' ';
  }
  return name;
}

std::string Quoted(const std::string& text) {
  if (text.find_first_of(",\"") == std::string::npos) return text;
  std::string quoted = "\"";
  for (const char c : text) quoted += c == '"' ? std::string("\"\"") : std::string(1, c);
  return quoted + '"';
}

}  // namespace

std::vector<Shot> ShotsBetween(const std::vector<ShotBorder>& borders, std::int64_t frame_count) {
  std::vector<Shot> shots{{0, frame_count}};
  for (const ShotBorder& border : borders) {
    shots.back().end = border.frame;
    shots.push_back({border.frame, frame_count, border.kind});
  }
  return shots;
}

bool DropsFrames(media::Ratio rate) {
  // What is told as 29.97 or measured as about that; 30 is three times as far away.
  constexpr double kSame = 0.01;
  const double frames = RateOf(rate);
  return std::abs(frames - 30000.0 / 1001) < kSame || std::abs(frames - 60000.0 / 1001) < 2 * kSame;
}

std::string TimeCode(std::int64_t frame, media::Ratio rate) {
  const auto base = std::max<std::int64_t>(1, std::llround(RateOf(rate)));
  const bool drops = DropsFrames(rate);
  if (drops) {
    // Numbers that are left out before the frame: nine times in ten minutes, then at each minute.
    const std::int64_t dropped = base / 15, minute = 60 * base - dropped;
    const std::int64_t ten_minutes = 600 * base - 9 * dropped;
    const std::int64_t rest = frame % ten_minutes;
    frame += frame / ten_minutes * 9 * dropped;
    if (rest >= 60 * base) frame += ((rest - 60 * base) / minute + 1) * dropped;
  }
  const std::int64_t seconds = frame / base;
  char text[64];
  std::snprintf(text, sizeof text, "%02d:%02d:%02d%c%02d", static_cast<int>(seconds / 3600 % 24),
                static_cast<int>(seconds / 60 % 60), static_cast<int>(seconds % 60),
                drops ? ';' : ':', static_cast<int>(frame % base));
  return text;
}

ShotList::ShotList(std::vector<Shot> shots, const media::ClipInfo& clip)
    : clip_(NameOf(clip.path)),
      rate_(clip.frame_rate),
      frames_(static_cast<std::int64_t>(clip.frame_count)) {
  for (const Shot& shot : shots) {
    rows_.push_back({shot, Rounded(SecondsAt(clip, static_cast<std::size_t>(shot.first))),
                     Rounded(SecondsAt(clip, static_cast<std::size_t>(shot.end)))});
  }
}

nlohmann::ordered_json ShotList::Json() const {
  nlohmann::ordered_json list;
  list["clip"] = clip_;
  list["rate"] = Rounded(RateOf(rate_));
  list["frames"] = frames_;
  list["shots"] = nlohmann::ordered_json::array();
  for (const Row& row : rows_) {
    list["shots"].push_back({{"first_frame", row.shot.first},
                             {"end_frame", row.shot.end},
                             {"start", row.start},
                             {"end", row.end},
                             {"begins", NameOf(row.shot.begins)}});
  }
  return list;
}

std::string ShotList::Csv() const {
  std::string text = "clip,rate,first_frame,end_frame,start,end,begins\n";
  for (const Row& row : rows_) {
    text += Quoted(clip_) + ',' + Seconds(RateOf(rate_)) + ',' + std::to_string(row.shot.first) +
            ',' + std::to_string(row.shot.end) + ',' + Seconds(row.start) + ',' + Seconds(row.end) +
            ',' + NameOf(row.shot.begins) + '\n';
  }
  return text;
}

std::string ShotList::Edl() const {
  std::string text =
      "TITLE: " + clip_ + "\nFCM: " + (DropsFrames(rate_) ? "" : "NON-") + "DROP FRAME\n\n";
  const int digits = rows_.size() > 999 ? 4 : 3;
  for (std::size_t i = 0; i < rows_.size(); ++i) {
    const Shot& shot = rows_[i].shot;
    const std::string span = TimeCode(shot.first, rate_) + ' ' + TimeCode(shot.end, rate_);
    char number[32];
    std::snprintf(number, sizeof number, "%0*zu", digits, i + 1);
    // Reel AX: the source has no number of its own. V: picture. C: a cut.
    text += std::string(number) + "  AX       V     C        " + span + ' ' + span +
            "\n* FROM CLIP NAME: " + clip_ + '\n';
  }
  return text;
}

}  // namespace calmframe::host
