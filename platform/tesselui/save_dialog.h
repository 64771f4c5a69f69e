#pragma once

#include <boost/function.hpp>
#include <optional>
#include <string>

namespace tesselui {

struct SaveDialogRequest {
  std::string filter;             // "TRK Files (*.trk)"
  std::string extension;          // of the filter, without a dot
  std::string default_extension;  // for a name without one
  int flags = 0;
};

// Asks the user where to save, and waits for the answer: a UTF-8 path, or nothing for a cancel. For
// the thread of the user interface.
std::optional<std::string> SaveAs(const SaveDialogRequest& request);

// How the host answers from now on; an empty function stands for a cancel, as at first.
void InstallSaveDialog(
    boost::function<std::optional<std::string>(const SaveDialogRequest&)> dialog);

}  // namespace tesselui
