#pragma once

#include <nlohmann/json_fwd.hpp>

#include "host/media/clip.h"

namespace calmframe::studio {

// {"crf": 18, "codec": "libx265", "preset": "slow", "options": ["tune=grain"], "overwrite": true}.
nlohmann::json JsonOf(const media::EncodeSettings& settings);
// Of such an object, also of one that somebody made up: what is missing is as it comes, what isn't
// known is left out. Whether an encoder takes it is for media::ClipWriter to say. Throws
// std::invalid_argument, one line, for a value of another kind or out of range, a word that can
// name no codec or preset, and an option without a sign, or that could name a file.
media::EncodeSettings EncodeSettingsOf(const nlohmann::json& json);

}  // namespace calmframe::studio
