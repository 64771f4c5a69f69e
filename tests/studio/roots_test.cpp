#include "studio/wire/roots.h"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>

namespace calmframe::studio {
namespace {

namespace fs = std::filesystem;

// open/ with a clip and links, and what lies beside it.
class StudioRootsTest : public testing::Test {
 protected:
  void SetUp() override {
    for (const char* folder : {"open/inner", "open-beside", "closed"}) {
      fs::create_directories(place_ / folder);
    }
    for (const char* file : {"open/walk.MP4", "open/notes.txt", "open/.hidden.mp4",
                             "open/inner/work.calm", "open-beside/walk.mp4", "closed/secret.mp4"}) {
      std::ofstream(place_ / file) << "x";
    }
    fs::create_symlink(place_ / "closed", place_ / "open/out");
    fs::create_symlink(place_ / "closed/secret.mp4", place_ / "open/out.mp4");
    fs::create_symlink(place_ / "closed/new.mp4", place_ / "open/dangling.mp4");
    fs::create_symlink(place_ / "open/inner", place_ / "open/within");
  }
  void TearDown() override { fs::remove_all(place_); }

  std::string At(const std::string& path) const { return place_ / path; }

  const fs::path place_ =
      fs::canonical(fs::temp_directory_path()) / ("studio-roots-" + std::to_string(getpid()));
};

TEST_F(StudioRootsTest, NothingOutsideIsFoundOrWritten) {
  const Roots roots({At("open")});
  EXPECT_EQ(roots.Existing(At("open/within/work.calm")), At("open/inner/work.calm"));
  for (const char* path : {"open-beside/walk.mp4", "closed/secret.mp4", "open/../closed/secret.mp4",
                           "open/out/secret.mp4", "open/out.mp4", ""}) {
    EXPECT_THROW(roots.Existing(At(path)), PathRefused) << path;
    EXPECT_THROW(roots.ToWrite(At(path)), PathRefused) << path;
  }
  EXPECT_THROW(roots.Existing("open/walk.MP4"), PathRefused);
}

TEST_F(StudioRootsTest, ANameIsFoundWhereItStandsOnceAndPicturesByTheirFolder) {
  const Roots both({At("open"), At("open-beside")});
  EXPECT_EQ(both.Find("work.calm"), At("open/inner/work.calm"));
  EXPECT_EQ(both.Find("walk.mp4"), At("open-beside/walk.mp4"));
  // Outside, in a folder that a link leads to, hidden, a link that leads out, no file, no name.
  for (const char* name :
       {"secret.mp4", "out.mp4", ".hidden.mp4", "inner", "", "inner/work.calm"}) {
    EXPECT_THROW(both.Find(name), PathRefused) << name;
  }
  std::ofstream(place_ / "open/inner/walk.mp4") << "x";
  EXPECT_THROW(both.Find("walk.mp4"), PathRefused) << "which of them?";
  for (const char* folder : {"open/inner", "closed"}) {
    std::ofstream(place_ / folder / "f0001.png") << "x";
  }
  EXPECT_EQ(both.ExistingClip(At("open/within/f%04d.png")), At("open/inner/f%04d.png"));
  for (const char* path : {"closed/f%04d.png", "open/out/f%04d.png", "open/none/f%04d.png"}) {
    EXPECT_THROW(both.ExistingClip(At(path)), PathRefused) << path;
  }
}

TEST_F(StudioRootsTest, WhatIsWrittenLiesInAFolderThatIsThere) {
  const Roots roots({At("open")});
  EXPECT_EQ(roots.ToWrite(At("open/within/new.mp4")), At("open/inner/new.mp4"));
  for (const char* path : {"open/inner", "open/none/new.mp4", "open/", "open/..",
                           "open/dangling.mp4", "open/out/new.mp4"}) {
    EXPECT_THROW(roots.ToWrite(At(path)), PathRefused) << path;
  }
}

TEST_F(StudioRootsTest, ListsClipsWorkAndFoldersThatMayBeOpened) {
  const Roots roots({At("open")});
  const nlohmann::json list = roots.List("");
  EXPECT_EQ(list["folders"], nlohmann::json({"inner", "within"}));
  ASSERT_EQ(list["files"].size(), 1u) << list;
  EXPECT_EQ(list["files"][0],
            nlohmann::json({{"name", "walk.MP4"}, {"bytes", 1}, {"project", false}}));
  EXPECT_TRUE(list["parent"].is_null());
  const nlohmann::json inner = roots.List(At("open/inner"));
  EXPECT_EQ(inner["parent"], At("open"));
  EXPECT_TRUE(inner["files"][0]["project"].get<bool>());
  EXPECT_THROW(roots.List(At("closed")), PathRefused);
  EXPECT_THROW(Roots({At("open/walk.MP4")}), PathRefused);
}

}  // namespace
}  // namespace calmframe::studio
