#pragma once

#include <mutex>
#include <string>

#include "platform/Metrics.h"
#include "platform/threads/Clock.h"

namespace qv::platform {

/// Appends each message as one line of JSON to <directory>/metrics.jsonl, with an identifier of its own ("id"), by
/// which whoever collects the lines knows one that came twice. A file that would grow over 1 MiB becomes
/// metrics.jsonl.1, the older ones .2 to .4; the fourth goes. A line is whole or not there at all.
///
/// Threading: thread-safe, blocking.
class JSONLineMetricsReporter final : public MetricsReporter {
 public:
  JSONLineMetricsReporter(std::string directory, const Clock& clock);
  std::optional<Error> sendMessage(const MetricsMessage& message) override;

 private:
  std::optional<Error> append(const std::string& line) const;
  void rotate() const;

  const std::string directory_;
  const std::string path_;
  const Clock& clock_;
  std::mutex mutex_;
};

}  // namespace qv::platform
