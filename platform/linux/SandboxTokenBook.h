#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "platform/Guarded.h"

namespace qv::platform {

/// The rights to read one file that are out. Each holds its file open, so it is bounded: 256 for an extension.
///
/// Threading: thread-safe.
class SandboxTokenBook {
 public:
  /// 256 random bits as text. Nothing where `path` is no plain file, or a link, or the extension has too many.
  std::optional<std::string> issue(const std::string& path, const std::string& extension);
  /// Tokens of the extension that stand in `items` end with that request.
  void giveToRequest(const std::vector<ExtensionItem>& items, const std::string& extension, ExtensionRequestID request);
  /// The file, opened for reading, once; nothing where the token is not this extension's, or not any more.
  SharedFileDescriptor take(const std::string& token, const std::string& extension);
  void revoke(const std::string& token);
  void endRequest(ExtensionRequestID request);

 private:
  struct Entry {
    std::string extension;
    SharedFileDescriptor file;
    ExtensionRequestID request = 0;  ///< 0 until it is given to one
  };
  Guarded<std::map<std::string, Entry>> entries_;
};

}  // namespace qv::platform
