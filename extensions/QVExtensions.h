#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "protocol/QVBroadcastProtocols.h"

/// Utilities on the platform's extension types: finding installed extensions, and the items of their requests.
///
/// Threading: thread-safe; they keep nothing between calls.
namespace qv {

/// Which extensions are wanted. What is absent does not restrict.
struct ExtensionQuery {
  std::string pointName;
  /// A plain, case-sensitive prefix of the extension's identifier.
  std::optional<std::string> baseIdentifier = std::nullopt;
  /// A rule that the extension must declare as true.
  std::optional<std::string> activationRule = std::nullopt;
  /// A rule that it must not declare as true. Not asked of an extension without rules.
  std::optional<std::string> unwantedActivationRule = std::nullopt;
};
using ExtensionsCompletion =
    std::function<void(const std::vector<platform::ExtensionRecordRef>&, const std::optional<platform::Error>&)>;

/// The installed extensions that match, in the platform's order; callers take the first as "the" extension. The
/// completion (may be empty) comes on a thread of the platform's.
/// Without a service: an error, within the call.
void extensionsWithMatchingPointName(platform::ExtensionService* service, ExtensionQuery query,
                                     ExtensionsCompletion completion);

/// How the extension wants its broadcast: movie clips unless it declares otherwise.
[[nodiscard]] BroadcastProcessMode processMode(const platform::ExtensionRecord& extension);

/// An item with one attachment under the generic data type.
[[nodiscard]] platform::ExtensionItem itemWithTitle(std::string title, platform::Value attachment);

}  // namespace qv
