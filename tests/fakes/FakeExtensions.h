#pragma once

#include <algorithm>
#include <cerrno>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/Extensions.h"
#include "protocol/QVBroadcastProtocols.h"
#include "tests/fakes/FakeIPC.h"

namespace qv::fakes {

/// Installed extensions and the requests that they got; the test is the extension. `killed` has the extension of each
/// use that ended.
///
/// Threading: for a test in one thread.
class FakeExtensionService final : public platform::ExtensionService {
 public:
  struct Request {
    platform::ExtensionRecordRef extension;
    std::vector<platform::ExtensionItem> items;
    platform::ExtensionRequestHandlers handlers;
    bool isOpen = true;
    [[nodiscard]] platform::Value value(const std::string& title) const {
      for (const auto& item : items) {
        if (item.attributedTitle == title) return item.attachments.at(0).value;
      }
      return {};
    }
  };

  explicit FakeExtensionService(platform::Executor& executor) : executor_(executor) {}

  void extensionsMatchingAttributes(
      const platform::Dictionary& attributes,
      std::function<void(const std::vector<platform::ExtensionRecordRef>&, const std::optional<platform::Error>&)>
          completion) override {
    const std::string point = platform::valueForKey(attributes, platform::extensioninfo::kPointIdentifier).asString();
    std::vector<platform::ExtensionRecordRef> found;
    for (const auto& extension : installed) {
      if (extension->extensionPointIdentifier == point) found.push_back(extension);
    }
    executor_.post([completion = std::move(completion), found, error = queryError] { completion(found, error); });
  }
  void setHostContextClass(const std::string&,
                           std::function<std::shared_ptr<platform::ExtensionHostContext>()>) override {}
  std::shared_ptr<platform::ExtensionUse> useExtension(const platform::ExtensionRecordRef& extension) override {
    return std::make_shared<Use>(*this, extension);
  }
  std::shared_ptr<platform::ExtensionHostContext> contextForRequest(platform::ExtensionRequestID) override {
    return nullptr;
  }
  std::shared_ptr<platform::IPCConnection> auxiliaryConnectionForRequest(platform::ExtensionRequestID) override {
    return vendor;
  }
  /// Ends a request, counted from 0. One that has ended already stays so.
  void complete(size_t index, platform::Result<std::vector<platform::ExtensionItem>> returned) {
    if (!std::exchange(requests.at(index).isOpen, false)) return;
    executor_.post(
        [completed = requests.at(index).handlers.completed, index, returned] { completed(index + 1, returned); });
  }
  platform::ExtensionRecordRef install(const std::string& identifier, const std::string& point,
                                       const std::string& processMode = {}) {
    using platform::Value;
    auto record = std::make_shared<platform::ExtensionRecord>();
    record->identifier = identifier;
    record->extensionPointIdentifier = point;
    const platform::Dictionary section{{broadcastpoint::kProcessMode, Value(processMode)}};
    record->infoDictionary = {{platform::extensioninfo::kSection, Value(section)}};
    installed.push_back(record);
    return record;
  }

  std::vector<platform::ExtensionRecordRef> installed;
  std::vector<Request> requests;
  std::vector<std::string> killed, revoked;
  bool refusesTokens = false;
  std::shared_ptr<platform::IPCConnection> vendor;
  std::optional<platform::Error> queryError, launchError;

 private:
  /// Its end ends its requests, as the death of the process does.
  class Use final : public platform::ExtensionUse {
   public:
    Use(FakeExtensionService& service, platform::ExtensionRecordRef extension)
        : service_(service), extension_(std::move(extension)) {}
    ~Use() override {
      service_.killed.push_back(extension_->identifier);
      for (const size_t index : requests_) service_.complete(index, platform::Error::posix(ECONNRESET, "killed"));
    }
    Use(const Use&) = delete;
    Use& operator=(const Use&) = delete;
    void beginRequest(std::vector<platform::ExtensionItem> items,
                      platform::ExtensionRequestHandlers handlers) override {
      const bool isLaunched = !service_.launchError;
      if (isLaunched) requests_.push_back(service_.requests.size());
      service_.requests.push_back({extension_, std::move(items), std::move(handlers), isLaunched});
      const auto id = service_.requests.size();
      service_.executor_.post(
          [began = service_.requests.back().handlers.began, id, error = service_.launchError] { began(id, error); });
    }
    std::optional<std::string> issueSandboxToken(const std::string& tokenClass, const std::string& path) override {
      return service_.refusesTokens ? std::nullopt : std::optional(tokenClass + " for " + path);
    }
    void revokeSandboxToken(const std::string& token) override { service_.revoked.push_back(token); }

   private:
    FakeExtensionService& service_;
    const platform::ExtensionRecordRef extension_;
    std::vector<size_t> requests_;
  };

  platform::Executor& executor_;
};

/// A broadcast extension's own process, as the daemon sees it: takes the endpoint, connects, answers payloads.
class FakeBroadcastExtension {
 public:
  FakeBroadcastExtension(FakeIPCService& ipc, FakeExtensionService& service, platform::Executor& executor) : ipc_(ipc) {
    auto [daemon, extension] = FakeIPCConnection::makePair(executor, {}, false);
    daemon->setRemoteInterface(extensionVendorProtocol());
    daemon->resume();
    vendorEnd_ = extension;
    vendorEnd_->setExportedInterface(extensionVendorProtocol(), vendor);
    vendorEnd_->resume();
    service.vendor = daemon;
    payloads_->answer = [this](const auto& payload) {
      received.push_back(payload.arguments.at(0).asDictionary());
      answers ? payload.reply({}) : unanswered.push_back(payload.reply);
    };
  }
  /// Connects to the endpoint that it was given; false where nobody waits for it any more. Payloads are answered at
  /// once while `answers`.
  bool connect() {
    const auto call = vendor->takeCall();
    call.reply({});
    auto made = ipc_.connect(platform::ListenerEndpoint(*call.arguments.at(0).getIf<platform::SharedFileDescriptor>()));
    if (made) serve(*made);
    return made.hasValue();
  }
  void serve(std::shared_ptr<platform::IPCConnection> to) {
    connection = std::move(to);
    connection->setRemoteInterface(broadcastDaemonProtocol());
    connection->setExportedInterface(broadcastExtensionProtocol(), payloads_);
    connection->resume();
  }
  void call(const char* member, platform::IPCArguments arguments = {}) {
    connection->call(member, std::move(arguments), nullptr, nullptr);
  }

  bool answers = true;
  const std::shared_ptr<RecordingExportedObject> vendor = std::make_shared<RecordingExportedObject>();
  /// The payloads' descriptors are let go with the calls.
  std::vector<platform::Dictionary> received;
  std::vector<platform::IPCReply> unanswered;
  std::shared_ptr<platform::IPCConnection> connection;

 private:
  const std::shared_ptr<RecordingExportedObject> payloads_ = std::make_shared<RecordingExportedObject>();
  FakeIPCService& ipc_;
  std::shared_ptr<FakeIPCConnection> vendorEnd_;
};

}  // namespace qv::fakes
