#include "platform/linux/LaunchedProcess.h"

#include <signal.h>

#include <utility>

namespace qv::platform {

Result<std::unique_ptr<LaunchedProcess>> LaunchedProcess::start(SpawnRequest request, std::function<void(int)> didEnd) {
  std::unique_ptr<LaunchedProcess> process(new LaunchedProcess());
  std::promise<std::optional<Error>> started;
  auto outcome = started.get_future();
  process->thread_ = std::thread(
      [self = process.get(), request = std::move(request), started = std::move(started),
       didEnd = std::move(didEnd)]() mutable { self->run(std::move(request), std::move(started), didEnd); });
  if (auto failure = outcome.get()) return *failure;
  return process;
}

void LaunchedProcess::run(SpawnRequest request, std::promise<std::optional<Error>> started,
                          const std::function<void(int)>& didEnd) {
  auto process = SpawnedProcess::start(std::move(request));
  if (!process) return started.set_value(process.error());
  process_ = std::move(*process);
  started.set_value(std::nullopt);
  didEnd(process_.waitForEnd());
}

LaunchedProcess::~LaunchedProcess() {
  process_.sendSignal(SIGKILL);
  if (thread_.joinable()) thread_.join();
}

}  // namespace qv::platform
