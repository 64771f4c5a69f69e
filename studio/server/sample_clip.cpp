#include "studio/server/sample_clip.h"

#include <exception>
#include <filesystem>
#include <system_error>
#include <utility>

namespace calmframe::studio {

SampleClip::SampleClip(boost::asio::io_context& context, std::vector<std::string> words,
                       std::string path, std::function<void()> drawn, std::function<void()> changed)
    : context_(context),
      words_(std::move(words)),
      path_(std::move(path)),
      drawn_(std::move(drawn)),
      changed_(std::move(changed)) {}

bool SampleClip::is_there() const {
  std::error_code error;
  return std::filesystem::is_regular_file(path_, error);
}

void SampleClip::Draw() {
  if (run_ || is_there()) return;
  share_ = 0;
  error_.clear();
  std::vector<std::string> words = words_;
  words.push_back(path_);
  run_ = std::make_unique<ProgramRun>(
      context_, std::move(words),
      ProgramRun::Events{[this](const nlohmann::json& told) {
                           share_ = told.value("share", share_);
                           changed_();
                         },
                         [this](const std::string& error) {
                           if (!error.empty()) {
                             error_ = run_->is_stopped()
                                          ? "The sample clip was not drawn to its end: cancelled."
                                          : "The sample clip could not be drawn: " + error;
                           }
                           run_.reset();
                           try {
                             if (error_.empty()) drawn_();
                           } catch (const std::exception& failure) {
                             error_ = failure.what();
                           }
                           changed_();
                         }});
  changed_();
}

void SampleClip::Cancel() {
  if (run_) run_->Stop();
}

nlohmann::json SampleClip::State() const {
  if (run_) return {{"share", share_}};
  if (!error_.empty()) return {{"error", error_}};
  return nullptr;
}

}  // namespace calmframe::studio
