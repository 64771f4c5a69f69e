#include "host/media/encoder_options.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <stdexcept>
#include <string_view>

#include "host/base/nearest_match.h"

namespace calmframe::media {
namespace {

constexpr std::array<const char*, 10> kWords = {"ultrafast", "superfast", "veryfast", "faster",
                                                "fast",      "medium",    "slow",     "slower",
                                                "veryslow",  "placebo"};
constexpr const char* kDraftWord = "veryfast";

// Encoders that count their speed: the option, its number for each of kWords, the number where none
// is asked for, and from which number on they need their mode for live pictures, else it has no
// effect. VP9 and AV1 take by themselves many times as long as all the rest of a job; these usual
// numbers are a tenth to a fifth of that, for files some tenth larger (docs/performance.md).
struct Speed {
  const char *encoder, *option;
  std::array<int, kWords.size()> numbers;
  int usual;
  int first_live;
  const char* live;       // the option that has the value "realtime"
  bool works_rows_apart;  // has row-mt: rows of blocks on threads of their own
};
constexpr int kNever = 100;
constexpr std::array<Speed, 5> kSpeeds = {
    {{"libvpx", "cpu-used", {12, 10, 8, 6, 5, 4, 3, 2, 1, 0}, 1, 6, "deadline", false},
     {"libvpx-vp9", "cpu-used", {8, 7, 6, 5, 4, 3, 2, 1, 0, 0}, 6, 6, "deadline", true},
     {"libaom-av1", "cpu-used", {10, 9, 8, 7, 6, 5, 4, 3, 2, 1}, 7, 7, "usage", true},
     {"libsvtav1", "preset", {13, 12, 11, 10, 9, 8, 7, 6, 5, 4}, 8, kNever, "", false},
     {"librav1e", "speed", {10, 10, 9, 8, 7, 6, 5, 4, 3, 2}, -1, kNever, "", false}}};

constexpr int kOfEncoders = AV_OPT_FLAG_ENCODING_PARAM | AV_OPT_FLAG_VIDEO_PARAM;

const Speed* SpeedOf(const AVCodec& codec) {
  const auto found = std::find_if(kSpeeds.begin(), kSpeeds.end(), [&](const Speed& speed) {
    return std::string_view(codec.name) == speed.encoder;
  });
  return found == kSpeeds.end() ? nullptr : &*found;
}

bool HasX264Words(const AVCodec& codec) {
  const std::string_view name = codec.name;
  return name == "libx264" || name == "libx264rgb" || name == "libx265";
}

void AddSpeed(const Speed& speed, int number, std::vector<EncoderOption>& options) {
  options.emplace_back(speed.option, std::to_string(number));
  if (number >= speed.first_live) options.emplace_back(speed.live, "realtime");
  if (speed.works_rows_apart) options.emplace_back("row-mt", "1");
}

bool IsNumber(const std::string& text) {
  char* end = nullptr;
  std::strtol(text.c_str(), &end, 10);
  return !text.empty() && *end == '\0';
}

void AddPreset(const AVCodec& codec, const std::string& preset,
               std::vector<EncoderOption>& options) {
  const std::vector<std::string> words(kWords.begin(), kWords.end());
  const bool draft = preset == "draft";
  const std::string& asked = draft ? kDraftWord : preset;
  const auto word = std::find(words.begin(), words.end(), asked);
  const auto refuse = [&](const std::string& why) {
    throw std::invalid_argument("--preset: " + why);
  };
  if (const Speed* const speed = SpeedOf(codec)) {
    if (word != words.end()) {
      AddSpeed(*speed, speed->numbers[static_cast<std::size_t>(word - words.begin())], options);
    } else if (IsNumber(asked)) {
      AddSpeed(*speed, std::atoi(asked.c_str()), options);
    } else {
      refuse(NoneOf(asked, words) + "; " + codec.name + " also takes numbers");
    }
  } else if (HasX264Words(codec)) {
    if (word == words.end()) refuse(NoneOf(asked, words));
    options.emplace_back("preset", asked);
  } else if (const AVClass* own = codec.priv_class;
             own && av_opt_find(&own, "preset", nullptr, kOfEncoders, AV_OPT_SEARCH_FAKE_OBJ)) {
    if (!draft) options.emplace_back("preset", asked);
  } else if (!draft) {
    refuse(std::string(codec.name) + " has no such setting");
  }
}

// These words x264 checks itself, and complains of on the standard error.
void CheckX264(const std::string& encoder, const EncoderOption& option) {
  if (encoder != "libx264" && encoder != "libx264rgb") return;
  const bool tune = option.first == "tune";
  if (!tune && option.first != "profile") return;
  const std::vector<std::string> words =
      tune ? std::vector<std::string>{"film", "animation", "grain",      "stillimage",
                                      "psnr", "ssim",      "fastdecode", "zerolatency"}
           : std::vector<std::string>{"baseline", "main", "high", "high10", "high422", "high444"};
  for (std::size_t at = 0; at <= option.second.size();) {
    const std::size_t end =
        tune ? std::min(option.second.find(',', at), option.second.size()) : option.second.size();
    const std::string word = option.second.substr(at, end - at);
    if (std::find(words.begin(), words.end(), word) == words.end()) {
      throw std::invalid_argument("option " + option.first + " of encoder " + encoder + ": " +
                                  NoneOf(word, words));
    }
    at = end + 1;
  }
}

std::vector<std::string> OptionNames(const AVClass* owner) {
  std::vector<std::string> names;
  for (const AVOption* o = nullptr; owner && (o = av_opt_next(&owner, o));) {
    if (o->type != AV_OPT_TYPE_CONST && (o->flags & kOfEncoders) == kOfEncoders) {
      names.emplace_back(o->name);
    }
  }
  return names;
}

}  // namespace

std::vector<EncoderOption> OptionsOf(const AVCodec& codec, const EncodeSettings& settings) {
  std::vector<EncoderOption> options;
  if (!settings.preset.empty()) {
    AddPreset(codec, settings.preset, options);
  } else if (const Speed* const speed = SpeedOf(codec)) {
    AddSpeed(*speed, speed->usual, options);
  }
  for (const std::string& option : settings.options) {
    const std::size_t sign = std::min(option.find('='), option.size());
    options.emplace_back(option.substr(0, sign), option.substr(std::min(sign + 1, option.size())));
  }
  return options;
}

bool TellQuality(const std::vector<EncoderOption>& options) {
  constexpr std::array<std::string_view, 5> kTell = {"b", "crf", "cq", "global_quality", "qp"};
  return std::any_of(options.begin(), options.end(), [&](const EncoderOption& option) {
    return std::find(kTell.begin(), kTell.end(), option.first) != kTell.end();
  });
}

void SetOption(AVCodecContext& encoder, const EncoderOption& option) {
  const auto& [name, value] = option;
  const std::string own = encoder.codec->name;
  const AVOption* const known =
      av_opt_find(&encoder, name.c_str(), nullptr, kOfEncoders, AV_OPT_SEARCH_CHILDREN);
  if (!known || known->type == AV_OPT_TYPE_CONST) {
    std::vector<std::string> names = OptionNames(encoder.codec->priv_class);
    const std::vector<std::string> general = OptionNames(avcodec_get_class());
    names.insert(names.end(), general.begin(), general.end());
    throw std::invalid_argument("encoder " + own + " has no option '" + name + "'" +
                                NearestHint(name, names));
  }
  CheckX264(own, option);
  const Heard heard;
  const int error = av_opt_set(&encoder, name.c_str(), value.c_str(), AV_OPT_SEARCH_CHILDREN);
  if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
  if (error < 0) {
    const std::string said = heard.FirstError();
    throw std::invalid_argument("option " + name + " of encoder " + own + " doesn't take '" +
                                value + "': " + (said.empty() ? ErrorText(error) : said));
  }
}

std::string RefusedSetting(const Heard& heard) {
  for (const Heard::Line& line : heard.lines()) {
    for (const char* begin : {"Error parsing option", "Unknown option", "Invalid value for",
                              "Failed to set", "Error setting option"}) {
      if (line.text.starts_with(begin)) return line.text;
    }
  }
  return "";
}

}  // namespace calmframe::media
