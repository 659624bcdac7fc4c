#include "app/job_runner.h"

namespace tarnwell::app {

JobRunner::~JobRunner() {
  Stop();
  Wait();
}

bool JobRunner::Start(std::function<void()> job, ProgressSink& progress) {
  std::lock_guard<std::mutex> lock(start_mutex_);
  if (busy_.load()) {
    progress.Message(kThreadAlreadyRunning);
    return false;
  }
  if (worker_.joinable()) worker_.join();
  busy_.store(true);
  running_.store(true);
  worker_ = std::thread([this, job = std::move(job)] {
    job();
    running_.store(false);
    busy_.store(false);
  });
  return true;
}

void JobRunner::Wait() {
  std::lock_guard<std::mutex> lock(start_mutex_);
  if (worker_.joinable()) worker_.join();
}

}  // namespace tarnwell::app
