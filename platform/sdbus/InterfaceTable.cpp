#include "platform/sdbus/InterfaceTable.h"

#include <map>
#include <mutex>

namespace qv::platform::sdbus {
namespace {

std::string joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) text += part;
  return text;
}

void addNames(std::string& names, const std::vector<std::string>& from, size_t count) {
  for (size_t i = 0; i < count; ++i) {
    names += i < from.size() ? from[i] : "arg" + std::to_string(i);
    names += '\0';
  }
}

/// Everything that tells one interface from another.
std::string fingerprint(const IPCInterface& interface) {
  std::string text = interface.name;
  const auto add = [&text](const std::vector<std::string>& parts) {
    for (const std::string& part : parts) text += ' ' + part;
    text += ';';
  };
  for (const IPCOperation& operation : interface.operations) {
    text += '\n' + operation.member + (operation.isMedia ? " media" : "");
    add(operation.arguments);
    add(operation.argumentNames);
    text += operation.reply ? "->" : "one-way";
    add(operation.reply.value_or(std::vector<std::string>{}));
    add(operation.replyNames);
  }
  return text;
}

}  // namespace

std::shared_ptr<const InterfaceTable> InterfaceTable::shared(const IPCInterface& interface) {
  static std::mutex mutex;
  static auto& tables = *new std::map<std::string, std::weak_ptr<const InterfaceTable>>;
  std::lock_guard lock(mutex);
  auto& entry = tables[fingerprint(interface)];
  auto table = entry.lock();
  if (!table) entry = table = std::make_shared<const InterfaceTable>(interface);
  return table;
}

InterfaceTable::InterfaceTable(const IPCInterface& interface) : interface_(interface) {
  for (const IPCOperation& operation : interface_.operations) {
    byMember_[operation.member] = &operation;
    Strings strings{joined(operation.arguments), replySignature(operation), {}};
    addNames(strings.names, operation.argumentNames, operation.arguments.size());
    if (operation.reply) addNames(strings.names, operation.replyNames, operation.reply->size());
    strings_.push_back(std::move(strings));
  }
}

const IPCOperation* InterfaceTable::operation(std::string_view member) const {
  const auto it = byMember_.find(member);
  return it == byMember_.end() ? nullptr : it->second;
}

std::string InterfaceTable::replySignature(const IPCOperation& operation) {
  return operation.reply ? joined(*operation.reply) : std::string();
}

std::vector<sd_bus_vtable> InterfaceTable::methods(sd_bus_message_handler_t handler) const {
  // sd-bus asks that unused parts are zero.
  std::vector<sd_bus_vtable> entries(interface_.operations.size() + 2, sd_bus_vtable{});
  entries.front().type = _SD_BUS_VTABLE_START;
  entries.front().x.start = {sizeof(sd_bus_vtable), _SD_BUS_VTABLE_PARAM_NAMES, &sd_bus_object_vtable_format};
  for (size_t i = 0; i < interface_.operations.size(); ++i) {
    const IPCOperation& operation = interface_.operations[i];
    sd_bus_vtable& entry = entries[i + 1];
    entry.type = _SD_BUS_VTABLE_METHOD;
    // Who may call is decided when a connection is accepted, not by capabilities.
    entry.flags = SD_BUS_VTABLE_UNPRIVILEGED;
    if (!operation.reply) entry.flags |= SD_BUS_VTABLE_METHOD_NO_REPLY;
    entry.x.method = {operation.member.c_str(), strings_[i].arguments.c_str(), strings_[i].reply.c_str(), handler, 0,
                      strings_[i].names.c_str()};
  }
  entries.back().type = _SD_BUS_VTABLE_END;
  return entries;
}

}  // namespace qv::platform::sdbus
