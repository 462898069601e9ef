#pragma once

#include <atomic>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/linux/LinuxBundleService.h"
#include "platform/linux/StarterMessages.h"

namespace qv::platform {

/// Starts extensions for another process of root (RemoteExtensionStarter), and tells it which hosts the network
/// reaches. It trusts that process little: it starts installed extensions only, by their identifier, whose executable
/// nobody but root could have written; as whom and how confined is the starter's to say. A process that is started
/// ends with the connection that it was started by.
///
/// Threading: each connection is served by a thread of its own.
class ExtensionStarterServer {
 public:
  /// At a time; each has some ten descriptors and two threads.
  static constexpr int kMaximumConnections = 64;

  /// Both are borrowed, for the life of the process.
  ExtensionStarterServer(LinuxBundleService& bundles, ExtensionStarter& starter)
      : bundles_(bundles), starter_(starter) {}
  /// Serves who connects to a listening socket, until that fails. The server must not be destroyed afterwards: there
  /// may be connections.
  Error run(const FileDescriptor& listening);

 private:
  void serve(const FileDescriptor& connection);
  void serveStart(const FileDescriptor& connection, const starter::Message& question);
  Result<std::unique_ptr<StartedExtension>> start(const starter::Message& question, StartedExtensionHandlers handlers);
  Result<ExtensionRecordRef> findInstalled(const std::string& identifier);

  LinuxBundleService& bundles_;
  ExtensionStarter& starter_;
  std::atomic<int> connections_{0};
};

}  // namespace qv::platform
