#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "extensions/AnswerDeadline.h"
#include "platform/Extensions.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "support/QVTemporaryMovies.h"

namespace qv {

/// What a broadcast's clips bring back, on threads of the platform's.
struct ClipHandoverEvents {
  std::function<void(const QVBroadcastConfiguration&)> configurationReceived;
  std::function<void(const platform::Dictionary&)> serviceInfoReceived;
  /// The extension's process did not take a clip or died over it.
  std::function<void()> extensionFailed;
};

/// Hands the finished clips of one broadcast to its upload extension, in the order of their numbers, each in a request
/// of its own, and removes each clip's file when its own request has ended. So requests may overlap.
///
/// An extension that lags `kMaximumOutstanding` clips behind misses the next ones. After the request of the last clip,
/// or when that takes too long, the extension's process is ended, and what it still held with it.
///
/// Threading: thread-safe.
class ClipHandover : public std::enable_shared_from_this<ClipHandover> {
 public:
  static constexpr size_t kMaximumOutstanding = 32;
  /// For what is left to be sent after the end of the broadcast.
  static constexpr std::chrono::seconds kLastClipsPatience{120};

  ClipHandover(const platform::Platform& platform, const platform::ExtensionRecordRef& extension,
               platform::Dictionary userInfo, ClipHandoverEvents events);

  /// The clip of this number, from 1, is complete; nothing where it came to no movie. `handed` (may be empty) runs when
  /// it and all before it were handed over.
  void clipCompleted(int64_t number, std::shared_ptr<MovieClaim> clip, bool finished, std::function<void()> handed);

 private:
  struct Completed {
    std::shared_ptr<MovieClaim> clip;
    bool finished = false;
    std::function<void()> handed;
  };
  using ClipFile = std::shared_ptr<MovieClaim>;
  [[nodiscard]] std::optional<Completed> takeNext();
  void _notifyBroadcastExtensionOfCompletedMovieWithURL(const ClipFile& clip, bool finished);
  [[nodiscard]] std::vector<platform::ExtensionItem> itemsForClip(const platform::URL& clip, const std::string& token,
                                                                  bool finished) const;
  void requestBegan(const ClipFile& clip, const std::optional<platform::Error>& error);
  void requestCompleted(const ClipFile& clip, const platform::Result<std::vector<platform::ExtensionItem>>& items);
  void requestEnded(const ClipFile& clip);
  void loadReturnedItem(const platform::ExtensionItem& item);
  void awaitLastRequests();

  const platform::Platform& platform_;
  const platform::Dictionary userInfo_;
  const ClipHandoverEvents events_;

  std::mutex mutex_;
  std::map<int64_t, Completed> completed_;
  int64_t next_ = 1;
  size_t outstanding_ = 0;
  bool isFinished_ = false;
  std::shared_ptr<AnswerDeadline> lastRequests_;
  /// Its end ends the extension's process.
  std::shared_ptr<platform::ExtensionUse> use_;
};

}  // namespace qv
