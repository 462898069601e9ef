#include <malloc.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <future>

#include "daemon/DeviceSleep.h"
#include "daemon/PlatformChoice.h"
#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"
#include "platform/threads/RunLoop.h"

namespace {

namespace logs = qv::platform::logs;

/// Bytes. Blocks of this size and above are pages of their own, which go back to the system when they are freed.
constexpr int kOwnPagesFrom = 128 * 1024;
constexpr auto kShutDownPatience = std::chrono::seconds(5);

/// Gives the running recordings' movies time to be completed; what is not can still be played.
void completeRecordings(qv::QVRecordingManager& manager) {
  const auto done = std::make_shared<std::promise<void>>();
  auto completed = done->get_future();
  manager.shutDown([done] { done->set_value(); });
  if (completed.wait_for(kShutDownPatience) != std::future_status::ready) {
    QV_LOG_ERROR(logs::kDaemon, "recordings were not completed in time");
  }
}

}  // namespace

int main(int count, char** arguments) {
  if (count == 2 && std::strcmp(arguments[1], "--version") == 0) {
    return std::puts("quorveld " QV_VERSION) < 0 ? EXIT_FAILURE : EXIT_SUCCESS;
  }
  // Before any thread is made, so that all inherit it.
  qv::platform::blockTerminationSignals();
  // The allocator would raise this bound with the first picture that an encoder frees, and keep the heap of a
  // recording.
  ::mallopt(M_MMAP_THRESHOLD, kOwnPagesFrom);
  // Nobody else writes here. What others are not to read (movies, the photo library, metrics) is made so where it is
  // made.
  ::umask(022);
  QV_LOG(logs::kDaemon, "quorveld Starting!");
  qv::PlatformChoice choice;
  qv::QVCaptureManager captureManager(choice.platform());
  const auto manager = qv::QVRecordingManager::create(choice.platform(), captureManager);
  choice.suspendMonitor().setHandlers(qv::handlersOfDeviceSleep(manager));
  if (auto monitor = choice.layoutMonitor()) manager->setLayoutMonitor(std::move(monitor));
  if (const auto error = manager->finishStartup()) {
    QV_LOG_ERROR(logs::kDaemon, "the service cannot be opened: %s", error->description().c_str());
    qv::platform::flushLog();
    std::_Exit(EXIT_FAILURE);
  }
  const int signal = qv::platform::runMainRunLoop();
  QV_LOG(logs::kDaemon, "ending by signal %d", signal);
  completeRecordings(*manager);
  qv::platform::flushLog();
  // The services' threads run to the very end; nothing is taken down under them.
  std::_Exit(EXIT_SUCCESS);
}
