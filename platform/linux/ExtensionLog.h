#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "platform/base/FileDescriptor.h"

namespace qv::platform {

/// "stderr.log" of a container, made anew. When it is full it keeps its younger half. The extension can do with the
/// file what it likes, as with all of its container; what it loses then is its own.
///
/// Threading: one thread at a time. Blocking.
class ExtensionLog {
 public:
  ExtensionLog(const std::string& container, uid_t owner);
  /// Without a word where it cannot.
  void write(std::string_view text);

 private:
  void dropOlderHalf();

  FileDescriptor file_;
  size_t size_ = 0;
};

}  // namespace qv::platform
