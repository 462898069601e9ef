#pragma once

#include <functional>
#include <map>
#include <string>
#include <utility>

#include "daemon/Caller.h"
#include "daemon/RequestErrors.h"
#include "platform/threads/Log.h"
#include "protocol/QVDaemonProtocol.h"

namespace qv {

/// Which function serves which operation. A call is read into its typed request once, and handed on with its caller.
///
/// Threading: filled before the first call; served on the sequence. It stays where it is.
class RequestTable {
 public:
  template <DescribedCall Request>
  using Serve = std::function<void(const Caller&, const Request&, const platform::IPCReply&)>;
  template <DescribedCall Request>
  using Refuse = std::function<void(const Request&, const platform::IPCReply&)>;

  /// `refused` is told of each caller who was refused because it is not what it was when it connected.
  explicit RequestTable(std::function<void(const Caller&, platform::PeerStanding)> refused)
      : refused_(std::move(refused)) {}

  /// Of an operation that hangs upon what the caller is: that is looked at again with each request.
  template <DescribedCall Request>
  void addIdentified(Serve<Request> serve, Refuse<Request> refuse) {
    add<Request>([this, serve = std::move(serve), refuse = std::move(refuse)](
                     const Caller& caller, const Request& request, const platform::IPCReply& reply) {
      const auto standing = caller.standing();
      if (standing == platform::PeerStanding::Same) return serve(caller, request, reply);
      refuse(request, reply);
      refused_(caller, standing);
    });
  }
  template <DescribedCall Request>
  void add(Serve<Request> serve) {
    static_assert(request::All::contains<Request>, "or no client can call it");
    entries_.emplace(Request::kMember,
                     [serve = std::move(serve)](const Caller& caller, const platform::IPCArguments& arguments,
                                                const platform::IPCReply& reply) {
                       serve(caller, callOf<Request>(arguments), reply);
                     });
  }
  void serve(const Caller& caller, const platform::IPCOperation& operation, const platform::IPCArguments& arguments,
             const platform::IPCReply& reply) const {
    const auto entry = entries_.find(operation.member);
    if (entry == entries_.end()) {
      QV_LOG_ERROR(platform::logs::kDaemon, "nobody serves %s", operation.member.c_str());
      reply.fail(requesterror::kNotSupported, operation.member);
    } else {
      entry->second(caller, arguments, reply);
    }
  }

 private:
  const std::function<void(const Caller&, platform::PeerStanding)> refused_;
  std::map<std::string, std::function<void(const Caller&, const platform::IPCArguments&, const platform::IPCReply&)>>
      entries_;
};

}  // namespace qv
