#include "tests/kit/XServer.h"

#include <cstdlib>
#include <cstring>
#include <stdexcept>

namespace qv::kit {
namespace {

/// The server loses the damage of rectangles that end beyond 32767.
constexpr uint16_t kWideEnough = 4096;

}  // namespace

XServer::XServer()
    : process_("Xvfb", {"-displayfd", "1", "-screen", "0", "640x480x24", "-nolisten", "tcp", "-noreset"}) {
  const std::string number = process_.readLine();
  if (number.empty()) throw std::runtime_error("the X server did not start");
  display_ = ":" + number;
}

XClient::XClient(const std::string& display) : connection_(xcb_connect(display.c_str(), nullptr)) {
  if (xcb_connection_has_error(connection_) != 0) throw std::runtime_error("no X server at " + display);
  screen_ = xcb_setup_roots_iterator(xcb_get_setup(connection_)).data;
}

XClient::~XClient() { xcb_disconnect(connection_); }

void XClient::sync() { std::free(xcb_get_input_focus_reply(connection_, xcb_get_input_focus(connection_), nullptr)); }

xcb_window_t XClient::show(const WindowOptions& options) {
  const xcb_window_t window = xcb_generate_id(connection_);
  const xcb_window_t parent = options.parent == XCB_NONE ? screen_->root : options.parent;
  uint8_t depth = XCB_COPY_FROM_PARENT;
  xcb_visualid_t visual = screen_->root_visual;
  xcb_colormap_t colormap = screen_->default_colormap;
  if (options.hasAlpha) {
    for (auto depths = xcb_screen_allowed_depths_iterator(screen_); depths.rem > 0; xcb_depth_next(&depths))
      if (depths.data->depth == 32) visual = xcb_depth_visuals_iterator(depths.data).data->visual_id;
    depth = 32;
    colormap = xcb_generate_id(connection_);
    xcb_create_colormap(connection_, XCB_COLORMAP_ALLOC_NONE, colormap, screen_->root, visual);
  }
  const uint32_t values[] = {options.color, 0, colormap};
  xcb_create_window(connection_, depth, window, parent, options.x, options.y, options.width, options.height,
                    options.border, XCB_WINDOW_CLASS_INPUT_OUTPUT, visual,
                    XCB_CW_BACK_PIXEL | XCB_CW_BORDER_PIXEL | XCB_CW_COLORMAP, values);
  map(window);
  return window;
}

void XClient::fill(xcb_window_t window, uint32_t color) { fillRect(window, color, 0, 0, kWideEnough, kWideEnough); }

void XClient::fillRect(xcb_window_t window, uint32_t color, int16_t x, int16_t y, uint16_t width, uint16_t height) {
  const xcb_gcontext_t context = xcb_generate_id(connection_);
  xcb_create_gc(connection_, context, window, XCB_GC_FOREGROUND, &color);
  const xcb_rectangle_t rectangle{x, y, width, height};
  xcb_poly_fill_rectangle(connection_, window, context, 1, &rectangle);
  xcb_free_gc(connection_, context);
  sync();
}

void XClient::configure(xcb_window_t window, uint16_t mask, std::initializer_list<uint32_t> values) {
  xcb_configure_window(connection_, window, mask, values.begin());
  sync();
}

void XClient::setNoBackground(xcb_window_t window) {
  const uint32_t none = XCB_BACK_PIXMAP_NONE;
  xcb_change_window_attributes(connection_, window, XCB_CW_BACK_PIXMAP, &none);
  sync();
}

void XClient::resize(xcb_window_t window, uint16_t width, uint16_t height) {
  configure(window, XCB_CONFIG_WINDOW_WIDTH | XCB_CONFIG_WINDOW_HEIGHT, {width, height});
}

void XClient::move(xcb_window_t window, int16_t x, int16_t y) {
  configure(window, XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y, {static_cast<uint32_t>(x), static_cast<uint32_t>(y)});
}

void XClient::raise(xcb_window_t window) { configure(window, XCB_CONFIG_WINDOW_STACK_MODE, {XCB_STACK_MODE_ABOVE}); }

void XClient::unmap(xcb_window_t window) {
  xcb_unmap_window(connection_, window);
  sync();
}

void XClient::map(xcb_window_t window) {
  xcb_map_window(connection_, window);
  sync();
}

void XClient::destroy(xcb_window_t window) {
  xcb_destroy_window(connection_, window);
  sync();
}

void XClient::focus(xcb_window_t window) {
  xcb_set_input_focus(connection_, XCB_INPUT_FOCUS_PARENT, window, XCB_CURRENT_TIME);
  sync();
}

void XClient::setCursor(xcb_window_t window, uint16_t side, uint32_t rgb) {
  const xcb_pixmap_t mask = xcb_generate_id(connection_);
  xcb_create_pixmap(connection_, 1, mask, window, side, side);
  const xcb_gcontext_t context = xcb_generate_id(connection_);
  const uint32_t one = 1;
  xcb_create_gc(connection_, context, mask, XCB_GC_FOREGROUND, &one);
  const xcb_rectangle_t all{0, 0, side, side};
  xcb_poly_fill_rectangle(connection_, mask, context, 1, &all);
  const auto channel = [&](int shift) { return static_cast<uint16_t>(((rgb >> shift) & 0xFF) * 0x101); };
  const xcb_cursor_t cursor = xcb_generate_id(connection_);
  xcb_create_cursor(connection_, cursor, mask, mask, channel(16), channel(8), channel(0), 0, 0, 0, 0, 0);
  xcb_change_window_attributes(connection_, window, XCB_CW_CURSOR, &cursor);
  xcb_free_gc(connection_, context);
  sync();
}

xcb_window_t XClient::focused() {
  auto* reply = xcb_get_input_focus_reply(connection_, xcb_get_input_focus(connection_), nullptr);
  const xcb_window_t window = reply == nullptr ? XCB_NONE : reply->focus;
  std::free(reply);
  return window;
}

std::string XClient::property(xcb_window_t window, const char* name) {
  auto* atom = xcb_intern_atom_reply(
      connection_, xcb_intern_atom(connection_, 0, static_cast<uint16_t>(std::strlen(name)), name), nullptr);
  auto* reply = xcb_get_property_reply(
      connection_, xcb_get_property(connection_, 0, window, atom->atom, XCB_ATOM_ANY, 0, 1024), nullptr);
  std::string value;
  if (reply != nullptr)
    value.assign(static_cast<const char*>(xcb_get_property_value(reply)),
                 static_cast<size_t>(xcb_get_property_value_length(reply)));
  std::free(reply);
  std::free(atom);
  return value;
}

void XClient::waitForEvent() {
  xcb_generic_event_t* event = xcb_wait_for_event(connection_);
  if (event == nullptr) throw std::runtime_error("the X server has gone");
  std::free(event);
}

void XClient::select(xcb_window_t window, uint32_t mask) {
  xcb_change_window_attributes(connection_, window, XCB_CW_EVENT_MASK, &mask);
}

void XClient::waitForEnd(xcb_window_t window) {
  select(window, XCB_EVENT_MASK_STRUCTURE_NOTIFY);
  while (parentOf(window) != XCB_NONE) waitForEvent();
}

xcb_window_t XClient::parentOf(xcb_window_t window) {
  auto* tree = xcb_query_tree_reply(connection_, xcb_query_tree(connection_, window), nullptr);
  const xcb_window_t parent = tree == nullptr ? XCB_NONE : tree->parent;
  std::free(tree);
  return parent;
}

void XClient::selectFocusEvents() {
  // A window tells also of a focus that moves into or out of a window within it.
  auto* tree = xcb_query_tree_reply(connection_, xcb_query_tree(connection_, screen_->root), nullptr);
  if (tree == nullptr) return;
  const xcb_window_t* children = xcb_query_tree_children(tree);
  for (int i = 0; i < xcb_query_tree_children_length(tree); ++i) select(children[i], XCB_EVENT_MASK_FOCUS_CHANGE);
  std::free(tree);
}

xcb_window_t XClient::waitForFocus(const std::function<bool(xcb_window_t)>& isWanted) {
  select(screen_->root, XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_FOCUS_CHANGE);
  while (true) {
    selectFocusEvents();
    for (xcb_window_t window = focused(); window > XCB_INPUT_FOCUS_POINTER_ROOT; window = parentOf(window))
      if (isWanted(window)) return window;
    waitForEvent();
  }
}

xcb_window_t XClient::waitForFocusedWindow(const std::string& title) {
  // Some toolkits focus a window of no size within their window.
  return waitForFocus([&](xcb_window_t window) { return property(window, "_NET_WM_NAME") == title; });
}

void XClient::waitForFocus(xcb_window_t wanted) {
  waitForFocus([&](xcb_window_t window) { return window == wanted; });
}

bool activateWindow(const std::string& display, xcb_window_t window) {
  Process request("timeout", {"60", "xdotool", "windowactivate", "--sync", std::to_string(window)},
                  {"DISPLAY=" + display});
  return request.wait() == 0;
}

bool pressKeys(const std::string& display, std::initializer_list<const char*> keys) {
  std::vector<std::string> arguments{"key", "--delay", "100"};
  arguments.insert(arguments.end(), keys.begin(), keys.end());
  return Process("xdotool", arguments, {"DISPLAY=" + display}).wait() == 0;
}

WindowManager::WindowManager(const std::string& display)
    : client_(display),
      // The command runs as the last thing before its main loop.
      process_("openbox", {"--sm-disable", "--startup", "echo up"}, {"DISPLAY=" + display}) {
  if (!process_.awaitLine("up")) throw std::runtime_error("the window manager did not start");
  const std::string check = client_.property(client_.root(), "_NET_SUPPORTING_WM_CHECK");
  if (check.size() == sizeof window_) std::memcpy(&window_, check.data(), sizeof window_);
}

void WindowManager::kill() {
  process_.kill();
  client_.waitForEnd(window_);
}

WindowProcess::WindowProcess(const std::string& display) : process_(TEST_WINDOW_PROGRAM, {display}) {
  const std::string id = process_.read(sizeof window_);
  if (id.size() != sizeof window_) throw std::runtime_error("no window");
  std::memcpy(&window_, id.data(), sizeof window_);
}

void XServerTest::SetUp() {
  if (!isInstalled("Xvfb")) GTEST_SKIP() << "Xvfb is not installed";
  if (!server_) server_.emplace();
}

}  // namespace qv::kit
