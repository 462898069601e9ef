#pragma once

#include <functional>
#include <map>
#include <string>
#include <utility>

#include "daemon/Caller.h"
#include "daemon/RequestErrors.h"
#include "daemon/Requests.h"

namespace qv {

/// Which function serves which operation. A call is read into its typed request once, and handed on with its caller.
///
/// Threading: filled before the first call; served on the sequence.
class RequestTable {
 public:
  template <typename Request>
  using Serve = std::function<void(const Caller&, const Request&, const platform::IPCReply&)>;

  template <typename Request>
  void add(std::string member, Serve<Request> serve) {
    entries_.emplace(
        std::move(member),
        [serve = std::move(serve)](const Caller& caller, const NamedArguments& arguments,
                                   const platform::IPCReply& reply) { serve(caller, Request(arguments), reply); });
  }
  void serve(const Caller& caller, const platform::IPCOperation& operation, const platform::IPCArguments& arguments,
             const platform::IPCReply& reply) const {
    const auto entry = entries_.find(operation.member);
    if (entry == entries_.end()) {
      reply.fail(requesterror::kNotSupported, operation.member);
    } else {
      entry->second(caller, NamedArguments(operation, arguments), reply);
    }
  }

 private:
  std::map<std::string, std::function<void(const Caller&, const NamedArguments&, const platform::IPCReply&)>> entries_;
};

}  // namespace qv
