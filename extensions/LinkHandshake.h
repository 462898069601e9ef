#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>

#include "extensions/AnswerDeadline.h"
#include "platform/base/Error.h"

namespace qv {

/// Whoever waits for a link to become ready. He is told that it is, each time that the extension says so; or, once and
/// instead, why it will not be: at the latest after `kExtensionPatience`, or when this is destroyed.
///
/// Threading: thread-safe. The handler runs within the call that tells, or on the global queue when it is late.
class LinkHandshake : public std::enable_shared_from_this<LinkHandshake> {
 public:
  using Handler = std::function<void(const std::optional<platform::Error>&)>;

  static std::shared_ptr<LinkHandshake> start(const platform::Platform& platform, Handler handler);
  explicit LinkHandshake(Handler handler) : handler_(std::move(handler)) {}
  ~LinkHandshake();
  LinkHandshake(const LinkHandshake&) = delete;
  LinkHandshake& operator=(const LinkHandshake&) = delete;

  void succeed();
  /// Tells the waiter, unless he knows already that the link is, or will not be, ready.
  void fail(const platform::Error& error);
  [[nodiscard]] bool isReady() const { return stage_ == Stage::Ready; }

 private:
  enum class Stage { Waiting, Ready, Failed };

  const Handler handler_;
  std::atomic<Stage> stage_{Stage::Waiting};
  std::shared_ptr<AnswerDeadline> deadline_;
};

}  // namespace qv
