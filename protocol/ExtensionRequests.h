#pragma once

#include <vector>

#include "platform/Extensions.h"
#include "platform/IPC.h"
#include "platform/base/Value.h"
#include "protocol/Calls.h"

namespace qv {

/// Between the daemon and an extension's process, by two connections that the process makes to the endpoints which it
/// inherits: their descriptor numbers stand in these environment variables. The first is for requests, by the
/// interfaces below; the second, the auxiliary one, for those of the host context.
inline constexpr const char kExtensionRequestsEndpointVariable[] = "QUORVEL_EXTENSION_REQUESTS";
inline constexpr const char kExtensionAuxiliaryEndpointVariable[] = "QUORVEL_EXTENSION_AUXILIARY";

/// Called on the extension.
const platform::IPCInterface& extensionRequestProtocol();
/// Called on the daemon.
const platform::IPCInterface& extensionRequestHostProtocol();
inline constexpr const char kNoSuchFileErrorName[] = "com.tarnwick.quorveld.Error.NoSuchFile";

/// Items as they stand in those messages: an array of dictionaries with "title" (s) and "attachments" (av). Titles and
/// attachments that are missing or of another type are left out.
[[nodiscard]] platform::Value valueOfExtensionItems(const std::vector<platform::ExtensionItem>& items);
[[nodiscard]] std::vector<platform::ExtensionItem> extensionItemsOfValue(const platform::Value& value);

template <>
struct WireType<std::vector<platform::ExtensionItem>> {
  static constexpr const char kSignature[] = "aa{sv}";
  static platform::Value to(const std::vector<platform::ExtensionItem>& items) { return valueOfExtensionItems(items); }
  static std::vector<platform::ExtensionItem> from(const platform::Value& value) {
    return extensionItemsOfValue(value);
  }
};

namespace extensioncall {

/// Answered when the request was taken.
struct BeginRequest {
  static constexpr const char kMember[] = "beginRequest";
  static constexpr const char kReply[] = "";
  platform::ExtensionRequestID request = 0;
  std::vector<platform::ExtensionItem> items;
  static constexpr auto arguments() {
    return std::tuple{Argument{"request", &BeginRequest::request}, Argument{"items", &BeginRequest::items}};
  }
};

struct CompleteRequest {
  static constexpr const char kMember[] = "completeRequest";
  platform::ExtensionRequestID request = 0;
  std::vector<platform::ExtensionItem> items;
  static constexpr auto arguments() {
    return std::tuple{Argument{"request", &CompleteRequest::request}, Argument{"items", &CompleteRequest::items}};
  }
};

/// Fails with kNoSuchFileErrorName for any token that is not this extension's to use.
struct OpenFile {
  static constexpr const char kMember[] = "openFile";
  static constexpr const char kReply[] = "h file";
  std::string token;
  static constexpr auto arguments() { return std::tuple{Argument{"token", &OpenFile::token}}; }
};

}  // namespace extensioncall

}  // namespace qv
