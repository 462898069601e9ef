#include "tests/x11/XServer.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <sstream>
#include <stdexcept>
#include <utility>

extern char** environ;

namespace qv::platform::testing {
namespace {

/// The server loses the damage of rectangles that end beyond 32767.
constexpr uint16_t kWideEnough = 4096;

std::vector<char*> pointers(const std::vector<std::string>& strings) {
  std::vector<char*> result;
  for (const auto& string : strings) result.push_back(const_cast<char*>(string.c_str()));
  return result;
}

}  // namespace

ChildProcess::ChildProcess(const std::vector<std::string>& arguments, const std::vector<std::string>& environment,
                           int inheritedFd, int outputFd) {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
  if (outputFd >= 0)
    posix_spawn_file_actions_adddup2(&actions, outputFd, 1);
  else
    posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  if (inheritedFd >= 0) posix_spawn_file_actions_adddup2(&actions, inheritedFd, inheritedFd);
  auto argv = pointers(arguments);
  argv.push_back(nullptr);
  auto envp = pointers(environment);
  for (char** entry = environ; *entry != nullptr; ++entry)
    if (std::strncmp(*entry, "DISPLAY=", 8) != 0) envp.push_back(*entry);
  envp.push_back(nullptr);
  const int failure = posix_spawnp(&pid_, argv[0], &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  if (failure != 0) throw std::runtime_error("cannot start " + arguments[0]);
}

void ChildProcess::kill() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGKILL);
  wait();
}

int ChildProcess::wait() {
  int status = 0;
  if (pid_ <= 0 || ::waitpid(pid_, &status, 0) != pid_) return -1;
  pid_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

OutputPipe::OutputPipe() {
  if (::pipe2(ends_, O_CLOEXEC) != 0) throw std::runtime_error("pipe");
}

OutputPipe::~OutputPipe() {
  ::close(ends_[0]);
  closeWriteEnd();
}

void OutputPipe::closeWriteEnd() {
  if (ends_[1] >= 0) ::close(std::exchange(ends_[1], -1));
}

std::string OutputPipe::read(size_t size) {
  closeWriteEnd();
  std::string bytes;
  bytes.resize(size);
  size_t length = 0;
  while (length < size) {
    const ssize_t got = ::read(ends_[0], bytes.data() + length, size - length);
    if (got <= 0) break;
    length += static_cast<size_t>(got);
  }
  bytes.resize(length);
  return bytes;
}

std::string OutputPipe::readLine() {
  std::string line;
  for (std::string next = read(1); !next.empty() && next != "\n"; next = read(1)) line += next;
  return line;
}

bool hasProgram(const std::string& name) {
  std::istringstream directories(std::getenv("PATH"));
  for (std::string directory; std::getline(directories, directory, ':');)
    if (::access((directory + "/" + name).c_str(), X_OK) == 0) return true;
  return false;
}

XServer::XServer() {
  OutputPipe output;
  process_ = std::make_unique<ChildProcess>(
      std::vector<std::string>{"Xvfb", "-displayfd", std::to_string(output.writeEnd()), "-screen", "0", "640x480x24",
                               "-nolisten", "tcp", "-noreset"},
      std::vector<std::string>{}, output.writeEnd());
  const std::string number = output.readLine();
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

void XClient::resize(xcb_window_t window, uint16_t width, uint16_t height) {
  const uint32_t values[] = {width, height};
  xcb_configure_window(connection_, window, XCB_CONFIG_WINDOW_WIDTH | XCB_CONFIG_WINDOW_HEIGHT, values);
  sync();
}

void XClient::move(xcb_window_t window, int16_t x, int16_t y) {
  const uint32_t values[] = {static_cast<uint32_t>(x), static_cast<uint32_t>(y)};
  xcb_configure_window(connection_, window, XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y, values);
  sync();
}

void XClient::raise(xcb_window_t window) {
  const uint32_t value = XCB_STACK_MODE_ABOVE;
  xcb_configure_window(connection_, window, XCB_CONFIG_WINDOW_STACK_MODE, &value);
  sync();
}

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
  ChildProcess request({"timeout", "60", "xdotool", "windowactivate", "--sync", std::to_string(window)},
                       {"DISPLAY=" + display});
  return request.wait() == 0;
}

WindowManager::WindowManager(const std::string& display) : client_(display) {
  // The command runs as the last thing before its main loop.
  process_ = std::make_unique<ChildProcess>(std::vector<std::string>{"openbox", "--sm-disable", "--startup", "echo up"},
                                            std::vector<std::string>{"DISPLAY=" + display}, -1, output_.writeEnd());
  std::string line;  // it writes messages as well
  do {
    line = output_.readLine();
    if (line.empty()) throw std::runtime_error("the window manager did not start");
  } while (line != "up");
  const std::string check = client_.property(client_.root(), "_NET_SUPPORTING_WM_CHECK");
  if (check.size() == sizeof window_) std::memcpy(&window_, check.data(), sizeof window_);
}

void WindowManager::kill() {
  process_->kill();
  client_.waitForEnd(window_);
}

WindowProcess::WindowProcess(const std::string& display) {
  OutputPipe output;
  process_ = std::make_unique<ChildProcess>(std::vector<std::string>{X11_TEST_WINDOW_PROGRAM, display},
                                            std::vector<std::string>{}, -1, output.writeEnd());
  pid_ = process_->pid();
  const std::string id = output.read(sizeof window_);
  if (id.size() != sizeof window_) throw std::runtime_error("no window");
  std::memcpy(&window_, id.data(), sizeof window_);
}

void XServerTest::SetUpTestSuite() {
  if (hasProgram("Xvfb")) server_ = std::make_unique<XServer>();
}

void XServerTest::TearDownTestSuite() { server_.reset(); }

void XServerTest::SetUp() {
  if (!server_) GTEST_SKIP() << "Xvfb is not installed";
}

}  // namespace qv::platform::testing
