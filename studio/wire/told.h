#pragma once

#include <nlohmann/json_fwd.hpp>
#include <string>

#include "studio/wire/message.h"

namespace calmframe::studio {

// What a worker may say, which a clip may have taken over: the studio and its pages hear no more
// than this. What nobody goes by is left out, what is only long is cut, and a figure that is none,
// or beyond all that a page can draw, becomes null. What is of another kind, or out of its range,
// is BadMessage or std::invalid_argument.

// Of what it tells of its clip (see ClipDesk), by key.
nlohmann::json ToldOf(const nlohmann::json& tells);

// Of its answer to what was asked for by "op" (see RunWorker). A picture is a JPEG of one pass, no
// wider than `width`.
Message AnswerOf(const std::string& op, int width, const Message& answer);

}  // namespace calmframe::studio
