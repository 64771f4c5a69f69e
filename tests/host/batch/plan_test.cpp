#include "host/batch/plan.h"

#include <gmock/gmock.h>
#include <sys/wait.h>

#include <csignal>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "host/base/shown_text.h"
#include "host/batch/clip_names.h"
#include "host/batch/local_batch.h"
#include "host/batch/machine.h"
#include "host/batch/slurm_batch.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::batch {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

TEST(BatchNamesTest, OutputsAreCalledByTheirTemplate) {
  const struct {
    const char *name, *below, *clip, *output;
  } cases[] = {
      {"{stem}-steady{ext}", "", "a/walk.mp4", "walk-steady.mp4"},
      {"{stem}-steady{ext}", "sub/deep", "a/sub/deep/walk.tar.mp4", "sub/deep/walk.tar-steady.mp4"},
      {"{stem}.mkv", "", "x{ext}y{stem}.mp4", "x{ext}y{stem}.mkv"},
      {"{stem}/{stem}{ext}", "", "no extension", "no extension/no extension"},
      {"{stem}{ext}", "", "line\n\"quote'.mov", "line\n\"quote'.mov"}};
  for (const auto& c : cases) EXPECT_EQ(OutputName(c.name, c.below, c.clip), c.output);
  for (const std::string name : {"{stem}{ext}", "a b", "{stem}/{stem}.mkv"}) {
    EXPECT_EQ(TemplateTrouble(name), "") << name;
  }
  for (const std::string name : {"", "{name}", "../{stem}", "/{stem}", "{stem}/", ".{stem}",
                                 "a/.b/{stem}", "{stem}{", "a/../{stem}"}) {
    EXPECT_NE(TemplateTrouble(name), "") << name;
  }
}

TEST(BatchNamesTest, FoldersOfTasksAreSafeAndApart) {
  const std::string long_name(300, 'x');
  std::set<std::string> ids;
  for (const std::string& name :
       {std::string("a b.mp4"), std::string("a_b.mp4"), std::string("a/b.mp4"),
        std::string("a\nb.mp4"), std::string("\xff.mp4"), std::string("\xc3\xa4.mp4"),
        long_name + "1", long_name + "2", "1" + long_name}) {
    const std::string id = TaskId(name);
    EXPECT_LE(id.size(), 81u);
    EXPECT_EQ(id.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                   "-._"),
              std::string::npos)
        << id;
    EXPECT_TRUE(ids.insert(id).second) << id;
  }
  EXPECT_EQ(Shown("a\nb\t\x1b[2J\x7f\"'\u00a1.mp4"), "a\\nb\\t\\x1b[2J\\x7f\"'\u00a1.mp4");
  EXPECT_EQ(Shown("\u009b2J\xc2"), "\\u009b2J\xc2");
}

class BatchPlanTest : public ::testing::Test, protected ScratchFolder {
 protected:
  void Make(const std::string& name) const {
    std::filesystem::create_directories(std::filesystem::path(In(name)).parent_path());
    MakeFile(name, "a clip");
  }
  std::vector<std::string> Found(const std::vector<std::string>& words, bool recursive) const {
    std::vector<std::string> names;
    for (const FoundClip& clip : FindClips(words, recursive).clips) {
      const bool here = clip.name.starts_with(path().string() + "/");
      names.push_back((here ? clip.name.substr(path().string().size() + 1) : clip.name) +
                      (clip.below.empty() ? "" : " in " + clip.below) +
                      (clip.trouble.empty() ? "" : ": " + clip.trouble));
    }
    return names;
  }
  Plan PlanOfClips(const std::vector<FoundClip>& clips, const std::string& name = "{stem}-s{ext}") {
    std::filesystem::create_directories(In("out"));
    Plan plan{.program = "/bin/false", .folder = In("out"), .settings = {"--crf=20"}};
    AddTasks(clips, name, plan);
    return plan;
  }
  void SaveRecord(const Plan& plan, const Record& record) const {
    const TaskFolder folder = plan.FolderOf(plan.tasks[0]);
    std::filesystem::create_directories(folder.path());
    ASSERT_TRUE(WriteWhole(folder.record(), TextOf(record)));
  }
};

TEST_F(BatchPlanTest, ClipsAreFound) {
  for (const char* name : {"c/b.MP4", "c/a.mov", "c/notes.txt", "c/.hidden.mp4", "c/sub/d.mkv",
                           "c/.calmframe/x/output.mp4", "odd.bin", "line\nbreak.mp4", "@at.mp4"}) {
    Make(name);
  }
  std::filesystem::create_directory_symlink(In("c"), In("c/sub/circle"));
  EXPECT_THAT(Found({In("c")}, false), ElementsAre("c/a.mov", "c/b.MP4"));
  EXPECT_THAT(Found({In("c")}, true), ElementsAre("c/a.mov", "c/b.MP4", "c/sub/d.mkv in sub"));
  // A file by itself is taken whatever it is called, and once; a pattern has no notion of kinds.
  EXPECT_THAT(Found({In("odd.bin"), In("c/a.mov"), In("c/../c/a.mov"), In("c/[ab].*")}, false),
              ElementsAre("odd.bin", "c/a.mov", "c/b.MP4"));
  MakeFile("list", In("c/a.mov") + "\r\n\n" + In("c/sub") + "\n@list\nno.mp4\n");
  EXPECT_THAT(Found({"@" + In("list")}, false),
              ElementsAre("c/a.mov", "c/sub/d.mkv", "./@list: No such file or directory",
                          "no.mp4: No such file or directory"));
  // What a list may ask for ends: of two words ten are a thousand names, of folders that go round
  // and round there is one after the other.
  std::string spelled = In("c/"), round = In("c/");
  for (int word = 0; word < 30; ++word) spelled += "{a,b}";
  for (int turn = 0; turn < 30; ++turn) round += "*/../";
  Make("c/a/x.mp4");
  Make("c/b/x.mp4");
  MakeFile("hard", spelled + "*\n" + round + "*.mp4\n" + In("c/{a,b}/x*"));
  EXPECT_THAT(Found({"@" + In("hard")}, false),
              ElementsAre(HasSubstr("}*: no file has such a name"),
                          HasSubstr("*.mp4: no file has such a name"), "c/a/x.mp4", "c/b/x.mp4"));
  MakeFile("list0", In("line\nbreak.mp4") + std::string(1, '\0') + In("@at.mp4"));
  EXPECT_THAT(Found({"@" + In("list0")}, false), ElementsAre("line\nbreak.mp4", "@at.mp4"));
  std::filesystem::create_directory(In("none"));
  EXPECT_THAT(Found({In("none"), In("*.nothing"), "@" + In("no list")}, true),
              ElementsAre("none: has no clips in it", "*.nothing: no file has such a name",
                          HasSubstr("no list: No such file")));
}

TEST_F(BatchPlanTest, OutputsOfAnEarlierBatchAreNoClips) {
  for (const char* name : {"c/a.mp4", "c/out/a-s.mp4", "c/out/sub/b-s.mp4", "c/out/mine.mp4"}) {
    Make(name);
  }
  for (const std::string output : {"a-s.mp4", "sub/b-s.mp4", "mine.mp4"}) {
    Record record{.output = output};
    if (output != "mine.mp4") record.output_identity = IdentityOf(In("c/out/" + output));
    const TaskFolder folder(In("c/out"), output);
    std::filesystem::create_directories(folder.path());
    ASSERT_TRUE(WriteWhole(folder.record(), TextOf(record)));
  }
  EXPECT_THAT(Found({In("c")}, true), ElementsAre("c/a.mp4", "c/out/mine.mp4 in out"));
  const FoundClips named = FindClips({In("c/out/a-s.mp4"), In("c/out/sub")}, true);
  EXPECT_EQ(named.outputs, 2u);
  EXPECT_THAT(named.clips, ::testing::IsEmpty());
}

TEST_F(BatchPlanTest, OutputsThatWouldBeAnothersOrAnInputAreRefused) {
  for (const char* name : {"a/x.mp4", "b/x.mp4", "a/y.mp4", "out/in.mp4"}) Make(name);
  std::filesystem::create_hard_link(In("a/y.mp4"), In("out/y.mp4"));
  Plan plan = PlanOfClips({{In("a/x.mp4")},
                           {In("b/x.mp4")},
                           {In("a/y.mp4")},
                           {In("out/in.mp4")},
                           {"gone", "", "is gone"}},
                          "{stem}{ext}");
  EXPECT_THAT(plan.tasks[0].refused, HasSubstr("2 clips would be written to x.mp4"));
  EXPECT_EQ(plan.tasks[0].refused, plan.tasks[1].refused);
  EXPECT_THAT(plan.tasks[2].refused, HasSubstr("written over y.mp4, which is an input"));
  EXPECT_THAT(plan.tasks[3].refused, HasSubstr("written over in.mp4"));
  EXPECT_EQ(plan.tasks[4].refused, "is gone");
  EXPECT_EQ(plan.tasks[4].refused_code, kInputCode);
  plan = PlanOfClips({{In("a/x.mp4")}, {In("b/x.mp4"), "b"}, {In("a/y.mp4")}});
  for (const Task& task : plan.tasks) EXPECT_EQ(task.refused, "");
  plan = PlanOfClips({{In("a/y.mp4")}}, std::string(246, 'n') + "{ext}");
  EXPECT_EQ(plan.tasks[0].refused, "");
  plan = PlanOfClips({{In("a/y.mp4")}}, std::string(247, 'n') + "{ext}");
  EXPECT_THAT(plan.tasks[0].refused, HasSubstr("longer than 250 bytes"));
}

TEST_F(BatchPlanTest, WhatIsDoneIsDoneUntilAnythingChanges) {
  Make("x.mp4");
  Make("out/x-s.mp4");
  const Plan plan = PlanOfClips({{In("x.mp4")}});
  const Task& task = plan.tasks[0];
  EXPECT_FALSE(DoneRecord(plan, task));
  const Record whole{.state = Record::State::done,
                     .source = task.source,
                     .source_identity = *IdentityOf(task.source),
                     .settings = plan.settings,
                     .output = task.output,
                     .output_identity = IdentityOf(plan.OutputOf(task)),
                     .seconds = 1.5,
                     .outcome = {{"most_zoom", 1.25}},
                     .warnings = {"a line with \xff"}};
  SaveRecord(plan, whole);
  const std::optional<Record> read = DoneRecord(plan, task);
  ASSERT_TRUE(read);
  EXPECT_EQ(read->warnings, whole.warnings);
  EXPECT_EQ(read->outcome, whole.outcome);
  EXPECT_EQ(read->seconds, 1.5);
  const std::function<void(Record&)> changes[] = {
      [](Record& r) { r.state = Record::State::begun; },
      [](Record& r) { r.state = Record::State::failed; },
      [](Record& r) { ++r.source_identity.modified; },
      [](Record& r) { ++r.source_identity.size; },
      [](Record& r) { r.source += "x"; },
      [](Record& r) { r.settings.push_back("--as-set"); },
      [](Record& r) { ++r.output_identity->modified; },
      [](Record& r) { r.output_identity.reset(); }};
  for (const auto& change : changes) {
    Record changed = whole;
    change(changed);
    SaveRecord(plan, changed);
    EXPECT_FALSE(DoneRecord(plan, task)) << &change - changes;
  }
  // Cut anywhere it is none, and harmless.
  const std::string text = TextOf(whole), path = plan.FolderOf(task).record();
  for (std::size_t size = 0; size + 2 < text.size(); ++size) {
    ASSERT_TRUE(WriteWhole(path, text.substr(0, size)));
    ASSERT_FALSE(ReadRecord(path)) << size;
  }
  std::string lost = text;
  lost.replace(lost.find("done"), 4, "lost");
  ASSERT_TRUE(WriteWhole(path, lost));
  EXPECT_FALSE(ReadRecord(path)) << "of a state that there is not";
  for (const std::size_t depth : {98, 99, 100000}) {  // in two objects
    std::string nested = text;
    nested.replace(nested.find("1.25"), 4, std::string(depth, '[') + std::string(depth, ']'));
    ASSERT_TRUE(WriteWhole(path, nested));
    EXPECT_EQ(ReadRecord(path).has_value(), depth < 99) << depth;
  }
  for (const int members : {1000, 1001, 200000}) {
    std::string many = "{";
    for (int m = 0; m < members; ++m) many += '"' + std::to_string(m) + "\":0,";
    many.back() = '}';
    ASSERT_TRUE(WriteWhole(path, many + "\n"));
    EXPECT_EQ(ReadObject(path).has_value(), members < 1001) << members;
  }
  for (const std::size_t more : {std::size_t{0}, std::size_t{1}}) {
    ASSERT_TRUE(WriteWhole(path, text + std::string((16 << 20) - text.size() + more, ' ')));
    EXPECT_EQ(ReadRecord(path).has_value(), more == 0);
  }
  SaveRecord(plan, whole);
  std::filesystem::remove(plan.OutputOf(task));
  EXPECT_FALSE(DoneRecord(plan, task));
}

TEST_F(BatchPlanTest, ALockGoesWithTheLastProcessThatHasIt) {
  {
    const FileLock first(In("lock")), second(In("lock"));
    EXPECT_TRUE(first.is_held());
    EXPECT_FALSE(second.is_held());
  }
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  const pid_t holder = fork();
  if (holder == 0) {
    const FileLock lock(In("lock"));
    const bool told = write(ready[1], lock.is_held() ? "y" : "n", 1) == 1;
    for (;;) pause();
    _exit(told);
  }
  char held = 0;
  ASSERT_EQ(read(ready[0], &held, 1), 1);
  EXPECT_EQ(held, 'y');
  EXPECT_FALSE(FileLock(In("lock")).is_held());
  kill(holder, SIGKILL);
  waitpid(holder, nullptr, 0);
  EXPECT_TRUE(FileLock(In("lock")).is_held());
  EXPECT_THROW(FileLock(In("no folder/lock")), std::system_error);
}

TEST_F(BatchPlanTest, APlanIsReadAsItWasWritten) {
  Make("x.mp4");
  Plan plan = PlanOfClips({{In("x.mp4")}, {In("\xff\n.mp4")}});
  plan.reports = true;
  plan.tasks[1].memory = std::int64_t{1} << 40;
  const Plan read = PlanOf(TextOf(plan));
  ASSERT_EQ(read.tasks.size(), 2u);
  EXPECT_EQ(read.tasks[1].source, plan.tasks[1].source);
  EXPECT_EQ(read.tasks[1].output, plan.tasks[1].output);
  EXPECT_EQ(read.tasks[1].memory, plan.tasks[1].memory);
  std::string text = TextOf(plan);
  const std::string number = std::to_string(plan.tasks[1].memory);
  text.replace(text.find(number), number.size(), "1e300");
  EXPECT_THROW(PlanOf(text), nlohmann::json::exception);
  EXPECT_EQ(TextOf(read), TextOf(plan));
  EXPECT_THROW(PlanOf("{}"), nlohmann::json::exception);
}

TEST(BatchGroupsTest, ShortClipsShareAJobAndNoArrayIsTooLong) {
  Plan plan{.folder = "/no folder"};
  for (const double cost : {3e8, 5e9, 2e8, 0.0, 6e8, 1e8}) {
    Task task;
    task.cost = cost;
    if (cost == 0) task.refused = "no clip";
    plan.tasks.push_back(task);
  }
  using Groups = std::vector<std::vector<std::size_t>>;
  std::vector<bool> none(6), first(6);
  first[0] = true;
  EXPECT_EQ(GroupsOf(plan, 0, none), (Groups{{1}, {4, 0, 2}, {5}}));
  EXPECT_EQ(GroupsOf(plan, 2, none), (Groups{{1, 4}, {0, 2}, {5}}));
  EXPECT_EQ(GroupsOf(plan, 1, first), (Groups{{1}, {4}, {2}, {5}}));
  plan.tasks.assign(25000, plan.tasks[1]);
  for (const int clips_a_job : {0, 1}) {
    std::size_t tasks = 0;
    const Groups groups = GroupsOf(plan, clips_a_job, std::vector<bool>(25000));
    for (const auto& group : groups) tasks += group.size();
    EXPECT_LE(groups.size(), 1000u);
    EXPECT_EQ(tasks, 25000u);
  }
}

TEST(BatchMachineTest, JobsGoByProcessorsAndMemoryUnlessTheyAreSet) {
  const Machine machine = ThisMachine();
  EXPECT_GE(machine.processors, 1);
  EXPECT_GT(machine.memory, std::int64_t{16} << 20);
  EXPECT_EQ(SettingsFor(8, 1000, 0).jobs, 8);
  EXPECT_EQ(SettingsFor(8, 1000, 0).memory, 800);
  EXPECT_EQ(SettingsFor(8, 1000, 3).jobs, 3);
  EXPECT_EQ(SettingsFor(8, 1000, 3).memory, 0);
}

TEST(BatchMachineTest, WhatARunKeepsGoesByItsFramesAndItsPartOfTheMachine) {
  constexpr std::int64_t kMiB = 1 << 20;
  constexpr double k720p = 1280 * 720, k1080p = 1920 * 1080, k2160p = 4 * k1080p;
  const struct {
    std::int64_t memory;
    int threads;
    double pixels;
    bool deep;
    std::int64_t least, most;  // MiB
  } cases[] = {
      {1 << 14, 0, k720p, false, 262, 263},  {1 << 14, 9, k720p, false, 262, 263},
      {1 << 14, 1, k720p, false, 65, 66},    {1 << 14, 0, k720p, true, 174, 175},
      {1 << 14, 0, k1080p, false, 152, 153}, {1 << 14, 0, k1080p, true, 0, 0},
      {1 << 14, 0, k2160p, false, 0, 0},     {400, 0, k720p, false, 100, 100},
      {400, 1, k720p, false, 25, 25},        {0, 0, k720p, false, 0, 0},
  };
  for (const auto& given : cases) {
    const Machine machine{.processors = 4, .memory = given.memory * kMiB};
    const std::int64_t kept = BytesToKeep(machine, given.threads, given.pixels, given.deep);
    SCOPED_TRACE(testing::Message() << given.memory << " " << given.threads << " " << kept);
    EXPECT_GE(kept, given.least * kMiB);
    EXPECT_LE(kept, given.most * kMiB);
  }
}

}  // namespace
}  // namespace calmframe::batch
