// JobRunner: one long job at a time on a worker thread.
//
// The running flag is shared with every loop of the engine and the store: a
// job sets it when it starts, Stop only lowers it, and the worker's end
// sequence clears it. A second job that finds the flag raised is refused
// with "Thread already Running".
#ifndef TARNWELL_APP_JOB_RUNNER_H_
#define TARNWELL_APP_JOB_RUNNER_H_

#include <functional>
#include <mutex>
#include <thread>

#include "base/progress_sink.h"

namespace tarnwell::app {

inline constexpr char kThreadAlreadyRunning[] = "Thread already Running";
inline constexpr char kStopQuestion[] = "Are you sure you want to stop the running Process ?";

class JobRunner {
 public:
  JobRunner() = default;
  ~JobRunner();
  JobRunner(const JobRunner&) = delete;
  JobRunner& operator=(const JobRunner&) = delete;

  // Starts `job` on a worker thread. False (and a "Thread already Running"
  // message to `progress`) when a job is running.
  bool Start(std::function<void()> job, ProgressSink& progress);
  // Asks the running job to stop; it notices at its next check.
  void Stop() { running_.store(false); }
  // Waits for the worker to finish.
  void Wait();
  bool busy() const { return busy_.load(); }
  RunningFlag& running() { return running_; }

 private:
  RunningFlag running_{false};
  std::atomic<bool> busy_{false};
  std::thread worker_;
  std::mutex start_mutex_;
};

}  // namespace tarnwell::app

#endif  // TARNWELL_APP_JOB_RUNNER_H_
