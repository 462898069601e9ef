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
/// Threading: filled before the first call; served on the sequence.
class RequestTable {
 public:
  template <DescribedCall Request>
  using Serve = std::function<void(const Caller&, const Request&, const platform::IPCReply&)>;

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
  std::map<std::string, std::function<void(const Caller&, const platform::IPCArguments&, const platform::IPCReply&)>>
      entries_;
};

}  // namespace qv
