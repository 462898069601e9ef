#include "sdk/extension/SampleLink.h"

#include <utility>

#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"
#include "sdk/common/SampleCoding.h"
#include "sdk/common/ValueCoding.h"

namespace quorvel {

Broadcast::~Broadcast() = default;
SampleExtension::~SampleExtension() = default;

}  // namespace quorvel

namespace qv::extension {

using platform::Dictionary;
using platform::find;
using platform::Value;
using platform::valueForKey;

/// The end that the daemon calls. It does not keep the link alive.
class SampleLink::Payloads final : public platform::IPCExportedObject {
 public:
  explicit Payloads(std::weak_ptr<SampleLink> link) : link_(std::move(link)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>&, const platform::IPCOperation&,
                  platform::IPCArguments arguments, platform::IPCReply reply) override {
    const auto link = link_.lock();
    if (!link || arguments.empty()) return;
    link->processPayload(arguments[0].asDictionary());
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

void SampleLink::processPayload(const Dictionary& payload) {
  if (!extension_) return;
  bool isUnderstood = true;
  if (const Value* action = find(payload, broadcastpayload::kActionType)) {
    performAction(action->asInteger(), payload);
  } else if (const Value* frontmost = find(payload, broadcastpayload::kFrontmostApp)) {
    extension_->frontmostApplication(frontmost->asString());
  } else if (valueForKey(payload, broadcastpayload::kSampleType).asInteger() == sdk::kVideoSample) {
    isUnderstood = processVideo(payload);
  } else {
    isUnderstood = processAudio(payload);
  }
  if (!isUnderstood) QV_LOG_ERROR(platform::logs::kExtensions, "a payload that is none was dropped");
}

void SampleLink::performAction(int64_t action, const Dictionary& payload) {
  switch (static_cast<BroadcastAction>(action)) {
    case BroadcastAction::Started:
      return extension_->started(sdk::fromWire(valueForKey(payload, broadcastpayload::kUserInfo).asDictionary()));
    case BroadcastAction::Paused:
      return extension_->paused();
    case BroadcastAction::Resumed:
      return extension_->resumed();
    case BroadcastAction::Finished:
      return extension_->finished();
  }
  QV_LOG_ERROR(platform::logs::kExtensions, "action %lld is unknown", static_cast<long long>(action));
}

bool SampleLink::processVideo(const Dictionary& payload) {
  auto frame = sdk::videoFrameFromWire(valueForKey(payload, broadcastpayload::kSharedFrame),
                                       valueForKey(payload, broadcastpayload::kTimingInfo).asData());
  if (!frame) return false;
  const int64_t code = valueForKey(payload, broadcastpayload::kVideoOrientation).asInteger(1);
  const bool isKnown = code >= 1 && code <= 8;
  extension_->processVideo(std::move(*frame), isKnown ? quorvel::Orientation(code) : quorvel::Orientation::Up);
  return true;
}

bool SampleLink::processAudio(const Dictionary& payload) {
  const Value bytes = valueForKey(payload, broadcastpayload::kAudioBufferList);
  const Value format = valueForKey(payload, broadcastpayload::kAudioFormatDescription);
  const Value timing = valueForKey(payload, broadcastpayload::kTimingInfo);
  const Value* sum = find(payload, broadcastpayload::kPauses);
  const auto pauses = sum ? sdk::sampleTimeFromWire(sum->asData()) : quorvel::SampleTime(0);
  auto sample =
      sdk::audioSampleFromWire({.bytes = bytes.asData(),
                                .format = format.asData(),
                                .numSamples = valueForKey(payload, broadcastpayload::kNumSamples).asInteger(-1),
                                .sampleType = valueForKey(payload, broadcastpayload::kSampleType).asInteger(),
                                .timing = timing.asData()});
  if (!sample || !pauses) return false;
  if (timeline_.place(*sample, *pauses)) extension_->processAudio(std::move(*sample));
  return true;
}

// To the daemon ---------------------------------------------------------------------------------------

void SampleLink::ping() { connection_->call("ping", {}, {}, {}); }

void SampleLink::updateServiceInfo(quorvel::Dictionary serviceInfo) {
  connection_->call("updateServiceInfo", {sdk::toWire(serviceInfo)}, {}, {});
}

void SampleLink::updateBroadcastURL(std::string url) {
  connection_->call("updateBroadcastURL", {platform::URL(std::move(url))}, {}, {});
}

void SampleLink::finishBroadcastWithError(quorvel::Error error) {
  const platform::Error wire{error.domain, error.code, {{platform::kLocalizedDescriptionKey, Value(error.text)}}};
  connection_->call("finishBroadcastWithError", {platform::encodeError(wire)}, {}, {});
}

}  // namespace qv::extension
