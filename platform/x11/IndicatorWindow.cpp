#include "platform/x11/IndicatorWindow.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "platform/threads/Log.h"
#include "platform/x11/CaptureSource.h"
#include "platform/x11/IndicatorTraces.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kCoalescing{50};
/// Televisions may cut off some of the picture's edge.
constexpr int kMarginOfScreenHeight = 36;
constexpr uint8_t kSelectButton = 1;  // a touch is one, too
/// Bytes in one request: any server takes that many.
constexpr size_t kLargestUpload = 64 * 1024;
constexpr uint8_t kSentByAClient = 0x80;

void setText(XcbConnection& connection, xcb_window_t window, xcb_atom_t property, const std::string& text) {
  xcb_change_property(connection.get(), XCB_PROP_MODE_REPLACE, window, property, XCB_ATOM_STRING, 8,
                      static_cast<uint32_t>(text.size()), text.data());
}

/// Some rows at a time.
void upload(xcb_connection_t* c, const IndicatorImage& image, xcb_pixmap_t pixmap, xcb_gcontext_t context,
            uint8_t depth) {
  const size_t rowBytes = size_t{image.width} * 4;
  const size_t rows = std::max<size_t>(1, kLargestUpload / rowBytes);
  for (size_t row = 0; row < image.height; row += rows) {
    const size_t count = std::min(rows, image.height - row);
    xcb_put_image(c, XCB_IMAGE_FORMAT_Z_PIXMAP, pixmap, context, image.width, static_cast<uint16_t>(count), 0,
                  static_cast<int16_t>(row), 0, depth, static_cast<uint32_t>(count * rowBytes),
                  reinterpret_cast<const uint8_t*>(&image.pixels[row * image.width]));
  }
}

}  // namespace

IndicatorWindow::IndicatorWindow(std::string display, std::filesystem::path module, StatusBarOverride shown,
                                 std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate)
    : module_(std::move(module)),
      delegate_(std::move(delegate)),
      shown_(std::move(shown)),
      desktop_(loop_, *this, std::move(display), kCoalescing) {
  loop_.post([this] { begin(); });
}

void IndicatorWindow::begin() {
  const auto entry = entryOfModule(module_, kIndicatorModuleEntry);
  if (!entry) {
    QV_LOG_ERROR(logs::kUI, "no indicator is shown: %s", entry.error().description().c_str());
    return;
  }
  reinterpret_cast<MakeIndicatorPainter>(entry.value())(painter_);
  desktop_.begin();
}

void IndicatorWindow::update(const StatusBarOverride& shown) {
  loop_.post([this, shown] {
    shown_ = shown;
    isStale_ = true;
    desktop_.lookIn(std::chrono::milliseconds(0));
  });
}

void IndicatorWindow::desktopConnected(XcbConnection& connection) {
  window_ = XCB_NONE;
  screenWidth_ = screenHeight_ = 0;
  refuseUnsupportedPixels(connection);
  const uint32_t mask = XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_STRUCTURE_NOTIFY;
  xcb_change_window_attributes(connection.get(), connection.root(), XCB_CW_EVENT_MASK, &mask);
  desktop_.lookIn(std::chrono::milliseconds(0));
}

/// Without a painter nothing is shown any more.
void IndicatorWindow::refuseUnsupportedPixels(XcbConnection& connection) {
  auto screen = connection.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection.get(), connection.root()));
  auto attributes = connection.await<xcb_get_window_attributes_reply_t>(
      xcb_get_window_attributes(connection.get(), connection.root()));
  if (!screen || !attributes || isPixelFormatSupported(connection, screen->depth, attributes->visual)) return;
  QV_LOG_ERROR(logs::kUI, "no indicator is shown: pixels of %d bits", static_cast<int>(screen->depth));
  painter_.reset();
}

/// A press is told at once. Everything else that happens to windows, to this one too, is a reason to look.
bool IndicatorWindow::desktopEventConcerns(const xcb_generic_event_t& event) {
  const int type = event.response_type & ~kSentByAClient;
  if (type == XCB_BUTTON_PRESS) {
    const auto& press = reinterpret_cast<const xcb_button_press_event_t&>(event);
    const bool isOfUser = (event.response_type & kSentByAClient) == 0;
    const auto delegate = delegate_.lock();
    if (isOfUser && press.detail == kSelectButton && delegate) delegate->statusBarOverrideWasPressed();
    return false;
  }
  if (type == XCB_DESTROY_NOTIFY && reinterpret_cast<const xcb_destroy_notify_event_t&>(event).window == window_)
    window_ = XCB_NONE;
  return type >= XCB_DESTROY_NOTIFY && type <= XCB_CIRCULATE_NOTIFY;
}

void IndicatorWindow::lookAtDesktop(XcbConnection& connection) {
  auto screen = connection.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection.get(), connection.root()));
  if (!screen || !painter_) return;
  if (std::exchange(screenWidth_, screen->width) != screen->width) isStale_ = true;
  if (std::exchange(screenHeight_, screen->height) != screen->height) isStale_ = true;
  const bool isToBePainted = std::exchange(isStale_, false) || window_ == XCB_NONE;
  if (isToBePainted) image_ = painter_->draw(shown_, screenWidth_, screenHeight_);
  if (image_.pixels.empty()) return;
  ensureWindow(connection);
  const int margin = screenHeight_ / kMarginOfScreenHeight;
  const uint32_t place[] = {static_cast<uint32_t>(screenWidth_ - image_.width - margin), static_cast<uint32_t>(margin),
                            image_.width, image_.height, XCB_STACK_MODE_ABOVE};
  // What is as it should be causes no event.
  xcb_configure_window(connection.get(), window_,
                       XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y | XCB_CONFIG_WINDOW_WIDTH | XCB_CONFIG_WINDOW_HEIGHT |
                           XCB_CONFIG_WINDOW_STACK_MODE,
                       place);
  if (isToBePainted) paint(connection, screen->depth);
  xcb_map_window(connection.get(), window_);
}

void IndicatorWindow::ensureWindow(XcbConnection& connection) {
  if (window_ != XCB_NONE) return;
  window_ = xcb_generate_id(connection.get());
  const uint32_t values[] = {1, XCB_EVENT_MASK_BUTTON_PRESS};
  xcb_create_window(connection.get(), XCB_COPY_FROM_PARENT, window_, connection.root(), 0, 0, image_.width,
                    image_.height, 0, XCB_WINDOW_CLASS_INPUT_OUTPUT, XCB_COPY_FROM_PARENT,
                    XCB_CW_OVERRIDE_REDIRECT | XCB_CW_EVENT_MASK, values);
  setText(connection, window_, XCB_ATOM_WM_NAME, "Recording indicator");
  setText(connection, window_, XCB_ATOM_WM_CLASS, std::string("quorvel-indicator\0Quorvel\0", 26));
  const xcb_atom_t kind = connection.atom("_NET_WM_WINDOW_TYPE_NOTIFICATION");  // shares the screen with nobody
  xcb_change_property(connection.get(), XCB_PROP_MODE_REPLACE, window_, connection.atom("_NET_WM_WINDOW_TYPE"),
                      XCB_ATOM_ATOM, 32, 1, &kind);
  xcb_change_property(connection.get(), XCB_PROP_MODE_REPLACE, connection.root(), connection.atom(kIndicatorProperty),
                      XCB_ATOM_WINDOW, 32, 1, &window_);
}

void IndicatorWindow::paint(XcbConnection& connection, uint8_t depth) {
  xcb_connection_t* c = connection.get();
  const xcb_pixmap_t pixmap = xcb_generate_id(c);
  const xcb_gcontext_t context = xcb_generate_id(c);
  xcb_create_pixmap(c, depth, pixmap, window_, image_.width, image_.height);
  xcb_create_gc(c, context, pixmap, 0, nullptr);
  upload(c, image_, pixmap, context, depth);
  xcb_change_window_attributes(c, window_, XCB_CW_BACK_PIXMAP, &pixmap);
  xcb_clear_area(c, 0, window_, 0, 0, 0, 0);
  xcb_free_gc(c, context);
  xcb_free_pixmap(c, pixmap);  // the window keeps it
}

void IndicatorWindow::desktopWasLost() {
  window_ = XCB_NONE;
  QV_LOG_INFO(logs::kUI, "the indicator is not shown: the X server has gone");
}

}  // namespace qv::platform
