#pragma once

#include <xcb/xcb.h>

#include <chrono>
#include <cstdlib>
#include <memory>
#include <string>

#include "platform/base/Result.h"

namespace qv::platform {

struct FreeDeleter {
  void operator()(void* memory) const { std::free(memory); }
};
/// A reply or an event of the X server.
template <typename T>
using XcbPtr = std::unique_ptr<T, FreeDeleter>;

/// Keeps a write to a closed socket from killing the process, for the calling thread and as long
/// as the object lives: libxcb writes without MSG_NOSIGNAL.
class ScopedSigpipeBlock {
 public:
  ScopedSigpipeBlock();
  ~ScopedSigpipeBlock();
  ScopedSigpipeBlock(const ScopedSigpipeBlock&) = delete;
  ScopedSigpipeBlock& operator=(const ScopedSigpipeBlock&) = delete;

 private:
  bool unblock_ = false;
};

/// One connection to an X server, on its default screen.
///
/// Every wait for a reply is bounded: a server that does not answer in time counts as lost, so
/// that a stopped server cannot hang the daemon.
///
/// Threading: used by one thread at a time.
class XcbConnection {
 public:
  /// `display` as in $DISPLAY; empty means that variable.
  static Result<std::unique_ptr<XcbConnection>> open(const std::string& display, std::chrono::milliseconds replyLimit);
  ~XcbConnection();
  XcbConnection(const XcbConnection&) = delete;
  XcbConnection& operator=(const XcbConnection&) = delete;

  [[nodiscard]] xcb_connection_t* get() const { return connection_; }
  [[nodiscard]] xcb_window_t root() const { return screen_->root; }
  [[nodiscard]] const xcb_setup_t& setup() const { return *xcb_get_setup(connection_); }
  [[nodiscard]] int fd() const { return xcb_get_file_descriptor(connection_); }
  /// The server has gone, broke the protocol, or did not answer in time.
  [[nodiscard]] bool isLost() const { return stalled_ || xcb_connection_has_error(connection_) != 0; }

  /// To be asked before the first request of an extension: one that the server lacks ends the connection.
  [[nodiscard]] bool hasExtension(xcb_extension_t& extension);
  /// The reply to a request; nothing for an X error or a lost connection.
  template <typename Reply, typename Cookie>
  XcbPtr<Reply> await(Cookie cookie) {
    return XcbPtr<Reply>(static_cast<Reply*>(awaitReply(cookie.sequence)));
  }
  /// For a request sent as `_checked` that has no reply: whether it succeeded.
  bool succeeded(xcb_void_cookie_t cookie);
  /// The next event that has arrived; nothing when there is none.
  XcbPtr<xcb_generic_event_t> pollEvent() { return XcbPtr<xcb_generic_event_t>(xcb_poll_for_event(connection_)); }
  /// The id of an atom; 0 when the connection is lost.
  xcb_atom_t atom(const char* name);
  /// The first 32-bit item of a window's property; 0 when it has none.
  uint32_t property32(xcb_window_t window, xcb_atom_t property, xcb_atom_t type);

 private:
  XcbConnection(xcb_connection_t* connection, int screenNumber, std::chrono::milliseconds replyLimit);
  void* awaitReply(unsigned int sequence);

  xcb_connection_t* connection_;
  xcb_screen_t* screen_ = nullptr;
  std::chrono::milliseconds replyLimit_;
  bool stalled_ = false;
};

}  // namespace qv::platform
