#include "platform/x11/AlertFocus.h"

#include <algorithm>

#include "platform/x11/ClientWindows.h"
#include "platform/x11/Desktop.h"

namespace qv::platform {

AlertFocus::AlertFocus(std::unique_ptr<XcbConnection> connection) : connection_(std::move(connection)) {
  const uint32_t mask = XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY;
  xcb_change_window_attributes(connection_->get(), connection_->root(), XCB_CW_EVENT_MASK, &mask);
  xcb_flush(connection_->get());
}

AlertFocus::~AlertFocus() {
  if (hasTaken_ && !connection_->isLost()) restore();
}

void AlertFocus::handleEvents(pid_t alertProcess) {
  while (auto event = connection_->pollEvent()) {
    // A window manager puts the window into a frame of its own before it shows both.
    const uint8_t type = event->response_type & 0x7F;
    xcb_window_t window = XCB_NONE;
    if (type == XCB_MAP_NOTIFY)
      window = reinterpret_cast<const xcb_map_notify_event_t&>(*event).window;
    else if (type == XCB_REPARENT_NOTIFY)
      window = reinterpret_cast<const xcb_reparent_notify_event_t&>(*event).window;
    if (window == XCB_NONE || processOfWindow(*connection_, window) != alertProcess) continue;
    if (windowManagerCheck(*connection_) != XCB_NONE)
      askForActivation(window);
    else if (type == XCB_MAP_NOTIFY)
      windowAppeared(window, alertProcess);
  }
}

void AlertFocus::askForActivation(xcb_window_t window) {
  // Like a taskbar: a request in the application's own name may be refused, lest it steal the focus.
  constexpr uint32_t kSourceIsPager = 2;
  xcb_client_message_event_t message{};
  message.response_type = XCB_CLIENT_MESSAGE;
  message.format = 32;
  message.window = window;
  message.type = connection_->atom("_NET_ACTIVE_WINDOW");
  message.data.data32[0] = kSourceIsPager;
  message.data.data32[1] = XCB_CURRENT_TIME;
  xcb_send_event(connection_->get(), 0, connection_->root(),
                 XCB_EVENT_MASK_SUBSTRUCTURE_REDIRECT | XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY,
                 reinterpret_cast<const char*>(&message));
  xcb_flush(connection_->get());
}

void AlertFocus::windowAppeared(xcb_window_t window, pid_t alertProcess) {
  xcb_connection_t* c = connection_->get();
  auto screen = connection_->await<xcb_get_geometry_reply_t>(xcb_get_geometry(c, connection_->root()));
  auto own = connection_->await<xcb_get_geometry_reply_t>(xcb_get_geometry(c, window));
  auto focus = connection_->await<xcb_get_input_focus_reply_t>(xcb_get_input_focus(c));
  if (!screen || !own || !focus) return;
  const uint32_t place[] = {static_cast<uint32_t>(std::max(0, (screen->width - own->width) / 2)),
                            static_cast<uint32_t>(std::max(0, (screen->height - own->height) / 2)),
                            XCB_STACK_MODE_ABOVE};
  xcb_configure_window(c, window, XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y | XCB_CONFIG_WINDOW_STACK_MODE, place);
  if (!hasTaken_) formerFocus_ = focus->focus;
  hasTaken_ = true;
  alertProcess_ = alertProcess;
  xcb_set_input_focus(c, XCB_INPUT_FOCUS_PARENT, window, XCB_CURRENT_TIME);
  xcb_flush(c);
}

void AlertFocus::restore() {
  xcb_connection_t* c = connection_->get();
  auto focus = connection_->await<xcb_get_input_focus_reply_t>(xcb_get_input_focus(c));
  // Somebody else may have taken the keyboard meanwhile. The server may still be to learn of the
  // alert's end.
  const bool isFree = focus && (focus->focus <= XCB_INPUT_FOCUS_POINTER_ROOT || focus->focus == connection_->root());
  if (!focus || (!isFree && processOfWindow(*connection_, focus->focus) != alertProcess_)) return;
  xcb_set_input_focus(c, XCB_INPUT_FOCUS_POINTER_ROOT, XCB_INPUT_FOCUS_POINTER_ROOT, XCB_CURRENT_TIME);
  if (formerFocus_ > XCB_INPUT_FOCUS_POINTER_ROOT)  // refused when that window has gone
    xcb_set_input_focus(c, XCB_INPUT_FOCUS_POINTER_ROOT, formerFocus_, XCB_CURRENT_TIME);
  connection_->await<xcb_get_input_focus_reply_t>(xcb_get_input_focus(c));  // it is done before the alert is over
}

}  // namespace qv::platform
