#include "platform/x11/ClientWindows.h"

#include <xcb/res.h>

namespace qv::platform {
namespace {

bool windowExists(XcbConnection& connection, xcb_window_t window) {
  return connection.await<xcb_get_window_attributes_reply_t>(xcb_get_window_attributes(connection.get(), window)) !=
         nullptr;
}

/// The process id of the only entry of a client id reply.
std::optional<pid_t> singleProcess(const xcb_res_query_client_ids_reply_t& reply) {
  auto entries = xcb_res_query_client_ids_ids_iterator(&reply);
  if (entries.rem != 1) return std::nullopt;
  const xcb_res_client_id_value_t* entry = entries.data;
  if ((entry->spec.mask & XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID) == 0) return std::nullopt;
  if (xcb_res_client_id_value_value_length(entry) < 1) return std::nullopt;
  const auto pid = static_cast<pid_t>(*xcb_res_client_id_value_value(entry));
  if (pid <= 0) return std::nullopt;
  return pid;
}

}  // namespace

std::optional<pid_t> processOfWindow(XcbConnection& connection, xcb_window_t window) {
  // Id 0 would list every client. An id that is no window, but within a client's range, would
  // name that client; and the range of a client that died is given to the next one that connects.
  // Hence the two looks at the window itself, before and after.
  if (window == XCB_NONE || window == connection.root() || !connection.hasExtension(xcb_res_id)) return std::nullopt;
  if (!windowExists(connection, window)) return std::nullopt;
  xcb_res_client_id_spec_t spec{window, XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID};
  auto reply = connection.await<xcb_res_query_client_ids_reply_t>(xcb_res_query_client_ids(connection.get(), 1, &spec));
  if (!reply) return std::nullopt;
  auto process = singleProcess(*reply);
  if (!process || !windowExists(connection, window)) return std::nullopt;
  return process;
}

std::map<xcb_window_t, pid_t> processesOfWindows(XcbConnection& connection, const std::vector<xcb_window_t>& windows) {
  if (windows.empty() || !connection.hasExtension(xcb_res_id)) return {};
  std::vector<xcb_res_client_id_spec_t> specs;
  for (const xcb_window_t window : windows)
    if (window != XCB_NONE) specs.push_back({window, XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID});
  auto reply = connection.await<xcb_res_query_client_ids_reply_t>(
      xcb_res_query_client_ids(connection.get(), static_cast<uint32_t>(specs.size()), specs.data()));
  if (!reply) return {};
  // An entry names its client by the base of the client's range of ids.
  std::map<uint32_t, pid_t> byClient;
  for (auto entries = xcb_res_query_client_ids_ids_iterator(reply.get()); entries.rem > 0;
       xcb_res_client_id_value_next(&entries))
    if (xcb_res_client_id_value_value_length(entries.data) >= 1)
      byClient[entries.data->spec.client] = static_cast<pid_t>(*xcb_res_client_id_value_value(entries.data));
  std::map<xcb_window_t, pid_t> processes;
  for (const xcb_window_t window : windows) {
    auto client = byClient.find(window & ~connection.setup().resource_id_mask);
    if (client != byClient.end() && client->second > 0) processes[window] = client->second;
  }
  return processes;
}

}  // namespace qv::platform
