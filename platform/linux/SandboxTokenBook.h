#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "platform/threads/Guarded.h"

namespace qv::platform {

/// The rights to read one file that one use of an extension has. Each holds its file open, so they are bounded: 256.
///
/// Threading: thread-safe.
class SandboxTokenBook {
 public:
  /// 256 random bits as text. Nothing where `path` is no plain file, or a link, or there are too many already.
  std::optional<std::string> issue(const std::string& path);
  /// Tokens that stand in `items` end with that request.
  void giveToRequest(const std::vector<ExtensionItem>& items, ExtensionRequestID request);
  /// The file, opened for reading, once; nothing where the token is not of this book, or not any more.
  SharedFileDescriptor take(const std::string& token);
  void revoke(const std::string& token);
  void endRequest(ExtensionRequestID request);

 private:
  struct Entry {
    SharedFileDescriptor file;
    ExtensionRequestID request = 0;  ///< 0 until it is given to one
  };
  Guarded<std::map<std::string, Entry>> entries_;
};

}  // namespace qv::platform
