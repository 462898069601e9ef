#include "platform/x11/DesktopWatch.h"

#include <sys/epoll.h>

#include <utility>

namespace qv::platform {
namespace {
constexpr std::chrono::milliseconds kReconnectInterval{1000};
constexpr std::chrono::milliseconds kDesktopReplyLimit{2000};
}  // namespace

DesktopWatch::DesktopWatch(EventLoop& loop, DesktopWatchClient& client, std::string display,
                           std::chrono::milliseconds delay)
    : loop_(loop), client_(client), display_(std::move(display)), delay_(delay) {}

void DesktopWatch::begin() {
  end();
  connect();
}

void DesktopWatch::end() {
  timer_.end();
  readable_.end();
  connection_.reset();
  isLookDue_ = false;
}

void DesktopWatch::connect() {
  if (auto opened = XcbConnection::open(display_, kDesktopReplyLimit)) {
    connection_ = std::move(opened.value());
    client_.desktopConnected(*connection_);
  }
  rest();
}

void DesktopWatch::lookIn(std::chrono::milliseconds delay) {
  if (!connection_) return;
  isLookDue_ = true;
  readable_.end();
  timer_ = loop_.after(delay, [this] { look(); });
}

void DesktopWatch::look() {
  isLookDue_ = false;
  timer_.end();
  // What they tell is read now.
  while (const auto event = connection_->pollEvent()) (void)client_.desktopEventConcerns(*event);
  client_.lookAtDesktop(*connection_);
  rest();
}

/// After every step: an event that came in beside a reply lies with xcb, and does not wake the loop any more.
void DesktopWatch::rest() {
  if (connection_ && !isLookDue_) takeEvents();
  if (connection_ && connection_->isLost()) {
    end();
    client_.desktopWasLost();
  }
  if (!connection_) {
    timer_ = loop_.after(kReconnectInterval, [this] { connect(); });
    return;
  }
  xcb_flush(connection_->get());
  if (!isLookDue_ && !readable_) readable_ = loop_.watch(connection_->fd(), EPOLLIN, [this](uint32_t) { rest(); });
}

void DesktopWatch::takeEvents() {
  while (auto event = connection_->pollEvent()) {
    if (client_.desktopEventConcerns(*event) && !isLookDue_) lookIn(delay_);
  }
}

}  // namespace qv::platform
