#pragma once

// What the recording daemon does, for status displays, tools and operators. Nothing here changes anything.
//
//   auto status = quorvel::StatusReader::create();
//   status->recordings([](quorvel::StatusResult found) { for (auto& recording : found.entries) ... });
//
// docs/protocol.md, "Status", has the keys of each answer, and who sees what.

#include <quorvel/Types.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace quorvel {

struct StatusResult {
  std::optional<Error> error;
  std::vector<Dictionary> entries;  ///< of `device` the one
};

/// Asks the daemon. Making it does nothing yet: the first question connects, and one after a loss connects anew.
///
/// Use it in a process of no bundle. In an application that records, its connection and the Recorder's would replace
/// each other: the daemon has one for each bundle.
///
/// Every question ends in one call of its handler. Its error is kErrorConnectionInvalid (the daemon cannot be reached),
/// kErrorConnectionInterrupted (it went away meanwhile), or kErrorUnknown: an older daemon, that has no such question.
/// No handler is called after the destructor has returned.
///
/// Threading: thread-safe. Handlers run one at a time on a thread of the library. Do not destroy it in one of them.
class QUORVEL_API StatusReader {
 public:
  using Handler = std::function<void(StatusResult)>;

  /// Never nothing.
  static std::unique_ptr<StatusReader> create();
  virtual ~StatusReader();
  StatusReader(const StatusReader&) = delete;
  StatusReader& operator=(const StatusReader&) = delete;

  /// What records now.
  virtual void recordings(Handler handler) = 0;
  /// What a start by this bundle would find now. It may take some seconds, as the next two, where a server hangs.
  virtual void startConditions(std::string bundleID, bool system, bool microphone, Handler handler) = 0;
  /// What lies in the temporary store.
  virtual void movies(Handler handler) = 0;
  virtual void device(Handler handler) = 0;

 protected:
  StatusReader() = default;
};

}  // namespace quorvel
