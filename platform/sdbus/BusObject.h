#pragma once

#include <systemd/sd-bus.h>

namespace qv::platform::sdbus {

/// Adds the object that libraries expect of a message bus, at /org/freedesktop/DBus, so that they
/// work over a connection without one: Hello and five operations without effect.
///
/// Threading: I/O thread.
int addBusObject(sd_bus* bus);

}  // namespace qv::platform::sdbus
