#pragma once

#include <string>

namespace calmframe::studio {

// What a worker's process does: one clip, for the studio at the other end of the socket, until that
// goes. `plugin`: the effect's library. Takes "open", "set", "work", "cancel", "save", "panel",
// "curves", "frame", "lasso", "forget" and "look" by "op"; what has an "id" is answered with it.
// See ClipDesk for what it tells by itself.
void RunWorker(int socket, const std::string& plugin);

}  // namespace calmframe::studio
