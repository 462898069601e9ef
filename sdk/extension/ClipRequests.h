#pragma once

#include <functional>
#include <memory>
#include <vector>

#include "platform/Extensions.h"
#include "platform/base/Result.h"
#include "platform/threads/SerialQueue.h"
#include "sdk/extension/quorvel/BroadcastExtension.h"

namespace qv::extension {

/// Turns the requests of clip mode into clips: fetches the file that a request's token stands for, hands it to the
/// author's object, and completes the request with what that returns. Clips reach the object in the order of their
/// requests, also where a later one's file comes first.
///
/// Threading: one queue, which the author's object is called on; completions from any thread.
class ClipRequests : public std::enable_shared_from_this<ClipRequests> {
 public:
  /// What it asks of the connection to the host. Both on any thread.
  struct Host {
    std::function<void(const std::string& token, std::function<void(platform::SharedFileDescriptor)> opened)> openFile;
    std::function<void(platform::ExtensionRequestID, std::vector<platform::ExtensionItem>)> complete;
  };
  ClipRequests(std::shared_ptr<platform::SerialQueue> queue, Host host, const quorvel::ClipExtensionFactory& make);

  /// Whether these are the items of a clip.
  [[nodiscard]] static bool isClip(const std::vector<platform::ExtensionItem>& items);
  /// On the queue.
  void begin(platform::ExtensionRequestID request, const std::vector<platform::ExtensionItem>& items);
  /// On the queue: the author's object goes, and nothing is completed any more.
  void close();

 private:
  struct Pending;
  void process();
  [[nodiscard]] quorvel::ClipCompletion completionOf(platform::ExtensionRequestID request);

  const std::shared_ptr<platform::SerialQueue> queue_;
  const Host host_;
  std::unique_ptr<quorvel::ClipExtension> extension_;
  std::vector<std::shared_ptr<Pending>> pending_;  // in order
};

}  // namespace qv::extension
