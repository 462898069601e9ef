#include "tools/quorvelctl/DaemonStatus.h"

#include <grp.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <future>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

using nlohmann::json;

namespace {

constexpr std::chrono::seconds kPatience{20};

json toJSON(const quorvel::Dictionary& dictionary);

json toJSON(const quorvel::Value& value) {
  struct Visitor {
    json operator()(std::monostate) const { return nullptr; }
    json operator()(const std::vector<uint8_t>& bytes) const { return bytes.size(); }
    json operator()(const quorvel::Value::Array& array) const {
      json list = json::array();
      for (const auto& entry : array) list.push_back(toJSON(entry));
      return list;
    }
    json operator()(const quorvel::Dictionary& dictionary) const { return toJSON(dictionary); }
    json operator()(bool content) const { return content; }
    json operator()(int64_t content) const { return content; }
    json operator()(double content) const { return content; }
    json operator()(const std::string& content) const { return content; }
  };
  return std::visit(Visitor(), value.content);
}

json toJSON(const quorvel::Dictionary& dictionary) {
  json object = json::object();
  for (const auto& [key, value] : dictionary) object[key] = toJSON(value);
  return object;
}

std::string socketPath() {
  const char* directory = std::getenv("XDG_RUNTIME_DIR");
  return (directory != nullptr && *directory != '\0' ? std::string(directory) : "/run") + "/com.tarnwick.quorveld";
}

std::string adviceForRights(const std::string& path) {
  struct stat entry {};
  const group* members = ::stat(path.c_str(), &entry) == 0 ? ::getgrgid(entry.st_gid) : nullptr;
  return "you may not connect to " + path + "; become a member of the group " +
         (members != nullptr ? members->gr_name : "of the socket") + ", or use sudo";
}

Failure failureFor(const quorvel::Error& error) {
  if (error.code == quorvel::kErrorConnectionInvalid) {
    const std::string why = whyUnreachable();
    return {Exit::NoDaemon,
            why.empty() ? "the daemon closes the connection: its log says why (journalctl -u quorveld)" : why};
  }
  if (error.code == quorvel::kErrorConnectionInterrupted) {
    return {Exit::DaemonLost, "the daemon went away: its log says why (journalctl -u quorveld)"};
  }
  if (error.text.find("Error.Unknown") != std::string::npos) {
    return {Exit::Failed, "the daemon is older than this program and tells nothing of itself: update quorveld"};
  }
  return {Exit::Failed, error.text};
}

}  // namespace

std::string whyUnreachable() {
  const std::string path = socketPath();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path)
    return "XDG_RUNTIME_DIR is too long a path for a socket; set it as the daemon has it";
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const int result = ::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
  const int error = result == 0 ? 0 : errno;
  ::close(socket);
  switch (error) {
    case 0:
      return {};
    case ENOENT:
      return "no daemon: there is no " + path +
             "; start it (systemctl start quorveld.socket), or set XDG_RUNTIME_DIR as it has it";
    case ECONNREFUSED:
      return "nobody answers at " + path + ": the daemon has ended; start it anew (systemctl restart quorveld.socket)";
    case EACCES:
    case EPERM:
      return adviceForRights(path);
    default:
      return path + " cannot be connected to: " + std::strerror(error) + "; restart quorveld.socket";
  }
}

DaemonStatus::DaemonStatus() : reader_(quorvel::StatusReader::create()) {}

json DaemonStatus::answer(const Ask& ask) {
  const auto promise = std::make_shared<std::promise<quorvel::StatusResult>>();
  auto answered = promise->get_future();
  ask([promise](quorvel::StatusResult result) { promise->set_value(std::move(result)); });
  if (answered.wait_for(kPatience) != std::future_status::ready) {
    throw Failure{Exit::DaemonLost, "the daemon does not answer: restart it (systemctl restart quorveld)"};
  }
  const quorvel::StatusResult result = answered.get();
  if (result.error) throw failureFor(*result.error);
  json list = json::array();
  for (const auto& entry : result.entries) list.push_back(toJSON(entry));
  return list;
}

json DaemonStatus::recordings() {
  return answer([&](auto handler) { reader_->recordings(std::move(handler)); });
}

json DaemonStatus::startConditions(const std::string& bundleID, bool system, bool microphone) {
  return answer([&](auto handler) { reader_->startConditions(bundleID, system, microphone, std::move(handler)); });
}

json DaemonStatus::movies() {
  return answer([&](auto handler) { reader_->movies(std::move(handler)); });
}

json DaemonStatus::device() {
  const json list = answer([&](auto handler) { reader_->device(std::move(handler)); });
  return list.empty() ? json::object() : list.front();
}

}  // namespace ctl
