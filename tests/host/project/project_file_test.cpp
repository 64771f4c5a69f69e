#include "host/project/project_file.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <tuple>

#include "host/project/sqlite.h"
#include "host/timeline/source.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

class ProjectTest : public testing::Test {
 protected:
  ProjectTest() {
    fs::create_directories(Path("clips"));
    WriteFile(Path("clips/walk.mp4"), "a walk");
  }

  std::string Path(const std::string& name) const { return folder_.In(name); }
  static void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream(path) << text;
  }

  // Of a size that takes SQLite many pages; `mark` tells one from another throughout.
  Project Sample(int mark, std::size_t bytes = 300000) const {
    Project project;
    project.clip_path = Path("clips/walk.mp4");
    project.clip_content = ContentOf(project.clip_path);
    project.clip_frames.assign(bytes / 100, static_cast<std::uint8_t>(mark + 50));
    project.width = 1920;
    project.height = 1080;
    project.pixel_aspect = {64, 45};
    project.start_frame = -3;
    project.length = 495 + mark;
    project.ticks_per_frame = 23543520;
    project.field_type = 1;
    project.effect.match_name = "KLPX SubspaceStabilizer";
    project.effect.values = {{4, 150.0}, {20, 0.1 + mark}, {302, 9808}};
    project.effect.instance.assign(bytes, static_cast<std::uint8_t>(mark));
    return project;
  }

  static void ExpectSame(const Project& a, const Project& b) {
    const auto numbers = [](const Project& p) {
      return std::tuple(p.width, p.height, p.pixel_aspect.num, p.pixel_aspect.den, p.start_frame,
                        p.length, p.ticks_per_frame, p.field_type);
    };
    EXPECT_EQ(numbers(a), numbers(b));
    EXPECT_EQ(a.clip_content, b.clip_content);
    EXPECT_EQ(a.effect.match_name, b.effect.match_name);
    EXPECT_EQ(a.effect.values, b.effect.values);
    EXPECT_TRUE(a.clip_frames == b.clip_frames && a.effect.instance == b.effect.instance);
  }

  static std::string Refusal(const std::function<void()>& work) {
    try {
      work();
    } catch (const ProjectFailure& failure) {
      return failure.what();
    }
    return "";
  }

  const ScratchFolder folder_;
};

TEST_F(ProjectTest, WhatIsSavedComesBackToTheBit) {
  const std::string path = Path("walk.calm");
  for (const int mark : {1, 2, 0}) {  // made, then replaced; the last has no bytes of either kind
    const Project saved = Sample(mark, mark == 0 ? 0 : 300000);
    SaveProject(path, saved);
    ExpectSame(LoadProject(path), saved);
  }
  EXPECT_EQ(LoadProject(path).clip_relative, "clips/walk.mp4");
  EXPECT_EQ(std::distance(fs::directory_iterator(folder_.path()), {}),
            2);  // the project and the clips
}

TEST_F(ProjectTest, TheClipIsFoundWhereverItWentAndKnownWhenItChanged) {
  SaveProject(Path("walk.calm"), Sample(1));
  // The whole folder is moved, then the project alone, then both stand side by side.
  fs::create_directories(Path("moved"));
  fs::copy(Path("clips"), Path("moved/clips"));
  fs::copy(Path("walk.calm"), Path("moved/walk.calm"));
  const Project project = LoadProject(Path("moved/walk.calm"));
  EXPECT_EQ(FindClip(Path("moved/walk.calm"), project), Path("moved/clips/walk.mp4"));
  fs::remove_all(Path("moved/clips"));
  EXPECT_EQ(FindClip(Path("moved/walk.calm"), project), Path("clips/walk.mp4"));
  fs::rename(Path("clips/walk.mp4"), Path("moved/walk.mp4"));
  EXPECT_EQ(FindClip(Path("moved/walk.calm"), project), Path("moved/walk.mp4"));
  // Another clip in its old place is no obstacle; alone it is one.
  WriteFile(Path("clips/walk.mp4"), "a run");
  EXPECT_EQ(FindClip(Path("moved/walk.calm"), project), Path("moved/walk.mp4"));
  fs::remove(Path("moved/walk.mp4"));
  EXPECT_THAT(Refusal([&] { FindClip(Path("moved/walk.calm"), project); }),
              HasSubstr("clips/walk.mp4: is not the clip"));
  fs::remove(Path("clips/walk.mp4"));
  EXPECT_THAT(Refusal([&] { FindClip(Path("moved/walk.calm"), project); }), HasSubstr("is gone"));
}

TEST_F(ProjectTest, ProjectsOfOlderVersionsAreTakenAndReplaced) {
  const std::string aspect = ", ('pixel_aspect_num', 64), ('pixel_aspect_den', 45)";
  const struct {
    int version;
    std::string more_settings;
    const char* checksum;
    std::int32_t aspect_num;
    std::uint32_t aspect_den;
  } cases[] = {{1, "", "ea2167a1-b2b9-170e-9991-37971d8e65f8", 1, 1},
               {2, aspect, "139746d3-1f72-716f-bb11-540ad5d927c4", 64, 45}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.version);
    const std::string path = Path("old" + std::to_string(c.version) + ".calm");
    const std::string sql =
        "CREATE TABLE setting (key TEXT PRIMARY KEY, value) WITHOUT ROWID;"
        "CREATE TABLE parameter (disk_id INTEGER PRIMARY KEY, value REAL NOT NULL);"
        "CREATE TABLE instance (id INTEGER PRIMARY KEY, bytes BLOB NOT NULL);"
        "PRAGMA application_id = 1130458221; PRAGMA user_version = " +
        std::to_string(c.version) +
        ";INSERT INTO setting VALUES ('clip_path', '/clips/walk.mp4'),"
        "('clip_relative', 'clips/walk.mp4'),"
        "('clip_content', '00112233-4455-6677-8899-aabbccddeeff'), ('width', 1920),"
        "('height', 1080), ('start_frame', -3), ('length', 495),"
        "('ticks_per_frame', 23543520), ('field_type', 1),"
        "('match_name', 'KLPX SubspaceStabilizer'), ('checksum', '" +
        c.checksum + "')" + c.more_settings +
        ";INSERT INTO parameter VALUES (20, 50.0);"
        "INSERT INTO instance VALUES (1, X'010203');";
    SqliteDatabase(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE).Run(sql.c_str());
    const Project project = LoadProject(path);
    EXPECT_EQ(project.length, 495);
    EXPECT_EQ(project.pixel_aspect.num, c.aspect_num);
    EXPECT_EQ(project.pixel_aspect.den, c.aspect_den);
    EXPECT_TRUE(project.clip_frames.empty());
    SaveProject(path, Sample(2));
    ExpectSame(LoadProject(path), Sample(2));
  }
}

TEST_F(ProjectTest, WhatIsNoProjectIsRefusedAndLeftAlone) {
  WriteFile(Path("notes.calm"), std::string(5000, 'n'));
  WriteFile(Path("empty.calm"), "");
  SqliteDatabase(Path("other.calm"), SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE)
      .Run("CREATE TABLE t (x)");
  SaveProject(Path("newer.calm"), Sample(1));
  SqliteDatabase(Path("newer.calm"), SQLITE_OPEN_READWRITE).Run("PRAGMA user_version = 4");
  const struct {
    const char* name;
    const char* cause;
  } cases[] = {{"notes.calm", "is no project"},
               {"empty.calm", "is no project"},
               {"other.calm", "is no project"},
               {"newer.calm", "newer version"}};
  for (const auto& c : cases) {
    const std::uintmax_t size = fs::file_size(Path(c.name));
    EXPECT_THAT(Refusal([&] { LoadProject(Path(c.name)); }), HasSubstr(c.cause)) << c.name;
    EXPECT_THAT(Refusal([&] { SaveProject(Path(c.name), Sample(2)); }), HasSubstr(c.cause))
        << c.name;
    EXPECT_EQ(fs::file_size(Path(c.name)), size) << c.name;
  }
  SaveProject(Path("large.calm"), Sample(1, 5000), 5000);
  ExpectSame(LoadProject(Path("large.calm"), 5000), Sample(1, 5000));
  EXPECT_THAT(Refusal([&] { LoadProject(Path("large.calm"), 4999); }), HasSubstr("than 4999 byte"));
  EXPECT_THAT(Refusal([&] { SaveProject(Path("large.calm"), Sample(2, 5001), 5000); }),
              HasSubstr("than 5000 byte"));
  EXPECT_EQ(LoadProject(Path("large.calm")).length, Sample(1).length);
  EXPECT_THAT(Refusal([&] { LoadProject(Path("missing.calm")); }), HasSubstr("is not there"));
  EXPECT_NE(Refusal([&] { SaveProject(Path("no/such/folder.calm"), Sample(1)); }), "");
}

TEST_F(ProjectTest, DamageIsToldAndNeverMore) {
  SaveProject(Path("whole.calm"), Sample(1, 3000));
  const std::string whole = folder_.Content("whole.calm");
  for (std::size_t at = 0; at < whole.size(); at += 97) {
    std::string damaged = whole;
    damaged[at] = static_cast<char>(~damaged[at]);
    WriteFile(Path("flipped.calm"), damaged);
    // Told, or where it counts for nothing.
    if (Refusal([&] { LoadProject(Path("flipped.calm")); }).empty()) {
      ExpectSame(LoadProject(Path("flipped.calm")), Sample(1, 3000));
    }
    WriteFile(Path("cut.calm"), whole.substr(0, at));
    if (Refusal([&] { LoadProject(Path("cut.calm")); }).empty()) {
      ExpectSame(LoadProject(Path("cut.calm")), Sample(1, 3000));
    }
  }
}

// Calls of SQLite that change files, until the one that the process does not live to see.
int steps_left = 0;
void Step() {
  if (--steps_left == 0) _exit(1);
}

TEST_F(ProjectTest, AnyStepOfASaveMayBeTheLast) {
  const struct {
    const char* name;
    sqlite3_syscall_ptr counted;
  } calls[] = {
      {"open", reinterpret_cast<sqlite3_syscall_ptr>(+[](const char* path, int flags, int mode) {
         Step();
         return open(path, flags, mode);
       })},
      {"pwrite", reinterpret_cast<sqlite3_syscall_ptr>(
                     +[](int file, const void* bytes, std::size_t size, off_t at) {
                       Step();
                       return pwrite(file, bytes, size, at);
                     })},
      {"ftruncate", reinterpret_cast<sqlite3_syscall_ptr>(+[](int file, off_t size) {
         Step();
         return ftruncate(file, size);
       })},
      {"unlink", reinterpret_cast<sqlite3_syscall_ptr>(+[](const char* path) {
         Step();
         return unlink(path);
       })}};
  const std::string path = Path("walk.calm");
  for (const bool was_there : {false, true}) {
    int seen = 0, status = 1;
    for (int step = 1; status != 0; ++step) {
      SCOPED_TRACE(testing::Message() << was_there << " " << step);
      fs::remove(path);
      if (was_there) SaveProject(path, Sample(1, 20000));
      const pid_t child = fork();
      ASSERT_GE(child, 0);
      if (child == 0) {
        sqlite3_vfs* const system = sqlite3_vfs_find(nullptr);
        for (const auto& call : calls) system->xSetSystemCall(system, call.name, call.counted);
        system->xSetSystemCall(system, "pwrite64", calls[1].counted);
        steps_left = step;
        SaveProject(path, Sample(2, 20000));
        _exit(0);
      }
      waitpid(child, &status, 0);
      if (!fs::exists(path)) {
        EXPECT_FALSE(was_there || status == 0);  // the last state was none
        continue;
      }
      const Project kept = LoadProject(path);
      const int mark = kept.length - 495;
      EXPECT_TRUE(mark == 2 || (mark == 1 && was_there && status != 0)) << mark;
      EXPECT_GE(mark, seen) << "what was saved stays saved";
      seen = mark;
      ExpectSame(kept, Sample(mark, 20000));
    }
    EXPECT_EQ(seen, 2);
  }
}

}  // namespace
}  // namespace calmframe::host
