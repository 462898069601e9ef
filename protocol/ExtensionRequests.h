#pragma once

#include <vector>

#include "platform/Extensions.h"
#include "platform/IPC.h"
#include "platform/base/Value.h"

namespace qv {

/// Between the daemon and an extension's process, by two connections that the process makes to the endpoints which it
/// inherits: their descriptor numbers stand in these environment variables. The first is for requests, by the
/// interfaces below; the second, the auxiliary one, for those of the host context.
inline constexpr const char kExtensionRequestsEndpointVariable[] = "QUORVEL_EXTENSION_REQUESTS";
inline constexpr const char kExtensionAuxiliaryEndpointVariable[] = "QUORVEL_EXTENSION_AUXILIARY";

/// Called on the extension: "beginRequest" (t request, aa{sv} items) -> (). It is answered when the request was taken.
const platform::IPCInterface& extensionRequestProtocol();
/// Called on the daemon: "completeRequest" (t request, aa{sv} items), and "openFile" (s token) -> (h file), which fails
/// with "com.tarnwick.quorveld.Error.NoSuchFile" for any token that is not this extension's to use.
const platform::IPCInterface& extensionRequestHostProtocol();
inline constexpr const char kNoSuchFileErrorName[] = "com.tarnwick.quorveld.Error.NoSuchFile";

/// Items as they stand in those messages: an array of dictionaries with "title" (s) and "attachments" (av). Titles and
/// attachments that are missing or of another type are left out.
[[nodiscard]] platform::Value valueOfExtensionItems(const std::vector<platform::ExtensionItem>& items);
[[nodiscard]] std::vector<platform::ExtensionItem> extensionItemsOfValue(const platform::Value& value);

}  // namespace qv
