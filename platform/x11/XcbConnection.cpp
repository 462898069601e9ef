#include "platform/x11/XcbConnection.h"

#include <poll.h>
#include <signal.h>
#include <xcb/xcbext.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <mutex>

namespace qv::platform {
namespace {

sigset_t sigpipeSet() {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGPIPE);
  return set;
}

xcb_screen_t* screenOfNumber(xcb_connection_t* connection, int number) {
  auto screens = xcb_setup_roots_iterator(xcb_get_setup(connection));
  for (; number > 0 && screens.rem > 1; --number) xcb_screen_next(&screens);
  return screens.data;
}

/// libXau, in which a connection looks for its authorization, keeps the file's name in a buffer of the process's: two
/// threads that connect at once would write it together.
xcb_connection_t* connectOneAtATime(const std::string& display, int& screenNumber) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  return xcb_connect(display.empty() ? nullptr : display.c_str(), &screenNumber);
}

}  // namespace

ScopedSigpipeBlock::ScopedSigpipeBlock() {
  const sigset_t set = sigpipeSet();
  sigset_t former;
  unblock_ = pthread_sigmask(SIG_BLOCK, &set, &former) == 0 && sigismember(&former, SIGPIPE) == 0;
}

ScopedSigpipeBlock::~ScopedSigpipeBlock() {
  if (!unblock_) return;
  const sigset_t set = sigpipeSet();
  const timespec now{};
  while (sigtimedwait(&set, nullptr, &now) == SIGPIPE) {
  }
  pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
}

Result<std::unique_ptr<XcbConnection>> XcbConnection::open(const std::string& display,
                                                           std::chrono::milliseconds replyLimit) {
  int screenNumber = 0;
  const ScopedSigpipeBlock noSigpipe;
  xcb_connection_t* connection = connectOneAtATime(display, screenNumber);
  if (const int failure = xcb_connection_has_error(connection); failure != 0) {
    xcb_disconnect(connection);
    return Error::posix(failure == XCB_CONN_CLOSED_PARSE_ERR ? EINVAL : ECONNREFUSED, "X display " + display);
  }
  return std::unique_ptr<XcbConnection>(new XcbConnection(connection, screenNumber, replyLimit));
}

XcbConnection::XcbConnection(xcb_connection_t* connection, int screenNumber, std::chrono::milliseconds replyLimit)
    : connection_(connection), screen_(screenOfNumber(connection, screenNumber)), replyLimit_(replyLimit) {}

XcbConnection::~XcbConnection() {
  const ScopedSigpipeBlock noSigpipe;
  xcb_disconnect(connection_);
}

bool XcbConnection::hasExtension(xcb_extension_t& extension) {
  const auto* data = xcb_get_extension_data(connection_, &extension);
  return data != nullptr && data->present != 0;
}

void* XcbConnection::awaitReply(unsigned int sequence) {
  if (isLost()) return nullptr;
  xcb_flush(connection_);
  const auto deadline = std::chrono::steady_clock::now() + replyLimit_;
  void* reply = nullptr;
  xcb_generic_error_t* error = nullptr;
  while (xcb_poll_for_reply(connection_, sequence, &reply, &error) == 0) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) {
      stalled_ = true;
      xcb_discard_reply(connection_, sequence);
      return nullptr;
    }
    pollfd readable{fd(), POLLIN, 0};
    ::poll(&readable, 1, static_cast<int>(left.count()));
  }
  std::free(error);
  return reply;
}

bool XcbConnection::succeeded(xcb_void_cookie_t cookie) {
  // The reply to a later request shows that the server has dealt with the earlier one.
  auto barrier = await<xcb_get_input_focus_reply_t>(xcb_get_input_focus(connection_));
  if (!barrier) return false;
  const XcbPtr<xcb_generic_error_t> error(xcb_request_check(connection_, cookie));
  return !error && !isLost();
}

xcb_atom_t XcbConnection::atom(const char* name) {
  auto reply =
      await<xcb_intern_atom_reply_t>(xcb_intern_atom(connection_, 0, static_cast<uint16_t>(std::strlen(name)), name));
  return reply ? reply->atom : xcb_atom_t{XCB_ATOM_NONE};
}

uint32_t XcbConnection::property32(xcb_window_t window, xcb_atom_t property, xcb_atom_t type) {
  auto reply = await<xcb_get_property_reply_t>(xcb_get_property(connection_, 0, window, property, type, 0, 1));
  if (!reply || reply->format != 32 || xcb_get_property_value_length(reply.get()) < 4) return 0;
  uint32_t value = 0;
  std::memcpy(&value, xcb_get_property_value(reply.get()), sizeof value);
  return value;
}

}  // namespace qv::platform
