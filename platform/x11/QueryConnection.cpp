#include "platform/x11/QueryConnection.h"

#include <xcb/res.h>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {
/// A question is asked by flows that others wait for.
constexpr std::chrono::milliseconds kQueryReplyLimit{2000};
}  // namespace

QueryConnection::QueryConnection(std::string display) : display_(std::move(display)) {}

std::optional<Error> QueryConnection::connect() {
  std::lock_guard lock(mutex_);
  auto opened = XcbConnection::open(display_, kQueryReplyLimit);
  if (!opened) return opened.error();
  connection_ = std::move(opened.value());
  return std::nullopt;
}

bool QueryConnection::ensureConnected() {
  if (connection_ && !connection_->isLost()) {
    // A server that went away while nobody asked shows only when its socket is read.
    drainEvents();
    if (!connection_->isLost()) return true;
  }
  connection_.reset();
  auto opened = XcbConnection::open(display_, kQueryReplyLimit);
  if (!opened) {
    QV_LOG_INFO(logs::kPlatform, "the X display does not answer: %s", opened.error().description().c_str());
    return false;
  }
  connection_ = std::move(opened.value());
  return true;
}

void QueryConnection::drainEvents() {
  while (connection_->pollEvent()) {
  }
}

}  // namespace qv::platform
