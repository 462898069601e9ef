#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/IPC.h"
#include "platform/base/Error.h"
#include "platform/base/Result.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// Keys of an extension's manifest: the bundle's information dictionary has the section, the section the rest.
namespace extensioninfo {
inline constexpr const char kSection[] = "QVExtension";
inline constexpr const char kPointIdentifier[] = "QVExtensionPointIdentifier";  ///< string, in the section
inline constexpr const char kExecutable[] = "QVExtensionExecutable";            ///< string: path within the bundle
inline constexpr const char kIcons[] = "QVExtensionIcons";  ///< array of strings: PNG files in the bundle's resources
inline constexpr const char kAttributes[] = "QVExtensionAttributes";          ///< dictionary, in the section
inline constexpr const char kActivationRule[] = "QVExtensionActivationRule";  ///< rule key to bool, in the attributes
/// The rule by which an extension says that it only supports streaming set-up.
inline constexpr const char kSupportsStreaming[] = "QVExtensionActivationSupportsStreaming";
}  // namespace extensioninfo

/// The only data type that item providers here carry: any transferable value.
inline constexpr const char kGenericDataType[] = "public.data";

/// One value under a type identifier, loaded when it is asked for.
struct ItemProvider {
  std::string typeIdentifier = kGenericDataType;
  Value value;
  [[nodiscard]] bool hasItemConformingToTypeIdentifier(std::string_view type) const { return typeIdentifier == type; }
};

/// What goes into and comes out of an extension request: values under a title.
struct ExtensionItem {
  std::string attributedTitle;
  std::vector<ItemProvider> attachments;
};

/// An installed extension, as its manifest describes it.
///
/// Threading: immutable.
struct ExtensionRecord {
  std::string identifier;                ///< its bundle identifier
  std::string extensionPointIdentifier;  ///< what it extends
  Dictionary attributes;                 ///< kAttributes of the section; empty without
  Dictionary infoDictionary;             ///< the whole manifest
  std::string displayName;               ///< localized; empty without
  std::vector<Data> icons;               ///< PNG files, at most 1 MiB each; empty without
  std::string bundlePath;
  std::string executablePath;
};
using ExtensionRecordRef = std::shared_ptr<const ExtensionRecord>;

/// Tells one request of an extension from all others, for the life of this process.
using ExtensionRequestID = uint64_t;

/// The daemon's side of the auxiliary connection with an extension's process. A class of these is named by the
/// extension point; the platform asks it for the two interfaces and hands it the connection.
///
/// Threading: called on the platform's threads, one call at a time.
class ExtensionHostContext {
 public:
  virtual ~ExtensionHostContext() = default;
  [[nodiscard]] virtual const IPCInterface& _extensionAuxiliaryHostProtocol() const = 0;
  [[nodiscard]] virtual const IPCInterface& _extensionAuxiliaryVendorProtocol() const = 0;
  /// The extension's process has connected.
  virtual void didConnectToVendor(const std::shared_ptr<IPCConnection>& vendor) = 0;
};

/// How one request goes. Both on threads of the platform's.
struct ExtensionRequestHandlers {
  /// Once: the extension has taken the request, or the error that kept it from that (launch failed, process died, no
  /// answer within 10 s).
  std::function<void(ExtensionRequestID, const std::optional<Error>&)> began;
  /// After `began` without an error, once: what the extension returned, or the error that ended it (its process died,
  /// it was killed). Each request has its own, so that overlapping ones are never mistaken for each other.
  std::function<void(ExtensionRequestID, const Result<std::vector<ExtensionItem>>&)> completed;
};

/// A use of an extension: a process of its own, that no other use shares, and the requests to it. The first request
/// launches the process, confined (see docs/broadcast-extensions.md); further ones go to it while it lives, and the
/// next after its death launches it anew.
///
/// The end of the use ends the process (SIGKILL): requests that are open end in an error, tokens are void. It does not
/// wait for the death. So whoever hangs is ended with his own use, and a new use never meets a former one's process.
///
/// Threading: thread-safe. Handlers come on threads of the platform's, never within the call.
class ExtensionUse {
 public:
  virtual ~ExtensionUse() = default;
  virtual void beginRequest(std::vector<ExtensionItem> inputItems, ExtensionRequestHandlers handlers) = 0;
  /// The right to read one file, once, for the process of this use and nobody else. A random text; what it names is
  /// opened now, so that a later swap of the path changes nothing. Nothing where the file is no plain file.
  /// Unused, it ends with the request that it was given to, with the use, or by `revokeSandboxToken`.
  [[nodiscard]] virtual std::optional<std::string> issueSandboxToken(const std::string& tokenClass,
                                                                     const std::string& path) = 0;
  virtual void revokeSandboxToken(const std::string& token) = 0;
};

/// The installed extensions and their processes.
///
/// Threading: thread-safe. Handlers come on threads of the platform's, never within the call.
class ExtensionService {
 public:
  virtual ~ExtensionService() = default;
  /// The extensions whose attributes match: kPointIdentifier is the only key that is understood. In a steady order.
  virtual void extensionsMatchingAttributes(
      const Dictionary& attributes,
      std::function<void(const std::vector<ExtensionRecordRef>&, const std::optional<Error>&)> completion) = 0;
  /// Makes the host context of each process launched for an extension point.
  virtual void setHostContextClass(const std::string& extensionPointIdentifier,
                                   std::function<std::shared_ptr<ExtensionHostContext>()> make) = 0;
  /// Never nothing. An extension has at most 8 processes, those counted that still die: requests of a use beyond them
  /// end in an error (EBUSY).
  [[nodiscard]] virtual std::shared_ptr<ExtensionUse> useExtension(const ExtensionRecordRef& extension) = 0;
  /// Of the process that took the request; nothing once it is gone. Offered: the daemon needs its connection only.
  [[nodiscard]] virtual std::shared_ptr<ExtensionHostContext> contextForRequest(ExtensionRequestID request) = 0;
  /// Its remote interface is the vendor's; nothing once it is gone.
  [[nodiscard]] virtual std::shared_ptr<IPCConnection> auxiliaryConnectionForRequest(ExtensionRequestID request) = 0;
};

}  // namespace qv::platform
