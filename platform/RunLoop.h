#pragma once

namespace qv::platform {

/// Blocks the main thread until the process is asked to end (SIGTERM, SIGINT, SIGHUP) and returns
/// that signal's number. Call `blockTerminationSignals` first thing in main, before any thread.
int runMainRunLoop();
void blockTerminationSignals();

}  // namespace qv::platform
