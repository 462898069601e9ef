#pragma once

#include <functional>
#include <memory>

#include "platform/Clock.h"
#include "platform/IPC.h"
#include "sdk/extension/PauseTimeline.h"
#include "sdk/extension/quorvel/BroadcastExtension.h"

namespace qv::extension {

/// One broadcast in sample mode: the connection to the daemon, and the author's object that its payloads go to.
///
/// Every payload is answered when the author's object has taken it, the malformed ones too: the daemon counts on it
/// for how much may be under way.
///
/// Threading: payloads and the author's object on the queue that `open` is given; what the author tells, on any.
class SampleLink final : public quorvel::Broadcast, public std::enable_shared_from_this<SampleLink> {
 public:
  /// Takes the broadcast of a connection that was not resumed yet. `ended` is called on `queue`, once, when the
  /// connection has ended and the author's object is gone. To be called on `queue`.
  static std::shared_ptr<SampleLink> open(std::shared_ptr<platform::IPCConnection> connection,
                                          const quorvel::SampleExtensionFactory& make, platform::SerialQueue& queue,
                                          std::function<void()> ended, platform::Clock& clock);
  ~SampleLink() override;

  /// Tells the daemon that this end is ready.
  void ping();
  /// Ends the broadcast; nothing is called any more. On the queue.
  void close();

  void updateServiceInfo(quorvel::Dictionary serviceInfo) override;
  void updateBroadcastURL(std::string url) override;
  void finishBroadcastWithError(quorvel::Error error) override;

 private:
  class Payloads;
  SampleLink(std::shared_ptr<platform::IPCConnection> connection, platform::Clock& clock);
  void processPayload(const platform::Dictionary& payload);
  void performAction(int64_t action, const platform::Dictionary& payload);
  [[nodiscard]] bool processVideo(const platform::Dictionary& payload);
  [[nodiscard]] bool processAudio(const platform::Dictionary& payload);
  void end();
  [[nodiscard]] quorvel::SampleTime now() const;

  const std::shared_ptr<platform::IPCConnection> connection_;
  platform::Clock& clock_;
  std::function<void()> ended_;
  PauseTimeline timeline_;
  std::unique_ptr<quorvel::SampleExtension> extension_;  // none once the link has ended
};

}  // namespace qv::extension
