#include "host/batch/run_task.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <thread>

#include "host/batch/local_batch.h"
#include "tests/support/scratch_folder.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;
using State = TaskResult::State;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

class Silent final : public TaskWatcher {
 public:
  void Show(double share, const std::string&) override { last = share; }
  bool Stops() override { return stops; }
  std::atomic<bool> stops = false;
  double last = 0;
};

// The program is a script, which is called as the program is: COMMAND IN OUT --project=P ...
class RunTaskTest : public ::testing::Test, protected ScratchFolder {
 protected:
  RunTaskTest() {
    fs::create_directory(In("out"));
    plan.folder = In("out");
    plan.program = In("program");
    Does("");
  }
  // What it does before it writes OUT as IN with a line more.
  void Does(const std::string& what) const {
    MakeFile("program", "#!/bin/sh\n[ $1 = stabilize ] || exit 0\necho \"$2\" >>'" + In("log") +
                            "'\n" + what + "\n{ cat \"$2\"; echo steady; } >\"$3\"\n");
    fs::permissions(In("program"), fs::perms::owner_all);
  }
  const Task& Clip(const std::string& name, double cost = 1) {
    MakeFile(name, name + "\n");
    AddTasks({{In(name)}}, "{stem}-s{ext}", plan);
    plan.tasks.back().cost = cost;
    return plan.tasks.back();
  }
  TaskResult Run(const Task& task) const {
    Silent watcher;
    return RunTask(plan, task, 1, watcher);
  }
  void ExpectFailed(const TaskResult& result, int code, const std::string& part) const {
    EXPECT_EQ(result.state, State::failed);
    EXPECT_EQ(result.record.exit_code, code);
    EXPECT_THAT(result.record.error, HasSubstr(part));
    EXPECT_EQ(result.record.error.find('\n'), std::string::npos);
  }
  // What there is, but for what the batch knows.
  std::set<std::string> Outputs() const {
    std::set<std::string> names;
    for (const auto& entry : fs::directory_iterator(In("out"))) {
      if (entry.path().filename() != kRecordsFolder) names.insert(entry.path().filename());
    }
    return names;
  }

  Plan plan;
};

TEST_F(RunTaskTest, AClipIsDoneOnceAndAgainWhenItChanges) {
  const Task task = Clip("x.mp4");
  Does(R"(echo '{"stage":"rendering","share":0.5}'
echo no json; echo '[1]'; echo '{"stage":7}'
echo "{\"warning\":\"$2: dark\"}" >&2; echo "{\"warning\":\"$2: dark\"}" >&2
for n in $(seq 300); do printf '{"warning":"%03d%05000d"}\n' $n 0; done
echo '{"width_kept":0.9,"most_zoom":1.1}')");
  Silent watcher;
  const TaskResult first = RunTask(plan, task, 1, watcher);
  EXPECT_EQ(first.state, State::done) << first.record.error;
  EXPECT_EQ(watcher.last, 0.75);
  ASSERT_EQ(first.record.warnings.size(), 200u);
  EXPECT_EQ(first.record.warnings[0], task.clip + ": dark");
  EXPECT_EQ(first.record.warnings[199], "199" + std::string(3997, '0'));
  EXPECT_EQ(first.record.outcome.value("most_zoom", 0.0), 1.1);
  EXPECT_EQ(Content("out/x-s.mp4"), "x.mp4\nsteady\n");
  EXPECT_THAT(Outputs(), ElementsAre("x-s.mp4"));

  EXPECT_EQ(Run(task).state, State::unchanged);
  MakeFile("x.mp4", "other\n");
  EXPECT_EQ(Run(task).state, State::done);
  EXPECT_EQ(Content("out/x-s.mp4"), "other\nsteady\n");
  plan.settings = {"--crf=30"};
  EXPECT_EQ(Run(task).state, State::done);
  fs::remove(In("out/x-s.mp4"));
  EXPECT_EQ(Run(task).state, State::done);
  EXPECT_EQ(Content("log"),
            In("x.mp4") + "\n" + In("x.mp4") + "\n" + In("x.mp4") + "\n" + In("x.mp4") + "\n");
}

TEST_F(RunTaskTest, WhatIsNotTheBatchsStays) {
  const Task task = Clip("x.mp4");
  MakeFile("out/x-s.mp4", "mine");
  ExpectFailed(Run(task), kOutputCode, "x-s.mp4: exists already (--overwrite replaces it)");
  EXPECT_EQ(Content("out/x-s.mp4"), "mine");
  plan.overwrites = true;
  EXPECT_EQ(Run(task).state, State::done);
  plan.overwrites = false;
  // Its own, changed by somebody.
  MakeFile("out/x-s.mp4", "cut by hand");
  ExpectFailed(Run(task), kOutputCode, "exists already");
  fs::remove(In("out/x-s.mp4"));
  // One that comes up meanwhile.
  Does("echo mine >'" + In("out/x-s.mp4") + "'");
  ExpectFailed(Run(task), kOutputCode, "exists already");
  EXPECT_EQ(Content("out/x-s.mp4"), "mine\n");
  fs::remove(In("out/x-s.mp4"));
  fs::create_directory(In("out/x-s.mp4"));
  ExpectFailed(Run(task), kOutputCode, "is not a file on disk");
  // A record that whoever else may write there has made to hold it up.
  fs::remove(In("out/x-s.mp4"));
  fs::remove(plan.FolderOf(task).record());
  ASSERT_EQ(mkfifo(plan.FolderOf(task).record().c_str(), 0600), 0);
  Does("");
  EXPECT_EQ(Run(task).state, State::done);
}

TEST_F(RunTaskTest, ProgramsInheritNoFileThatIsOpen) {
  const Task task = Clip("x.mp4");
  const int open_here = open(In("x.mp4").c_str(), O_RDONLY);  // and would stay open
  Does("ls -l /proc/$$/fd >'" + In("open") + "'");
  EXPECT_EQ(Run(task).state, State::done);
  close(open_here);
  EXPECT_THAT(Content("open"), HasSubstr("/lock"));
  EXPECT_THAT(Content("open"), Not(HasSubstr("x.mp4")));
}

TEST_F(RunTaskTest, FailuresAreOneLineAndLeaveNoOutput) {
  const Task task = Clip("line\nbreak.mp4");
  const struct {
    std::string does;
    int code;
    std::string says;
  } cases[] = {
      {"echo \"{\\\"error\\\":\\\"bad\\\",\\\"exit_code\\\":3}\"; exit 3", 3, "bad"},
      {"kill -9 $$", 137, "signal 9 (Killed), as it is where memory runs out"},
      {"kill -SEGV $$", 139, "signal 11 (Segmentation fault)"},
      {"exit 9", 9, "ended with exit code 9"},
      {"echo more >>\"$2\"", kInputCode, "changed while it was worked"},
      {"rm \"$2\"; exit 3", 3, "ended with exit code 3"},
      {"exit 0", kOutputCode, "can't be written: No such file"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.does);
    MakeFile("line\nbreak.mp4", "x");
    Does(c.does);
    ExpectFailed(Run(task), c.code, c.says);
    EXPECT_THAT(Outputs(), ::testing::IsEmpty());
    EXPECT_EQ(ReadRecord(plan.FolderOf(task).record())->exit_code, c.code);
  }
  fs::remove(In("line\nbreak.mp4"));
  ExpectFailed(Run(task), kInputCode, "is gone");
  MakeFile("line\nbreak.mp4", "x");
  plan.program = In("no program");
  ExpectFailed(Run(task), 127, "exit code 127");
  // The folder is gone, and something else has its name.
  fs::remove_all(In("out"));
  MakeFile("out", "");
  ExpectFailed(Run(task), kOutputCode, "Not a directory");
}

TEST_F(RunTaskTest, StoppedItAsksTheProgramToEndAndGoesOnAnotherTime) {
  const Task task = Clip("x.mp4");
  Does("trap 'echo asked >>\"" + In("log") + "\"; exit 130' TERM; while :; do sleep 0.01; done");
  Silent watcher;
  watcher.stops = true;
  EXPECT_EQ(RunTask(plan, task, 1, watcher).state, State::stopped);
  EXPECT_THAT(Outputs(), ::testing::IsEmpty());
  EXPECT_EQ(ReadRecord(plan.FolderOf(task).record())->state, Record::State::begun);
  Does("");
  EXPECT_EQ(Run(task).state, State::done);
}

TEST_F(RunTaskTest, SavedWorkOfOtherSettingsIsNotTakenUp) {
  const Task task = Clip("x.mp4");
  const std::string project = "out/x-s.mp4.calm";
  const auto runs_with = [&](std::vector<std::string> settings) {
    MakeFile(project, "earlier");
    Does("cp '" + In(project) + "' '" + In("seen") + "' 2>'" + In("none") + "' || : >'" +
         In("seen") + "'");
    plan.settings = std::move(settings);
    EXPECT_EQ(Run(task).state, State::done);
    return Content("seen");
  };
  EXPECT_EQ(runs_with({"--smoothness=80"}), "earlier");  // nobody knows what it was made with
  EXPECT_EQ(runs_with({"--crf=20", "--smoothness=20"}), "earlier");
  EXPECT_EQ(runs_with({"--crf=20"}), "");
  EXPECT_EQ(runs_with({"--param=Rank=3", "--param=Size=1"}), "");
  EXPECT_EQ(runs_with({"--param=Rank=4", "--param=Size=1"}), "earlier");
  EXPECT_EQ(runs_with({"--param=Size=1"}), "");
}

// Both batches, each on two threads, work on all clips of one folder at once.
TEST_F(RunTaskTest, TwoBatchesDoEachClipOnce) {
  class Count final : public BatchWatcher {
   public:
    void Show(const std::vector<double>&, std::size_t) override {}
    void Ended(std::size_t, const TaskResult& result) override { ++states[result.state]; }
    bool Stops() override { return false; }
    std::map<State, int> states;
  };
  for (int n = 0; n < 8; ++n) Clip(std::to_string(n) + ".mp4");
  Does("sleep 0.1");
  Count counts[2];
  {
    std::vector<std::jthread> batches;
    for (Count& count : counts) {
      batches.emplace_back([&] { RunLocally(plan, SettingsFor(2, 0, 2), count); });
    }
  }
  EXPECT_EQ(counts[0].states[State::done] + counts[1].states[State::done], 8);
  EXPECT_EQ(counts[0].states[State::unchanged] + counts[1].states[State::unchanged], 8);
  const std::string log = Content("log");
  EXPECT_EQ(std::count(log.begin(), log.end(), '\n'), 8);
}

TEST_F(RunTaskTest, LongClipsComeFirstAndThoseThatFitIntoTheMemory) {
  class Order final : public BatchWatcher {
   public:
    void Show(const std::vector<double>&, std::size_t working) override {
      most = std::max(most, working);
    }
    void Ended(std::size_t task, const TaskResult&) override { tasks.push_back(task); }
    bool Stops() override { return false; }
    std::vector<std::size_t> tasks;
    std::size_t most = 0;
  };
  for (const double cost : {1, 4, 2, 3}) Clip(std::to_string(cost) + ".mp4", cost);
  for (Task& task : plan.tasks) task.memory = 60;
  Order order;
  RunLocally(plan, {.jobs = 4, .processors = 4, .memory = 100}, order);
  EXPECT_THAT(order.tasks, ElementsAre(1, 3, 2, 0));
  EXPECT_LE(order.most, 1u);
}

}  // namespace
}  // namespace calmframe::batch
