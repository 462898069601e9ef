#include "platform/x11/X11UserAlert.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <mutex>
#include <optional>
#include <thread>

#include "platform/threads/Log.h"
#include "platform/x11/AlertFocus.h"
#include "platform/x11/AlertProcess.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kAlertReplyLimit{2000};

/// What an alert shares with its thread, which outlives it when it is destroyed from within its
/// handler, or while its handler runs.
struct AlertRun {
  FileDescriptor dismissal{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
  std::function<void(UserAlertAnswer)> handler;
  std::mutex mutex;
  bool isDismissed = false;  // guarded by mutex
  bool isAnswered = false;   // guarded by mutex; the handler runs, or has run
};

/// The user's answer; nothing when the alert was dismissed.
std::optional<UserAlertAnswer> waitForAnswer(const AlertRun& run, AlertProcess& process, AlertFocus& focus) {
  bool hasOutput = true;
  while (true) {
    pollfd descriptors[] = {{run.dismissal.get(), POLLIN, 0},
                            {process.endFd(), POLLIN, 0},
                            {hasOutput ? process.outputFd() : -1, POLLIN, 0},
                            {focus.fd(), POLLIN, 0}};
    ::poll(descriptors, std::size(descriptors), -1);
    if (descriptors[0].revents != 0) return std::nullopt;
    if (descriptors[3].revents != 0) focus.handleEvents(process.pid());
    if (descriptors[2].revents != 0) hasOutput = process.readOutput();
    if (descriptors[1].revents != 0) {
      if (hasOutput) process.readOutput();
      return process.answer();
    }
  }
}

void runAlert(AlertRun& run, std::optional<AlertProcess> process, std::unique_ptr<AlertFocus> focus) {
  const ScopedSigpipeBlock noSigpipe;
  const auto answer = waitForAnswer(run, *process, *focus);
  process.reset();
  focus.reset();
  {
    std::lock_guard lock(run.mutex);
    if (!answer || run.isDismissed) return;
    run.isAnswered = true;
  }
  run.handler(*answer);
}

class X11UserAlert final : public UserAlert {
 public:
  X11UserAlert(std::shared_ptr<AlertRun> run, std::thread thread) : run_(std::move(run)), thread_(std::move(thread)) {}
  ~X11UserAlert() override {
    bool isAnswered;
    {
      std::lock_guard lock(run_->mutex);
      run_->isDismissed = true;
      isAnswered = run_->isAnswered;
    }
    ::eventfd_write(run_->dismissal.get(), 1);
    // Until it is answered the thread ends at once, and its program with it.
    if (isAnswered)
      thread_.detach();
    else
      thread_.join();
  }

 private:
  const std::shared_ptr<AlertRun> run_;
  std::thread thread_;
};

}  // namespace

std::unique_ptr<UserAlert> X11UserAlertService::present(const UserAlertRequest& request,
                                                        std::function<void(UserAlertAnswer)> handler) {
  auto connection = XcbConnection::open(display_, kAlertReplyLimit);
  if (!connection) {
    QV_LOG_ERROR(logs::kUI, "no alert: %s", connection.error().description().c_str());
    return nullptr;
  }
  auto focus = std::make_unique<AlertFocus>(std::move(connection.value()));
  auto process = AlertProcess::start(request, display_);
  if (!process) {
    QV_LOG_ERROR(logs::kUI, "no alert: %s", process.error().description().c_str());
    return nullptr;
  }
  auto run = std::make_shared<AlertRun>();
  run->handler = std::move(handler);
  std::thread thread([run, process = std::move(process.value()), focus = std::move(focus)]() mutable {
    runAlert(*run, std::move(process), std::move(focus));
  });
  return std::make_unique<X11UserAlert>(std::move(run), std::move(thread));
}

}  // namespace qv::platform
