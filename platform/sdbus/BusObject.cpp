#include "platform/sdbus/BusObject.h"

#include <cstdint>

namespace qv::platform::sdbus {
namespace {

constexpr const char kUniqueName[] = ":1.1";  // there is one peer only

int onHello(sd_bus_message* call, void*, sd_bus_error*) { return sd_bus_reply_method_return(call, "s", kUniqueName); }

int onMatch(sd_bus_message* call, void*, sd_bus_error*) { return sd_bus_reply_method_return(call, nullptr); }

int onGetNameOwner(sd_bus_message* call, void*, sd_bus_error*) {
  const char* name = nullptr;
  const int r = sd_bus_message_read(call, "s", &name);
  return r < 0 ? r : sd_bus_reply_method_return(call, "s", name);
}

int onNameHasOwner(sd_bus_message* call, void*, sd_bus_error*) { return sd_bus_reply_method_return(call, "b", true); }

int onStartServiceByName(sd_bus_message* call, void*, sd_bus_error*) {
  constexpr uint32_t kAlreadyRunning = 2;
  return sd_bus_reply_method_return(call, "u", kAlreadyRunning);
}

sd_bus_vtable method(const char* member, const char* signature, const char* result, const char* names,
                     sd_bus_message_handler_t handler) {
  sd_bus_vtable entry{};
  entry.type = _SD_BUS_VTABLE_METHOD;
  entry.flags = SD_BUS_VTABLE_UNPRIVILEGED;
  entry.x.method = {member, signature, result, handler, 0, names};
  return entry;
}

sd_bus_vtable boundary(bool isStart) {
  sd_bus_vtable entry{};
  entry.type = isStart ? _SD_BUS_VTABLE_START : _SD_BUS_VTABLE_END;
  if (isStart) entry.x.start = {sizeof(sd_bus_vtable), _SD_BUS_VTABLE_PARAM_NAMES, &sd_bus_object_vtable_format};
  return entry;
}

}  // namespace

int addBusObject(sd_bus* bus) {
  static const sd_bus_vtable kMethods[] = {
      boundary(true),
      method("Hello", "", "s", "name\0", onHello),
      method("AddMatch", "s", "", "rule\0", onMatch),
      method("RemoveMatch", "s", "", "rule\0", onMatch),
      method("GetNameOwner", "s", "s", "name\0owner\0", onGetNameOwner),
      method("NameHasOwner", "s", "b", "name\0hasOwner\0", onNameHasOwner),
      method("StartServiceByName", "su", "u", "name\0flags\0result\0", onStartServiceByName),
      boundary(false),
  };
  return sd_bus_add_object_vtable(bus, nullptr, "/org/freedesktop/DBus", "org.freedesktop.DBus", kMethods, nullptr);
}

}  // namespace qv::platform::sdbus
