#pragma once

#include <functional>
#include <memory>

#include "platform/IPC.h"
#include "protocol/SampleCoding.h"
#include "sdk/common/SoundTimeline.h"
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
  /// Takes the broadcast of a connection that was not resumed yet. What the author's object says while it is being made
  /// is sent first, when the connection stands. `ended` is called on `queue`, once, when the
  /// connection has ended and the author's object is gone. To be called on `queue`.
  static std::shared_ptr<SampleLink> open(std::shared_ptr<platform::IPCConnection> connection,
                                          const quorvel::SampleExtensionFactory& make, platform::SerialQueue& queue,
                                          std::function<void()> ended);
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
  explicit SampleLink(std::shared_ptr<platform::IPCConnection> connection) : connection_(std::move(connection)) {}
  void processPayload(const platform::Dictionary& payload);
  void performAction(const ActionMessage& message);
  void processVideo(const PictureMessage& message);
  void processAudio(SoundMessage message);
  void send(OutgoingCall call);
  void end();

  const std::shared_ptr<platform::IPCConnection> connection_;
  std::function<void()> ended_;
  sdk::SoundTimeline timeline_;
  std::unique_ptr<quorvel::SampleExtension> extension_;  // none once the link has ended
};

}  // namespace qv::extension
