#include "platform/tesselui/save_dialog.h"

#include <mutex>
#include <utility>

namespace tesselui {
namespace {

using Dialog = boost::function<std::optional<std::string>(const SaveDialogRequest&)>;

std::mutex& mutex() {
  static std::mutex& instance = *new std::mutex;
  return instance;
}

// Guarded by mutex().
Dialog& installed() {
  static Dialog& dialog = *new Dialog;
  return dialog;
}

}  // namespace

std::optional<std::string> SaveAs(const SaveDialogRequest& request) {
  Dialog dialog;
  {
    std::lock_guard<std::mutex> lock(mutex());
    dialog = installed();
  }
  return dialog ? dialog(request) : std::nullopt;
}

void InstallSaveDialog(Dialog dialog) {
  std::lock_guard<std::mutex> lock(mutex());
  installed().swap(dialog);
}

}  // namespace tesselui
