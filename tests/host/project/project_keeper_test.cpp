#include "host/project/project_keeper.h"

#include <gtest/gtest.h>

#include "host/project/project_file.h"
#include "host/timeline/source.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

using Bytes = std::vector<std::uint8_t>;

class ProjectKeeperTest : public testing::Test, protected ScratchFolder {
 protected:
  static void Keep(ProjectKeeper& keeper, std::size_t number, const Bytes& bytes) {
    keeper.Keep(number, bytes.data(), bytes.size());
  }
  static Bytes Found(ProjectKeeper& keeper, std::size_t number) {
    const Bytes* const found = keeper.Find(number);
    return found ? *found : Bytes();
  }
  const std::string path_ = In("walk.calm");
};

TEST_F(ProjectKeeperTest, PiecesAreFoundByAnotherUntilWorkIsSaved) {
  const Bytes a(5000, 1), b(70000, 2), c(3, 3);
  {
    ProjectKeeper keeper(path_, 40), other_shot(path_, 900);
    EXPECT_FALSE(keeper.Find(0));
    Keep(keeper, 0, a);
    Keep(keeper, 1, b);
    Keep(keeper, 2, a);
    Keep(other_shot, 0, c);
    Keep(keeper, 1, c);  // in place of it and of what was behind it
  }
  ProjectKeeper keeper(path_, 40);
  EXPECT_EQ(Found(keeper, 0), a);
  EXPECT_EQ(Found(keeper, 1), c);
  EXPECT_FALSE(keeper.Find(2));
  EXPECT_FALSE(HoldsWork(path_));
  EXPECT_THROW(LoadProject(path_), ProjectFailure);

  MakeFile("walk.mp4", "a walk");
  Project project;
  project.clip_path = In("walk.mp4");
  project.clip_content = ContentOf(project.clip_path);
  project.ticks_per_frame = 1000;
  project.width = project.height = 100;
  project.shots.front().length = 5;
  project.end_frame = 5;
  SaveProject(path_, project);
  EXPECT_TRUE(HoldsWork(path_));
  EXPECT_FALSE(keeper.Find(0));
  Keep(keeper, 0, b);  // of an analysis that is done anew: the work stands until that is saved
  EXPECT_TRUE(HoldsWork(path_));
  EXPECT_EQ(LoadProject(path_).shots.front().length, 5);
  EXPECT_EQ(Found(keeper, 0), b);
}

TEST_F(ProjectKeeperTest, WhereNothingCanBeKeptTheWorkGoesOn) {
  ProjectKeeper nowhere(In("no/folder/walk.calm"), 0, std::chrono::milliseconds(0));
  EXPECT_TRUE(nowhere.Wants());
  Keep(nowhere, 0, {1});
  EXPECT_FALSE(nowhere.Wants());
  EXPECT_FALSE(nowhere.Find(0));
  MakeFile("walk.calm", "no database at all, but some text that is long enough for a header .....");
  ProjectKeeper none(path_, 0);
  EXPECT_FALSE(none.Find(0));
  EXPECT_TRUE(HoldsWork(path_)) << "whoever loads it is told";
}

}  // namespace
}  // namespace calmframe::host
