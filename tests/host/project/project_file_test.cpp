#include "host/project/project_file.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <tuple>

#include "host/project/project_keeper.h"
#include "host/project/sqlite.h"
#include "host/timeline/source.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::host {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

class ProjectTest : public testing::Test, protected ScratchFolder {
 protected:
  ProjectTest() {
    fs::create_directories(In("clips"));
    MakeFile("clips/walk.mp4", "a walk");
  }

  // Of a size that takes SQLite many pages; `mark` tells one from another throughout.
  Project Sample(int mark, std::size_t bytes = 300000) const {
    Project project;
    project.clip_path = In("clips/walk.mp4");
    project.clip_content = ContentOf(project.clip_path);
    project.clip_frames.assign(bytes / 100, static_cast<std::uint8_t>(mark + 50));
    project.width = 1920;
    project.height = 1080;
    project.pixel_aspect = {64, 45};
    project.ticks_per_frame = 23543520;
    project.field_type = 1;
    for (int shot = 0; shot <= mark; ++shot) {
      project.shots.resize(static_cast<std::size_t>(shot) + 1);
      SavedShot& saved = project.shots.back();
      saved.start_frame = 1000 * shot - 3;
      saved.length = 495 + mark;
      saved.effect.match_name = "KLPX SubspaceStabilizer";
      saved.effect.values = {{4, 150.0}, {20, 0.1 + mark}, {302, 9808 + shot}};
      saved.effect.instance.assign(bytes, static_cast<std::uint8_t>(mark + shot));
      project.end_frame = saved.start_frame + saved.length + 7;  // a run that was stopped
      saved.choice = shot == 1 ? "{\"still\":\"all\"}" : "";
    }
    return project;
  }

  // All that is saved of one.
  static auto All(const Project& p) {
    std::vector<std::tuple<std::int32_t, std::int32_t, std::string, ParamValues,
                           std::vector<std::uint8_t>, std::string>>
        shots;
    for (const SavedShot& s : p.shots) {
      shots.emplace_back(s.start_frame, s.length, s.effect.match_name, s.effect.values,
                         s.effect.instance, s.choice);
    }
    return std::make_tuple(p.width, p.height, p.pixel_aspect.num, p.pixel_aspect.den,
                           p.ticks_per_frame, p.field_type, p.end_frame, p.clip_content,
                           p.clip_frames, shots);
  }
};

auto IsRefused(const std::string& part) {
  return testing::ThrowsMessage<ProjectFailure>(HasSubstr(part));
}

TEST_F(ProjectTest, TheClipIsFoundBesideAProjectThatMovedOrWhereItWas) {
  const std::string path = In("moved/walk.calm");
  fs::create_directories(In("moved/clips"));
  SaveProject(In("walk.calm"), Sample(1));
  fs::rename(In("walk.calm"), path);
  const Project project = LoadProject(path);
  EXPECT_EQ(project.clip_relative, "clips/walk.mp4");
  EXPECT_EQ(FindClip(path, project), In("clips/walk.mp4"));
  // Another clip in one place is no obstacle; alone it is one.
  fs::rename(In("clips/walk.mp4"), In("moved/walk.mp4"));
  MakeFile("clips/walk.mp4", "a run");
  EXPECT_EQ(FindClip(path, project), In("moved/walk.mp4"));
  fs::rename(In("moved/walk.mp4"), In("moved/clips/walk.mp4"));
  EXPECT_EQ(FindClip(path, project), In("moved/clips/walk.mp4"));
  const auto admits = [&](const std::string& place) { return place == In("clips/walk.mp4"); };
  EXPECT_THAT([&] { FindClip(path, project, admits); }, IsRefused("clips/walk.mp4: is not the"));
  fs::remove(In("moved/clips/walk.mp4"));
  EXPECT_THAT([&] { FindClip(path, project); }, IsRefused("clips/walk.mp4: is not the clip"));
  fs::remove(In("clips/walk.mp4"));
  EXPECT_THAT([&] { FindClip(path, project); }, IsRefused("is gone"));
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
    const std::string path = In("old" + std::to_string(c.version) + ".calm");
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
    EXPECT_EQ(project.shots.at(0).length, 495);
    EXPECT_EQ(project.end_frame, 492);
    EXPECT_EQ(project.shots.at(0).effect.values, (ParamValues{{20, 50.0}}));
    EXPECT_EQ(project.shots.at(0).effect.instance, (std::vector<std::uint8_t>{1, 2, 3}));
    EXPECT_EQ(project.pixel_aspect.num, c.aspect_num);
    EXPECT_EQ(project.pixel_aspect.den, c.aspect_den);
    EXPECT_TRUE(project.clip_frames.empty());
    for (const std::size_t bytes : {300000, 0}) {
      SaveProject(path, Sample(2, bytes));
      EXPECT_TRUE(All(LoadProject(path)) == All(Sample(2, bytes)));
    }
  }
}

TEST_F(ProjectTest, WhatIsNoProjectIsRefusedAndLeftAlone) {
  MakeFile("notes.calm", std::string(5000, 'n'));
  MakeFile("empty.calm", "");
  SqliteDatabase(In("other.calm"), SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE)
      .Run("CREATE TABLE t (x)");
  SaveProject(In("newer.calm"), Sample(1));
  SqliteDatabase(In("newer.calm"), SQLITE_OPEN_READWRITE).Run("PRAGMA user_version = 7");
  SaveProject(In("large.calm"), Sample(1, 5000), 5000);
  EXPECT_TRUE(All(LoadProject(In("large.calm"), 5000)) == All(Sample(1, 5000)));
  const struct {
    const char *name, *load;
    std::size_t bytes;
    const char* save;
  } cases[] = {{"notes.calm", "is no project", 4999, "is no project"},
               {"empty.calm", "is no project", 4999, "is no project"},
               {"other.calm", "is no project", 4999, "is no project"},
               {"newer.calm", "newer version", 4999, "newer version"},
               {"large.calm", "than 4999 byte", 5000, "than 4999 byte"},
               {"missing.calm", "is not there", 5000, "than 4999 byte"},
               {"no/such/folder.calm", "is not there", 4999, ""}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string before = Content(c.name);
    EXPECT_THAT([&] { LoadProject(In(c.name), 4999); }, IsRefused(c.load));
    EXPECT_THAT([&] { SaveProject(In(c.name), Sample(2, c.bytes), 4999); }, IsRefused(c.save));
    EXPECT_TRUE(Content(c.name) == before);
  }
}

TEST_F(ProjectTest, DamageIsToldAndNeverMore) {
  SaveProject(In("whole.calm"), Sample(1, 3000));
  const std::string whole = Content("whole.calm");
  for (std::size_t at = 0; at < whole.size(); at += 97) {
    std::string flipped = whole;
    flipped[at] = static_cast<char>(~flipped[at]);
    for (const std::string& damaged : {flipped, whole.substr(0, at)}) {
      MakeFile("damaged.calm", damaged);
      try {  // told, or where it counts for nothing
        EXPECT_TRUE(All(LoadProject(In("damaged.calm"))) == All(Sample(1, 3000)));
      } catch (const ProjectFailure&) {
      }
    }
  }
}

TEST_F(ProjectTest, TablesThatComputeWhatTheyHoldAreDamage) {
  for (const char* const sql :
       {"DROP TABLE frames; CREATE VIEW frames AS WITH RECURSIVE n (bytes) AS"
        " (SELECT 1 UNION ALL SELECT bytes + 1 FROM n) SELECT count(*) AS bytes FROM n",
        "ALTER TABLE shot ADD COLUMN more AS (hex(zeroblob(400000000)))",
        "CREATE VIRTUAL TABLE more USING rtree (a, b, c)",
        "CREATE TRIGGER more AFTER INSERT ON shot BEGIN SELECT 1; END",
        "CREATE INDEX more ON shot (hex(instance))",
        "CREATE TABLE analysis (start_frame, number, bytes CHECK (bytes LIKE '%a%a%a%a%a%b'))"}) {
    SCOPED_TRACE(sql);
    const std::string path = In("computed.calm");
    std::filesystem::remove(path);
    SaveProject(path, Sample(1, 10));
    sqlite3* stranger = nullptr;
    ASSERT_EQ(sqlite3_open(path.c_str(), &stranger), SQLITE_OK);
    EXPECT_EQ(sqlite3_exec(stranger, sql, nullptr, nullptr, nullptr), SQLITE_OK);
    sqlite3_close(stranger);
    EXPECT_THAT([&] { LoadProject(path); }, IsRefused("is damaged"));
    EXPECT_THAT([&] { SaveProject(path, Sample(1, 10)); }, IsRefused("is damaged"));
    EXPECT_EQ(ProjectKeeper(path, 0).Find(0), nullptr);
  }
}

// SQLite removes the journal of several databases that a journal names, once that is taken back.
TEST_F(ProjectTest, AStrangersJournalRemovesNoFile) {
  const std::string path = In("walk.calm"), precious = In("precious");
  SaveProject(path, Sample(1, 10));
  MakeFile("precious", "mine");
  const auto number = [](std::size_t value) {
    std::string bytes;
    for (const int shift : {24, 16, 8, 0}) bytes += static_cast<char>(value >> shift & 0xff);
    return bytes;
  };
  const std::string magic = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";
  constexpr std::size_t kPage = 4096, kSector = 512;
  std::string journal = magic + number(0) + number(1) + number(fs::file_size(path) / kPage) +
                        number(kSector) + number(kPage);
  journal.resize(kSector);
  std::size_t sum = 0;
  for (const char c : precious) sum += static_cast<unsigned char>(c);
  journal += number((std::size_t{1} << 30) / kPage + 1) + precious + number(precious.size()) +
             number(sum) + magic;
  MakeFile("walk.calm-journal", journal);
  EXPECT_THAT([&] { LoadProject(path); }, IsRefused("is damaged"));
  EXPECT_EQ(Content("precious"), "mine");
}

TEST_F(ProjectTest, WhatNoClipOnALayerTellsIsDamage) {
  const struct {
    std::int32_t width, height, start_frame, length;
    std::int64_t ticks;
    std::int32_t field_type;
    bool loads;
  } cases[] = {{16384, 8192, -10000000, 10000000, 1, 2, true},
               {16384, 8193, 0, 1, 1, 0, false},
               {-1, -1, 0, 1, 1, 0, false},
               {20, 20, 10000001, 0, 1, 0, false},
               {20, 20, -10000001, 0, 1, 0, false},
               {20, 20, 0, 10000001, 1, 0, false},
               {20, 20, 0, -1, 1, 0, false},
               {20, 20, 1, 2, (std::int64_t{1} << 60) - 1, 0, true},  // of four frames, twice
               {20, 20, 1, 2, std::int64_t{1} << 60, 0, false},
               {20, 20, 0, 1, 0, 0, false},
               {20, 20, 0, 1, 1, 3, false},
               {20, 20, 0, 1, 1, -1, false}};
  for (const auto& c : cases) {
    Project project = Sample(0, 10);
    std::tie(project.width, project.height, project.shots[0].start_frame, project.shots[0].length,
             project.ticks_per_frame, project.field_type) =
        std::tie(c.width, c.height, c.start_frame, c.length, c.ticks, c.field_type);
    project.end_frame = c.start_frame + c.length;
    SaveProject(In("ranges.calm"), project);
    const auto load = [&] { LoadProject(In("ranges.calm")); };
    if (c.loads) {
      EXPECT_NO_THROW(load());
    } else {
      EXPECT_THAT(load, IsRefused("is damaged")) << &c - cases;
    }
  }
  Project two = Sample(1, 10);  // the first shot ends before frame 493, the second has 496
  for (const auto& [second, end] : {std::pair(493, 989), {492, 989}, {493, 988}}) {
    two.shots[1].start_frame = second;
    two.end_frame = end;
    SaveProject(In("two.calm"), two);
    const auto load = [&] { LoadProject(In("two.calm")); };
    if (second == 493 && end == 989) {
      EXPECT_NO_THROW(load());
    } else {
      EXPECT_THAT(load, IsRefused("is damaged"));
    }
  }
}

TEST_F(ProjectTest, ASaverWritesWhatChangedAndAllWhereItCannotKnow) {
  const std::string path = In("walk.calm");
  ProjectSaver saver(path);
  Project project = Sample(2, 20000);
  saver.Save(project, 0);
  const auto save = [&](std::size_t changed) {
    saver.Save(project, changed);
    return All(LoadProject(path)) == All(project);
  };
  project.shots[1] = Sample(5).shots[1];
  EXPECT_TRUE(save(1));
  project.shots.pop_back();
  project.clip_frames.push_back(1);
  EXPECT_TRUE(save(1)) << "a shot fewer, another list of frames";
  project.shots.push_back(Sample(4).shots[2]);
  project.end_frame = Sample(4).end_frame;
  EXPECT_TRUE(save(0)) << "a shot more, which nobody names";
  SaveProject(path, Sample(0));
  EXPECT_TRUE(save(1)) << "another one has saved";
  fs::remove(path);
  EXPECT_TRUE(save(1)) << "the file is gone";
  project.shots[0].choice = "{}";
  fs::rename(path, In("away"));
  fs::create_directory(path);
  EXPECT_THROW(saver.Save(project, 0), ProjectFailure);
  fs::remove(path);
  fs::rename(In("away"), path);
  EXPECT_TRUE(save(1)) << "the save before failed";

  // A row that nobody changed isn't written: one that was damaged meanwhile stays so.
  SqliteDatabase(path, SQLITE_OPEN_READWRITE).Run("UPDATE shot SET choice = 'x' WHERE number = 1");
  saver.Save(project, 1);
  EXPECT_THAT([&] { LoadProject(path); }, IsRefused("is damaged"));
  saver.Save(project, 0);
  EXPECT_TRUE(All(LoadProject(path)) == All(project));
}

// Calls of SQLite that change files, until the one that the process does not live to see.
int steps_left = 0;
template <auto kCall, class... Args>
auto Counted(Args... args) {
  if (--steps_left == 0) _exit(1);
  return kCall(args...);
}

TEST_F(ProjectTest, AnyStepOfASaveMayBeTheLast) {
  const auto count = [](const char* name, auto* counted) {
    sqlite3_vfs* const system = sqlite3_vfs_find(nullptr);
    system->xSetSystemCall(system, name, reinterpret_cast<sqlite3_syscall_ptr>(counted));
  };
  const std::string path = In("walk.calm");
  enum class Before { none, another, own };
  for (const Before before : {Before::none, Before::another, Before::own}) {
    const bool was_there = before != Before::none;
    int seen = 0, status = 1;
    for (int step = 1; status != 0; ++step) {
      SCOPED_TRACE(testing::Message() << static_cast<int>(before) << " " << step);
      fs::remove(path);
      ProjectSaver saver(path);
      if (before == Before::another) SaveProject(path, Sample(1, 20000));
      if (before == Before::own) saver.Save(Sample(1, 20000), 0);
      Project next = Sample(2, 20000);
      if (before == Before::own) next.shots[0] = Sample(1, 20000).shots[0];
      const pid_t child = fork();
      ASSERT_GE(child, 0);
      if (child == 0) {
        count("open", &Counted<open, const char*, int, int>);
        count("pwrite", &Counted<pwrite, int, const void*, std::size_t, off_t>);
        count("pwrite64", &Counted<pwrite, int, const void*, std::size_t, off_t>);
        count("ftruncate", &Counted<ftruncate, int, off_t>);
        count("unlink", &Counted<unlink, const char*>);
        steps_left = step;
        saver.Save(next, 1);
        _exit(0);
      }
      waitpid(child, &status, 0);
      if (!fs::exists(path)) {
        EXPECT_FALSE(was_there || status == 0);  // the last state was none
        continue;
      }
      const Project kept = LoadProject(path);
      const int mark = kept.shots.at(1).length - 495;
      EXPECT_TRUE(mark == 2 || (mark == 1 && was_there && status != 0)) << mark;
      EXPECT_GE(mark, seen) << "what was saved stays saved";
      seen = mark;
      EXPECT_TRUE(All(kept) == All(mark == 2 ? next : Sample(mark, 20000)));
    }
    EXPECT_EQ(seen, 2);
  }
}

}  // namespace
}  // namespace calmframe::host
