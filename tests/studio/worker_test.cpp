#include <gmock/gmock.h>

#include <boost/asio/io_context.hpp>
#include <chrono>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "studio/server/studio.h"
#include "studio/wire/message.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::studio {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;

// A studio whose workers are what a clip may have made of one: a script that says what the test has
// it say, hears nothing, and doesn't end when it is asked to.
class StudioWorkerTest : public testing::Test, protected ScratchFolder {
 protected:
  StudioWorkerTest() {
    fs::create_directories(In("clips"));
    for (const char* clip : {"clips/one.mp4", "clips/two.mp4"}) MakeFile(clip, "x");
    MakeFile("worker", "#!/bin/bash\ntrap '' TERM\ncat \"$0.says\" >&\"$1\"\nsleep 60 & wait\n");
    fs::permissions(In("worker"), fs::perms::owner_all);
    Start("");
  }
  ~StudioWorkerTest() override { studio_->StopAll(); }

  void Start(const std::string& says) {
    if (studio_) studio_->StopAll();
    studio_.reset();
    MakeFile("worker.says", says);
    studio_ = std::make_unique<Studio>(
        context_, StudioSettings{In("worker"), {}, {In("clips")}, In("session")});
    one_ = studio_->Add(In("clips/one.mp4"));
    two_ = studio_->Add(In("clips/two.mp4"));
  }
  json All() {
    json all;
    studio_->StopListening(
        studio_->Listen([&all](const auto& event) { all = json::parse(*event); }));
    return all;
  }
  json State() { return All()["clips"][one_]; }
  // The answer, null where none has come yet.
  json Do(json request) {
    const auto answer = std::make_shared<json>();
    if (!request.contains("clip")) request["clip"] = one_;
    studio_->Do(request, [answer](json said) { *answer = std::move(said); });
    return *answer;
  }
  // Whether it comes so far. Nothing that a handler throws is caught.
  template <class Condition>
  bool Comes(const Condition& condition) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (!condition() && std::chrono::steady_clock::now() < end) {
      context_.restart();
      context_.run_for(std::chrono::milliseconds(10));
    }
    return condition();
  }

  boost::asio::io_context context_{1};
  std::unique_ptr<Studio> studio_;
  std::string one_, two_;
};

TEST_F(StudioWorkerTest, WhatMakesNoSenseEndsTheWorkerAndNothingElse) {
  std::vector<std::string> lies = {std::string("\xff\xff\xff\xff\0\0\0\0", 8)};
  for (const char* lie :
       {R"({"tells": {"state": 5}})",
        R"({"tells": {"error": {}}})",
        R"({"tells": 7})",
        R"({"tells": {"path": 1}})",
        R"({"tells": {"settings": []}})",
        R"({"tells": {"settings": {"controls": {"20": 1e300}}}})",
        R"({"id": 1, "error": 7})",
        R"({"id": "1"})",
        R"({"id": 1, "why": ["busy"]})",
        R"({"id": 1, "why": "so"})",
        R"({"tells": {"state": "odd"}})",
        R"({"tells": {"picture": -1e300}})",
        R"({"tells": {"picture": 4294967296}})",
        R"({"tells": {"outcome": [1]}})",
        R"({"tells": {"outcome": {"shake_before": "<b>"}}})",
        R"({"tells": {"warnings": 7}})",
        R"({"tells": {"info": {"width": 9, "height": 9, "shown_width": 9, "frames": 1e9, "rate": 25,
                               "interlaced": false}}})",
        R"({"tells": {"info": {"width": 9, "height": 9, "shown_width": 9, "frames": 9, "rate": 0,
                               "interlaced": false}}})",
        R"({"tells": {"progress": {"stage": "solving", "says": "", "share": 1.5}}})",
        R"({"tells": {"path": "/etc/passwd", "state": "ready", "shots": {}}})",
        R"({"tells": {"shots": [{"first": 0, "end": 9, "choice": {"candidates": [7]}}]}})",
        R"({"tells": {"shots": [{"first": -1, "end": 9}]}})"}) {
    lies.push_back(Encode({json::parse(lie), ""}));
  }
  json settings = {{"deleted", json::array()}};
  for (int track = 0; track <= 20000; ++track) settings["deleted"].push_back({track, 0});
  lies.push_back(Encode({{{"tells", {{"settings", settings}}}}, ""}));
  // Pictures: of another kind, with passes without end, wider than was asked for.
  for (const char* bytes : {"GIF89a\1\0\1\0\0\0\0", "\xff\xd8\xff\xc2\0\21\10\0\10\0\10\3\1",
                            "\xff\xd8\xff\xc0\0\21\10\0\10\2\201\3\1"}) {
    lies.push_back(Encode({{{"id", 1}, {"why", ""}}, std::string(bytes, 13)}));
  }
  for (const std::string& lie : lies) {
    SCOPED_TRACE(lie.substr(0, 200));
    Start(lie);
    EXPECT_EQ(Do({{"op", "open"}}), json::object());
    json picture;
    ASSERT_TRUE(studio_->Ask(one_, {{"op", "frame"}, {"width", 640}},
                             [&picture](const Message& answer) { picture = answer.head; }));
    ASSERT_TRUE(Comes([&] { return State()["state"] == "failed"; })) << State();
    EXPECT_TRUE(picture.contains("error")) << picture;
    EXPECT_EQ(State()["settings"]["controls"], json::object());
  }
}

TEST_F(StudioWorkerTest, WhatIsToldOfAClipChangesNoOtherAndIsNotKeptWhereItCantBeRead) {
  json told =
      json::parse(R"({"state": "ready", "id": "x", "can_undo": [], "odd": [1], "deleted": {},
      "path": "", "shots": [{"first": 0, "end": 9, "choice": {"text": "", "why": "", "odd": 1,
      "candidates": []}}], "outcome": {"shake_before": null, "shake_after": 1e300, "width_kept": 1,
      "most_zoom": 1, "most_black": 0, "worst_shake": 0, "worst_at": 0, "text": "more"}})");
  told["path"] = In("clips/two.mp4");
  told["warnings"] = std::vector<std::string>(1000, std::string(10000, 'w'));
  Start(Encode({{{"tells", told}}, ""}));
  Do({{"op", "open"}});
  ASSERT_TRUE(Comes([&] { return State()["state"] == "ready"; }));
  EXPECT_EQ(State()["path"], In("clips/one.mp4"));
  EXPECT_EQ(State()["can_undo"], false);
  EXPECT_EQ(State()["deleted"], 0);
  EXPECT_FALSE(State().contains("odd") || State()["outcome"].contains("text"))
      << State()["outcome"];
  EXPECT_EQ(State()["outcome"]["shake_after"], nullptr);
  EXPECT_LT(State().dump().size(), 500000u);
  EXPECT_TRUE(Do({{"op", "way"}, {"way", 0}}).contains("error"));
  EXPECT_EQ(State()["id"], one_);
  EXPECT_EQ(Do({{"op", "control"}, {"clip", two_}, {"control", 28}, {"value", 2}}), json::object());
  Start("");
  EXPECT_EQ(All()["clips"][two_]["settings"]["controls"]["28"], 2.0);
  EXPECT_EQ(All()["order"].size(), 2u);
}

TEST_F(StudioWorkerTest, WhoeverWaitsForItHearsOfItsEnd) {
  // Two outputs can be had like that; of nothing else it says anything.
  Start(Encode({{{"id", 1}}, ""}) + Encode({{{"id", 2}}, ""}));
  json lassoed, saved;
  const auto wait_for = [this](const char* op, json& said) {
    studio_->Do({{"op", op}, {"clip", one_}, {"frame", 0}, {"path", In("clips/w.calm")}},
                [&said](json answer) { said = std::move(answer); });
  };
  // Of a clip ahead of another.
  wait_for("lasso", lassoed);
  wait_for("save", saved);
  EXPECT_EQ(Do({{"op", "remove"}}), json::object());
  EXPECT_TRUE(lassoed.contains("error") && saved.contains("error")) << lassoed << saved;
  // A render that waits for work that is never saved is let go, and the next one has its turn.
  const auto states = [this] {
    std::string told;
    const json all = All();
    for (const json& job : all["renders"]) told += job["state"].get<std::string>() + " ";
    return told;
  };
  for (const char* name : {"clips/a.mp4", "clips/b.mp4"}) {
    Do({{"op", "render"}, {"clip", two_}, {"path", In(name)}});
  }
  EXPECT_TRUE(Comes([&] { return states() == "saving waiting "; })) << states();
  Do({{"op", "end render"}, {"render", 1}});
  EXPECT_EQ(states(), "cancelled saving ");
  // With this the studio ends.
}

TEST_F(StudioWorkerTest, ANewPasswordLetsNobodyInWhoHadTheOldOne) {
  const auto secret = [this](const std::string& password) {
    studio_->StopAll();
    studio_.reset();
    studio_ = std::make_unique<Studio>(
        context_, StudioSettings{In("worker"), {}, {In("clips")}, In("session"), password});
    return studio_->secret();
  };
  const std::string none = secret(""), first = secret("password one");
  EXPECT_EQ(secret("password one"), first);
  const std::string second = secret("password two"), again = secret("");
  EXPECT_EQ(std::set<std::string>({none, first, second, again}).size(), 4u);
  EXPECT_EQ(secret(""), again);
}

}  // namespace
}  // namespace calmframe::studio
