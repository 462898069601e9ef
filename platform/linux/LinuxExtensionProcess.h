#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/ExtensionHost.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/linux/SandboxTokenBook.h"
#include "platform/threads/SerialQueue.h"

namespace qv::platform {

/// One process of an extension: its launch, its two connections, and the requests that it was given.
///
/// Requests wait until both connections are there. A request ends alone where it alone is at fault (an answer over the
/// bounds, no answer in time); the process is killed where it answers none of its requests, and where it ends a
/// connection and is still there 5 s later. When it is dead, and all that it had sent before is read, `didEnd` is
/// called, once.
///
/// Threading: `queue` only, other than where it says so. Handlers of requests come on a queue of their own.
class LinuxExtensionProcess final : public IPCListenerDelegate,
                                    public std::enable_shared_from_this<LinuxExtensionProcess> {
 public:
  /// `tokens` are those of its use.
  static std::shared_ptr<LinuxExtensionProcess> create(std::shared_ptr<ExtensionHost> host,
                                                       std::shared_ptr<SandboxTokenBook> tokens,
                                                       std::shared_ptr<SerialQueue> queue, ExtensionRecordRef extension,
                                                       std::function<void(LinuxExtensionProcess*)> didEnd);
  ~LinuxExtensionProcess() override;

  /// Launches with the first one.
  void begin(ExtensionRequestID request, std::vector<ExtensionItem> items, ExtensionRequestHandlers handlers);
  /// SIGKILL: every request that it has ends in an error, once it is dead.
  void terminate();
  /// Whether it takes no more requests: it was killed, closes its connections, or has ended.
  [[nodiscard]] bool isEnding() const { return isEnding_; }

  bool listenerShouldAcceptNewConnection(IPCListener& listener,
                                         const std::shared_ptr<IPCConnection>& connection) override;

 private:
  class RequestsObject;
  enum class Stage { Waiting, Sent, Begun };
  using Outcome = Result<std::vector<ExtensionItem>>;
  struct Request {
    Stage stage = Stage::Waiting;
    std::vector<ExtensionItem> items;
    ExtensionRequestHandlers handlers;
    std::unique_ptr<TimerHandle> deadline;
    std::optional<Outcome> outcome;  ///< that came before the request was answered
  };

  LinuxExtensionProcess(std::shared_ptr<ExtensionHost> host, std::shared_ptr<SandboxTokenBook> tokens,
                        std::shared_ptr<SerialQueue> queue, ExtensionRecordRef extension,
                        std::function<void(LinuxExtensionProcess*)> didEnd);
  std::optional<Error> launch();
  Result<ListenerEndpoint> listen(std::unique_ptr<IPCListener>& listener);
  [[nodiscard]] bool isOurProcess(const IPCConnection& connection) const;
  void adoptRequests(const std::shared_ptr<IPCConnection>& connection);
  void adoptAuxiliary(const std::shared_ptr<IPCConnection>& connection);
  void sendWaiting();
  void send(ExtensionRequestID request, Request& entry);
  void didBegin(ExtensionRequestID request);
  void didPassDeadline(ExtensionRequestID request);
  void completeRequest(ExtensionRequestID request, const Value& items);
  void openFile(const std::string& token, const IPCReply& reply);
  /// Tells the request's owner, by `began` or `completed` as it stands, and forgets it.
  void end(ExtensionRequestID request, Outcome outcome);
  void connectionEnded(const char* which);
  void processWillBeKilled(const Error& why);
  void processEnded(int status);
  void kill(const std::string& why);
  void finish();
  /// Logs what no sane extension does: a few of them, however many there are.
  void logOddity(const std::string& what);

  const std::shared_ptr<ExtensionHost> host_;
  const std::shared_ptr<SandboxTokenBook> tokens_;
  const std::shared_ptr<SerialQueue> queue_;
  const ExtensionRecordRef extension_;
  std::function<void(LinuxExtensionProcess*)> didEnd_;
  SerialQueue handlerQueue_;
  std::unique_ptr<IPCListener> requestsListener_;
  std::unique_ptr<IPCListener> auxiliaryListener_;
  std::shared_ptr<IPCConnection> requestsConnection_;
  std::shared_ptr<IPCConnection> auxiliaryConnection_;
  std::shared_ptr<ExtensionHostContext> context_;
  std::map<ExtensionRequestID, Request> requests_;
  bool isEnding_ = false;
  bool wasKilled_ = false;
  std::optional<Error> reason_;  ///< why it was, where its requests are told
  std::unique_ptr<TimerHandle> leaveDeadline_;
  bool requestsConnectionEnded_ = false;
  std::optional<int> status_;  ///< once the process is dead
  int oddities_ = 0;
  std::unique_ptr<StartedExtension> process_;  ///< the last: its thread ends before what it reports to
};

}  // namespace qv::platform
