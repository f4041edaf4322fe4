// The queue of jobs: who is next, and that nothing but its process keeps a job's place.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "device/host/sessions.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/user_tasks.h"
#include "device/tasks/workers.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"

namespace {

using Device::QueuedJob;

// A letter for each job, in the order of start: the user, as a capital when the job runs.
std::vector<QueuedJob> Jobs(const std::string& text) {
  std::vector<QueuedJob> jobs;
  for (const char letter : text) {
    const auto ticket = static_cast<std::uint32_t>(jobs.size());
    jobs.insert(jobs.begin(),
                {1, static_cast<uid_t>(std::tolower(letter)), ticket, std::isupper(letter) != 0});
  }
  return jobs;
}

std::string Tickets(const std::vector<QueuedJob>& jobs) {
  std::string text;
  for (const QueuedJob& job : jobs) {
    text += std::to_string(job.ticket);
  }
  return text;
}

TEST(JobQueueTest, NextIsWhoseUserHasTheFewestAtWork) {
  const struct {
    const char *jobs, *order, *next;  // of a user 2 at once, of the device 3
  } rows[] = {
      {"", "", ""},
      {"aaa", "012", "01"},
      {"AAab", "32", "3"},
      {"AAaaB", "23", ""},
      {"AABab", "43", ""},
      {"AaabC", "312", "3"},
      {"aabbcc", "024135", "024"},
      {"AAAab", "43", "4"},  // a job was stopped by a signal meanwhile, or the setting was lowered
  };
  for (const auto& row : rows) {
    std::vector<QueuedJob> order;
    for (const auto& [rank, job] : Device::WaitingInOrder(Jobs(row.jobs))) {
      order.push_back(job);
    }
    EXPECT_EQ(Tickets(order), row.order) << row.jobs;
    EXPECT_EQ(Tickets(Device::NextToRun(Jobs(row.jobs), 2, 3)), row.next) << row.jobs;
  }
}

class QueueTest : public DeviceTest {
 protected:
  // One job of a user at once; each runs until Finish().
  QueueTest() {
    Device::TheDevice().config.jobs_at_once = 1;
    Add("vol1/photo/a.txt", "a");
    ScriptArchiver("");
    std::filesystem::remove(output_);
    mkfifo(output_.c_str(), 0644);
  }

  struct Job {
    std::string id;
    pid_t worker;
  };
  Job Start(const std::string& user = "alice") {
    const std::string dest = "/photo/" + std::to_string(++count_) + ".zip";
    const Device::Request request = MakeRequest("start", JobParams({"/photo/a.txt"}, dest), user);
    const std::string id = launcher_->Call(request).data["taskid"].asString();
    Device::SignOut(request.session_id);  // which ends no job
    return {id, Worker()};
  }

  bool IsAtWork(const Job& job) const {
    return WaitUntil([&] {
      const auto calls = Calls("KLIBCPopenv");
      return std::any_of(calls.begin(), calls.end(),
                         [&](const TracedCall& call) { return call.pid == job.worker; });
    });
  }

  bool IsGone(const Job& job) const {
    return WaitUntil([&] { return Group(job.worker).empty(); });
  }

  // Lets archivers that run come to their end, until the job has.
  bool Finish(const Job& job) const {
    return WaitUntil([&] {
      close(open(output_.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC));
      return Group(job.worker).empty();
    });
  }

  // "STATE BEFORE" of the user's tasks, in the order of start.
  static std::string States(const std::string& user = "alice") {
    std::map<std::string, std::string> states;
    for (const Device::TaskRow& row : Device::AllTasks(user)) {
      const Json::Value view = Device::TaskView(row, Device::WaitingWorkers());
      states[view["dest_file_path"].asString()] =
          view["state"].asString() + view.get("before", "").asString();
    }
    Device::CloseStores();
    std::string text;
    for (const auto& [dest, state] : states) {
      text += state + ' ';
    }
    return text;
  }

  const std::string output_ = temp_.Path() + "/output";
  int count_ = 0;
};

TEST_F(QueueTest, JobsRunInTheOrderOfTheirStartAndAKilledOneLeavesNoPlaceTaken) {
  std::signal(SIGTERM, [](int /*number*/) {});  // as a launcher may have it
  const Job running = Start();
  const Job killed = Start();
  const Job stopped = Start();
  const Job next = Start();
  const Job last = Start();
  ASSERT_TRUE(IsAtWork(running));
  EXPECT_EQ(States(), "running waiting0 waiting1 waiting2 waiting3 ");
  EXPECT_EQ(Ask("status", last.id).data["progress"].asDouble(), 0);

  const Job of_other = Start("bob");
  EXPECT_TRUE(IsAtWork(of_other));

  kill(killed.worker, SIGKILL);
  EXPECT_EQ(Ask("stop", stopped.id).code, 0);
  if (!kIsEmulated) {  // an emulator gives its processes' orphans away
    int status = 0;
    EXPECT_EQ(waitpid(stopped.worker, &status, 0), stopped.worker);
    EXPECT_EQ(WTERMSIG(status), SIGTERM) << "it did not end when it was asked to";
  }
  EXPECT_TRUE(IsGone(killed) && IsGone(stopped));
  EXPECT_EQ(States(), "running failed waiting0 waiting1 ");

  kill(running.worker, SIGKILL);
  EXPECT_TRUE(IsAtWork(next));
  EXPECT_EQ(States(), "failed failed running waiting0 ");
  EXPECT_TRUE(Finish(next));
  EXPECT_TRUE(IsAtWork(last));
  EXPECT_TRUE(Finish(last));
  EXPECT_EQ(States(), "failed failed finished finished ");
  EXPECT_EQ(Calls("KLIBCPopenv").size(), 4U);
}

TEST_F(QueueTest, WhoStopsAWorkerKeepsNobodysJobWaiting) {
  Device::TheDevice().config.jobs_at_once = Device::MostJobs();
  std::vector<Job> stopped;
  while (stopped.size() <= Device::MostJobs()) {  // the last one of them waits
    stopped.push_back(Start("bob"));
  }
  ASSERT_TRUE(WaitUntil([&] { return Group(stopped.front().worker).size() > 1; }));
  // As one has that is stopped in the midst of a change.
  const pid_t holder = fork();
  if (holder == 0) {
    struct flock byte {};
    byte.l_type = F_WRLCK;
    byte.l_len = 1;
    fcntl(Device::TheDevice().queue.Get(), F_SETLKW, &byte);
    raise(SIGSTOP);
  }
  EXPECT_TRUE(WaitUntil([&] { return Device::IsStopped(holder); }));
  for (const pid_t pid : Group(stopped.front().worker)) {
    if (pid != stopped.front().worker) {  // its archiver
      kill(pid, SIGSTOP);
    }
  }
  for (std::size_t job = 1; job < stopped.size(); ++job) {
    kill(stopped[job].worker, SIGSTOP);
  }
  const Job job = Start();
  EXPECT_TRUE(IsAtWork(job));
  for (const Job& each : stopped) {
    kill(-each.worker, SIGKILL);
  }
  kill(holder, SIGKILL);
  waitpid(holder, nullptr, 0);
  EXPECT_TRUE(Finish(job));
}

}  // namespace
