#pragma once

#include "platform/threads/SerialQueue.h"

namespace qv::platform {

/// Blocks the main thread until the process is asked to end (SIGTERM, SIGINT, SIGHUP) and returns
/// that signal's number. Call `blockTerminationSignals` first thing in main, before any thread; it also makes errors of
/// calls of what would end the process by other signals: a peer that is gone, a limit.
int runMainRunLoop();
void blockTerminationSignals();

/// The process's main queue, for what belongs to no other. It is served by the global queue, since the
/// main thread only waits for signals.
SerialQueue& mainQueue();

}  // namespace qv::platform
