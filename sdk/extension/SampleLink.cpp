#include "sdk/extension/SampleLink.h"

#include <utility>

#include "platform/base/ValueTypes.h"
#include "platform/threads/Log.h"
#include "sdk/common/Samples.h"
#include "sdk/common/ValueCoding.h"

namespace quorvel {

Broadcast::~Broadcast() = default;
SampleExtension::~SampleExtension() = default;

}  // namespace quorvel

namespace qv::extension {

/// The end that the daemon calls. It does not keep the link alive.
class SampleLink::Payloads final : public platform::IPCExportedObject {
 public:
  explicit Payloads(std::weak_ptr<SampleLink> link) : link_(std::move(link)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>&, const platform::IPCOperation&,
                  platform::IPCArguments arguments, platform::IPCReply reply) override {
    const auto link = link_.lock();
    if (!link) return;
    link->processPayload(callOf<broadcastcall::ProcessPayload>(arguments).payload);
    reply({});
  }

 private:
  const std::weak_ptr<SampleLink> link_;
};

std::shared_ptr<SampleLink> SampleLink::open(std::shared_ptr<platform::IPCConnection> connection,
                                             const quorvel::SampleExtensionFactory& make, platform::SerialQueue& queue,
                                             std::function<void()> ended) {
  queue.assertOnQueue();
  std::shared_ptr<SampleLink> link(new SampleLink(std::move(connection)));
  link->ended_ = std::move(ended);
  const auto& link_connection = link->connection_;
  link_connection->setTargetQueue(queue);
  link_connection->setExportedInterface(broadcastExtensionProtocol(), std::make_shared<Payloads>(link));
  link_connection->setRemoteInterface(broadcastDaemonProtocol());
  link_connection->setInvalidationHandler([weak = std::weak_ptr(link)] {
    if (const auto self = weak.lock()) self->end();
  });
  // It may speak at once: a call before `resume` waits for the connection.
  link->extension_ = make(*link);
  link_connection->resume();
  return link;
}

SampleLink::~SampleLink() = default;

void SampleLink::end() {
  if (!std::exchange(extension_, nullptr)) return;
  if (const auto ended = std::exchange(ended_, nullptr)) ended();
}

void SampleLink::close() {
  ended_ = nullptr;
  connection_->setInvalidationHandler({});
  extension_.reset();
  connection_->invalidate();
}

// From the daemon -------------------------------------------------------------------------------------

void SampleLink::processPayload(const platform::Dictionary& payload) {
  if (!extension_) return;
  std::visit(
      platform::Overloaded{
          [](std::monostate) { QV_LOG_ERROR(platform::logs::kExtensions, "a payload that is none was dropped"); },
          [this](const ActionMessage& message) { performAction(message); },
          [this](FrontmostMessage&& message) { extension_->frontmostApplication(std::move(message.bundleID)); },
          [this](const PictureMessage& message) { processVideo(message); },
          [this](SoundMessage&& message) { processAudio(std::move(message)); },
      },
      broadcastMessageOf(payload));
}

void SampleLink::performAction(const ActionMessage& message) {
  switch (message.action) {
    case BroadcastAction::Started:
      return extension_->started(sdk::fromWire(message.userInfo));
    case BroadcastAction::Paused:
      return extension_->paused();
    case BroadcastAction::Resumed:
      return extension_->resumed();
    case BroadcastAction::Finished:
      return extension_->finished();
  }
  QV_LOG_ERROR(platform::logs::kExtensions, "action %lld is unknown", static_cast<long long>(message.action));
}

void SampleLink::processVideo(const PictureMessage& message) {
  const bool isKnown = message.orientation >= 1 && message.orientation <= 8;
  extension_->processVideo(sdk::videoFrame(message),
                           isKnown ? quorvel::Orientation(message.orientation) : quorvel::Orientation::Up);
}

void SampleLink::processAudio(SoundMessage message) {
  const quorvel::SampleTime pauses = sdk::sampleTime(message.pauses);
  quorvel::AudioSample sample = sdk::audioSample(std::move(message));
  if (timeline_.place(sample, pauses)) extension_->processAudio(std::move(sample));
}

// To the daemon ---------------------------------------------------------------------------------------

void SampleLink::send(OutgoingCall call) { connection_->call(call.member, std::move(call.arguments), {}, {}); }

void SampleLink::ping() { send(broadcastcall::Ping{}); }

void SampleLink::updateServiceInfo(quorvel::Dictionary serviceInfo) {
  send(broadcastcall::UpdateServiceInfo{sdk::toWire(serviceInfo)});
}

void SampleLink::updateBroadcastURL(std::string url) {
  send(broadcastcall::UpdateBroadcastURL{platform::URL(std::move(url))});
}

void SampleLink::finishBroadcastWithError(quorvel::Error error) {
  const platform::Error wire{
      error.domain, error.code, {{platform::kLocalizedDescriptionKey, platform::Value(error.text)}}};
  send(broadcastcall::FinishBroadcastWithError{platform::encodeError(wire)});
}

}  // namespace qv::extension
