#include "platform/x11/ShownWindows.h"

#include <algorithm>
#include <cstring>
#include <map>
#include <optional>
#include <set>

#include "platform/x11/ClientWindows.h"

namespace qv::platform {
namespace {

constexpr size_t kMostWindows = 256;  // more on one screen is no layout of applications
constexpr uint32_t kMostAtoms = 32;
constexpr uint8_t kDepthWithAlpha = 32;

struct Atoms {
  explicit Atoms(XcbConnection& c)
      : clients(c.atom("_NET_CLIENT_LIST_STACKING")),
        type(c.atom("_NET_WM_WINDOW_TYPE")),
        normal(c.atom("_NET_WM_WINDOW_TYPE_NORMAL")),
        desktop(c.atom("_NET_WM_WINDOW_TYPE_DESKTOP")),
        state(c.atom("_NET_WM_STATE")),
        fullscreen(c.atom("_NET_WM_STATE_FULLSCREEN")),
        tall(c.atom("_NET_WM_STATE_MAXIMIZED_VERT")),
        wide(c.atom("_NET_WM_STATE_MAXIMIZED_HORZ")) {
    for (const char* name : {"DIALOG", "SPLASH", "UTILITY"})
      floating.insert(c.atom(("_NET_WM_WINDOW_TYPE_" + std::string(name)).c_str()));
  }
  xcb_atom_t clients, type, normal, desktop, state, fullscreen, tall, wide;
  std::set<xcb_atom_t> floating;
};

/// A property that is a list of 32-bit items.
std::vector<uint32_t> listProperty(XcbConnection& connection, xcb_window_t window, xcb_atom_t name, xcb_atom_t type,
                                   uint32_t most) {
  auto reply =
      connection.await<xcb_get_property_reply_t>(xcb_get_property(connection.get(), 0, window, name, type, 0, most));
  if (!reply || reply->format != 32) return {};
  std::vector<uint32_t> items(static_cast<size_t>(xcb_get_property_value_length(reply.get())) / 4);
  if (!items.empty()) std::memcpy(items.data(), xcb_get_property_value(reply.get()), items.size() * 4);
  return items;
}

bool contains(const std::vector<uint32_t>& items, uint32_t item) {
  return std::find(items.begin(), items.end(), item) != items.end();
}

struct TopLevel {
  xcb_window_t window;
  ScreenArea area;
  bool isOpaque;
};

/// The children of the root that are mapped, bottom to top.
std::vector<TopLevel> mappedTopLevels(XcbConnection& connection, const ScreenArea& screen) {
  auto tree = connection.await<xcb_query_tree_reply_t>(xcb_query_tree(connection.get(), connection.root()));
  if (!tree) return {};
  const xcb_window_t* children = xcb_query_tree_children(tree.get());
  const size_t count = std::min(static_cast<size_t>(xcb_query_tree_children_length(tree.get())), kMostWindows);
  std::vector<std::pair<xcb_get_window_attributes_cookie_t, xcb_get_geometry_cookie_t>> cookies;
  for (size_t i = 0; i < count; ++i)
    cookies.emplace_back(xcb_get_window_attributes(connection.get(), children[i]),
                         xcb_get_geometry(connection.get(), children[i]));
  std::vector<TopLevel> shown;
  for (size_t i = 0; i < count; ++i) {
    auto attributes = connection.await<xcb_get_window_attributes_reply_t>(cookies[i].first);
    auto box = connection.await<xcb_get_geometry_reply_t>(cookies[i].second);
    if (!attributes || !box || attributes->map_state != XCB_MAP_STATE_VIEWABLE) continue;
    if (attributes->_class != XCB_WINDOW_CLASS_INPUT_OUTPUT) continue;
    const int border = 2 * box->border_width;
    const ScreenArea area{std::max<int>(box->x, 0), std::max<int>(box->y, 0),
                          std::min(box->x + box->width + border, screen.right),
                          std::min(box->y + box->height + border, screen.bottom)};
    if (area.size() > 0) shown.push_back({children[i], area, box->depth != kDepthWithAlpha});
  }
  return shown;
}

/// The child of the root in which a managed window stands: the window manager's frame, or itself.
xcb_window_t topLevelOf(XcbConnection& connection, xcb_window_t window) {
  for (int depth = 0; depth < 8; ++depth) {
    auto tree = connection.await<xcb_query_tree_reply_t>(xcb_query_tree(connection.get(), window));
    if (!tree || tree->parent == connection.root() || tree->parent == XCB_NONE) return tree ? window : XCB_NONE;
    window = tree->parent;
  }
  return XCB_NONE;
}

/// By what the window says of itself. Nothing where it is ordinary, and its place decides.
std::optional<int64_t> levelOfType(XcbConnection& connection, const Atoms& atoms, xcb_window_t window) {
  const auto types = listProperty(connection, window, atoms.type, XCB_ATOM_ATOM, kMostAtoms);
  if (contains(types, atoms.desktop)) return displaylevel::kDesktop;
  if (!types.empty() && atoms.floating.contains(types.front())) return displaylevel::kFloating;
  if (!types.empty() && !contains(types, atoms.normal)) return displaylevel::kOverlay;
  return std::nullopt;
}

int64_t levelOfManaged(XcbConnection& connection, const Atoms& atoms, xcb_window_t window, bool hasPlaceOfTile) {
  const auto states = listProperty(connection, window, atoms.state, XCB_ATOM_ATOM, kMostAtoms);
  if (contains(states, atoms.fullscreen)) return displaylevel::kApplication;
  if (connection.property32(window, XCB_ATOM_WM_TRANSIENT_FOR, XCB_ATOM_WINDOW) != XCB_NONE)
    return displaylevel::kFloating;
  const bool isMaximized = contains(states, atoms.tall) || contains(states, atoms.wide);
  return isMaximized || hasPlaceOfTile ? displaylevel::kApplication : displaylevel::kFloating;
}

/// The window that the application made, for each child of the root that is the window manager's frame.
std::map<xcb_window_t, xcb_window_t> clientsOfFrames(XcbConnection& connection, const Atoms& atoms) {
  std::map<xcb_window_t, xcb_window_t> clients;
  for (const xcb_window_t client :
       listProperty(connection, connection.root(), atoms.clients, XCB_ATOM_WINDOW, kMostWindows))
    clients[topLevelOf(connection, client)] = client;
  return clients;
}

std::string ownerOf(xcb_window_t window, const std::map<xcb_window_t, pid_t>& processes, const xcb_setup_t& setup,
                    const BundleLookup& bundleOfProcess) {
  const auto process = processes.find(window);
  if (process == processes.end()) return "client " + std::to_string(window & ~setup.resource_id_mask);
  const auto bundle = bundleOfProcess ? bundleOfProcess(process->second) : std::nullopt;
  return bundle ? *bundle : "process " + std::to_string(process->second);
}

}  // namespace

std::vector<ShownWindow> readShownWindows(XcbConnection& connection, const BundleLookup& bundleOfProcess) {
  auto box = connection.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection.get(), connection.root()));
  if (!box) return {};
  const ScreenArea screen{0, 0, box->width, box->height};
  const Atoms atoms(connection);
  const auto topLevels = mappedTopLevels(connection, screen);
  const bool hasManager = windowManagerCheck(connection) != XCB_NONE;
  const auto clients = hasManager ? clientsOfFrames(connection, atoms) : std::map<xcb_window_t, xcb_window_t>();
  std::vector<xcb_window_t> windows;
  for (const TopLevel& topLevel : topLevels) {
    const auto client = clients.find(topLevel.window);
    windows.push_back(client == clients.end() ? topLevel.window : client->second);
  }
  const auto processes = processesOfWindows(connection, windows);
  std::vector<ShownWindow> shown;
  for (size_t i = 0; i < topLevels.size(); ++i) {
    const bool hasPlaceOfTile = isTile(topLevels[i].area, screen);
    auto level = levelOfType(connection, atoms, windows[i]);
    if (level == displaylevel::kDesktop) continue;
    if (!level && clients.contains(topLevels[i].window)) {
      level = levelOfManaged(connection, atoms, windows[i], hasPlaceOfTile);
    } else if (!level) {
      level =
          hasManager ? displaylevel::kOverlay : (hasPlaceOfTile ? displaylevel::kApplication : displaylevel::kFloating);
    }
    shown.push_back({ownerOf(windows[i], processes, connection.setup(), bundleOfProcess), topLevels[i].area, *level,
                     topLevels[i].isOpaque});
  }
  return shown;
}

}  // namespace qv::platform
