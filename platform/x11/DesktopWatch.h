#pragma once

#include <chrono>
#include <memory>
#include <string>

#include "platform/threads/EventLoop.h"
#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// What a DesktopWatch tells, all on its loop.
class DesktopWatchClient {
 public:
  virtual ~DesktopWatchClient() = default;
  /// A connection was made: choose its events, and read what is there now.
  virtual void desktopConnected(XcbConnection& connection) = 0;
  /// Whether the event is a reason to look. Told of each, once.
  virtual bool desktopEventConcerns(const xcb_generic_event_t& event) = 0;
  /// Read what is there now. Events that came before have been taken.
  virtual void lookAtDesktop(XcbConnection& connection) = 0;
  virtual void desktopWasLost() = 0;
};

/// Follows a display on an event loop, on a connection of its own.
///
/// Several events of one change are answered by one look, some time after the first; until then no event wakes the
/// thread. Where the server goes away, or is not there, it tries once a second whether it is back.
///
/// Threading: the loop's thread; destroyed when the loop has stopped.
class DesktopWatch {
 public:
  /// `delay` lies between an event and the look. `client` and `loop` must live as long.
  DesktopWatch(EventLoop& loop, DesktopWatchClient& client, std::string display, std::chrono::milliseconds delay);

  /// Makes a connection, a new one where there is one.
  void begin();
  /// Gives the connection up; what was to come does not. Not to be called by the client's functions.
  void end();
  /// In place of a look that is to come. Nothing without a connection.
  void lookIn(std::chrono::milliseconds delay);
  [[nodiscard]] bool isConnected() const { return connection_ != nullptr; }

 private:
  void connect();
  void look();
  void takeEvents();
  void rest();

  EventLoop& loop_;
  DesktopWatchClient& client_;
  const std::string display_;
  const std::chrono::milliseconds delay_;
  std::unique_ptr<XcbConnection> connection_;
  EventLoop::Watch readable_;
  EventLoop::Timer timer_;  // of the next look, or of the next attempt to connect
  bool isLookDue_ = false;
};

}  // namespace qv::platform
