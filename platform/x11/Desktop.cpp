#include "platform/x11/Desktop.h"

#include <algorithm>
#include <cstring>

#include "platform/x11/ClientWindows.h"

namespace qv::platform {
namespace {

constexpr uint32_t kLongestClientList = 4096;

/// Windows that the window manager manages, which stand within its frames; bottom to top.
std::vector<xcb_window_t> managedWindows(XcbConnection& connection) {
  auto reply = connection.await<xcb_get_property_reply_t>(xcb_get_property(connection.get(), 0, connection.root(),
                                                                           connection.atom("_NET_CLIENT_LIST_STACKING"),
                                                                           XCB_ATOM_WINDOW, 0, kLongestClientList));
  if (!reply || reply->format != 32) return {};
  std::vector<xcb_window_t> windows(static_cast<size_t>(xcb_get_property_value_length(reply.get())) / 4);
  if (!windows.empty()) std::memcpy(windows.data(), xcb_get_property_value(reply.get()), windows.size() * 4);
  return windows;
}

std::vector<xcb_window_t> childrenOfRoot(XcbConnection& connection) {
  auto tree = connection.await<xcb_query_tree_reply_t>(xcb_query_tree(connection.get(), connection.root()));
  if (!tree) return {};
  const xcb_window_t* children = xcb_query_tree_children(tree.get());
  return {children, children + xcb_query_tree_children_length(tree.get())};
}

/// The window with the keyboard focus; XCB_NONE when no particular window has it.
xcb_window_t focusedWindow(XcbConnection& connection) {
  auto focus = connection.await<xcb_get_input_focus_reply_t>(xcb_get_input_focus(connection.get()));
  if (!focus || focus->focus <= XCB_INPUT_FOCUS_POINTER_ROOT || focus->focus == connection.root()) return XCB_NONE;
  return focus->focus;
}

std::optional<pid_t> frontUnderWindowManager(XcbConnection& connection, xcb_window_t check) {
  const xcb_window_t active =
      connection.property32(connection.root(), connection.atom("_NET_ACTIVE_WINDOW"), XCB_ATOM_WINDOW);
  if (active != XCB_NONE) return processOfWindow(connection, active);
  // The active window is none for a moment on most switches: the focus is more telling then, unless
  // the manager has it itself.
  const auto focused = processOfWindow(connection, focusedWindow(connection));
  if (focused == processOfWindow(connection, check)) return std::nullopt;
  return focused;
}

void appendOnce(std::vector<pid_t>& list, pid_t pid) {
  if (std::find(list.begin(), list.end(), pid) == list.end()) list.push_back(pid);
}

std::vector<pid_t> ownersOfVisible(XcbConnection& connection, const std::vector<xcb_window_t>& topLevels,
                                   const std::map<xcb_window_t, pid_t>& processes) {
  std::vector<xcb_get_window_attributes_cookie_t> cookies;
  for (const xcb_window_t window : topLevels) cookies.push_back(xcb_get_window_attributes(connection.get(), window));
  std::vector<pid_t> owners;
  for (size_t i = topLevels.size(); i-- > 0;) {
    auto attributes = connection.await<xcb_get_window_attributes_reply_t>(cookies[i]);
    if (!attributes || attributes->map_state != XCB_MAP_STATE_VIEWABLE) continue;
    if (attributes->_class != XCB_WINDOW_CLASS_INPUT_OUTPUT) continue;
    auto process = processes.find(topLevels[i]);
    if (process != processes.end()) appendOnce(owners, process->second);
  }
  return owners;
}

}  // namespace

xcb_window_t windowManagerCheck(XcbConnection& connection) {
  // The window that the root's property names points to itself. A manager that was killed leaves
  // its properties on the root behind.
  const xcb_atom_t atom = connection.atom("_NET_SUPPORTING_WM_CHECK");
  const xcb_window_t check = connection.property32(connection.root(), atom, XCB_ATOM_WINDOW);
  if (check == XCB_NONE || connection.property32(check, atom, XCB_ATOM_WINDOW) != check) return XCB_NONE;
  return check;
}

DesktopSnapshot readDesktop(XcbConnection& connection, bool selectFocusEvents) {
  DesktopSnapshot desktop;
  const xcb_window_t check = windowManagerCheck(connection);
  desktop.hasWindowManager = check != XCB_NONE;
  desktop.topLevels = childrenOfRoot(connection);
  const uint32_t mask = XCB_EVENT_MASK_FOCUS_CHANGE;
  if (selectFocusEvents)
    for (const xcb_window_t window : desktop.topLevels)
      xcb_change_window_attributes(connection.get(), window, XCB_CW_EVENT_MASK, &mask);

  auto windows = desktop.topLevels;
  if (desktop.hasWindowManager) {
    const auto managed = managedWindows(connection);
    windows.insert(windows.end(), managed.begin(), managed.end());
  }
  const auto processes = processesOfWindows(connection, windows);
  for (auto window = windows.rbegin(); window != windows.rend(); ++window)
    if (auto process = processes.find(*window); process != processes.end())
      appendOnce(desktop.processes, process->second);

  if (desktop.hasWindowManager) {
    desktop.front = frontUnderWindowManager(connection, check);
  } else if (const xcb_window_t focused = focusedWindow(connection); focused != XCB_NONE) {
    desktop.front = processOfWindow(connection, focused);
  } else {
    desktop.frontCandidates = ownersOfVisible(connection, desktop.topLevels, processes);
  }
  return desktop;
}

std::vector<RunningApplication> applicationsOf(const DesktopSnapshot& desktop, const BundleLookup& bundleOfProcess) {
  std::vector<RunningApplication> applications;
  for (const pid_t pid : desktop.processes)
    if (auto bundle = bundleOfProcess ? bundleOfProcess(pid) : std::nullopt)
      applications.push_back({pid, std::move(*bundle), pid == desktop.front});
  for (const pid_t candidate : desktop.frontCandidates) {
    auto application = std::find_if(applications.begin(), applications.end(),
                                    [&](const auto& running) { return running.pid == candidate; });
    if (application == applications.end()) continue;
    application->isFrontmost = true;
    break;
  }
  return applications;
}

}  // namespace qv::platform
