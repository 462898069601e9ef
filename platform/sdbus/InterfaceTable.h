#pragma once

#include <systemd/sd-bus.h>

#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/IPC.h"

namespace qv::platform::sdbus {

/// An interface with what sd-bus needs to serve and describe it. Connections that use the same
/// interface share one table.
///
/// Threading: immutable, so thread-safe.
class InterfaceTable {
 public:
  /// The table of an interface of this content; made when no connection uses one now.
  static std::shared_ptr<const InterfaceTable> shared(const IPCInterface& interface);

  explicit InterfaceTable(const IPCInterface& interface);
  InterfaceTable(const InterfaceTable&) = delete;
  InterfaceTable& operator=(const InterfaceTable&) = delete;

  [[nodiscard]] const std::string& name() const { return interface_.name; }
  [[nodiscard]] const IPCOperation* operation(std::string_view member) const;
  /// The signature of an operation's reply; empty for a one-way operation.
  [[nodiscard]] static std::string replySignature(const IPCOperation& operation);
  /// Method entries that call `handler`. For sd_bus_add_object_vtable, which keeps the pointer:
  /// they must outlive the bus.
  [[nodiscard]] std::vector<sd_bus_vtable> methods(sd_bus_message_handler_t handler) const;

 private:
  struct Strings {
    std::string arguments;
    std::string reply;
    std::string names;  ///< each followed by NUL
  };
  const IPCInterface interface_;
  std::deque<Strings> strings_;  ///< in the order of the operations
  std::unordered_map<std::string_view, const IPCOperation*> byMember_;
};

}  // namespace qv::platform::sdbus
