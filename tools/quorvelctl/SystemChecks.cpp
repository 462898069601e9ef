#include "tools/quorvelctl/SystemChecks.h"

#include <linux/landlock.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "tools/quorvelctl/DaemonStatus.h"
#include "tools/quorvelctl/Failure.h"
#include "tools/quorvelctl/RecorderProcess.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;
using State = Finding::State;

namespace {

Finding socket() {
  const std::string why = whyUnreachable();
  if (why.empty()) return {"daemon", State::Fine, "its socket takes connections"};
  const size_t end = std::min(why.find("; "), why.size());
  return {"daemon", State::Fault, why.substr(0, end), why.substr(std::min(end + 2, why.size()))};
}

Finding recorder() {
  const std::string path = RecorderProcess::path();
  if (!path.empty()) return {"recorder", State::Fine, path};
  return {"recorder", State::Fault, "Quorvelctl.app is in no directory of bundles",
          "install it below /System/Applications, or name its directory in QUORVEL_BUNDLE_PATH, for the daemon too"};
}

/// What confines extensions; without it the daemon runs none.
Finding landlock() {
  const long version = ::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  if (version >= 1) return {"landlock", State::Fine, "version " + std::to_string(version)};
  return {"landlock", State::Fault, "the kernel has no Landlock, so no broadcast extension runs",
          "boot a kernel with CONFIG_SECURITY_LANDLOCK, and with landlock in lsm="};
}

Finding seccomp() {
  std::ifstream file("/proc/sys/kernel/seccomp/actions_avail");
  std::string actions;
  if (std::getline(file, actions) && actions.find("errno") != std::string::npos)
    return {"seccomp", State::Fine, "there"};
  return {"seccomp", State::Fault, "the kernel filters no system calls, so no broadcast extension runs",
          "boot a kernel with CONFIG_SECCOMP_FILTER"};
}

Finding cgroups() {
  std::error_code error;
  if (std::filesystem::exists("/sys/fs/cgroup/cgroup.controllers", error)) return {"cgroups", State::Fine, "version 2"};
  return {"cgroups", State::Unknown, "no cgroups of version 2: extensions' processor time is not bounded"};
}

/// `service`: of the answer; `advice`: where nobody answers.
Finding service(const json& device, const char* name, const char* instead, const char* advice) {
  const json state = device.value(name, json::object());
  const std::string backend = printable(state.value("backend", "?"));
  if (state.contains("fault")) {
    return {name, State::Fault, backend + ": " + printable(state.value("fault", "")), advice};
  }
  if (backend == "headless") return {name, State::Fault, instead, advice};
  return {name, State::Fine, backend};
}

Finding condition(const json& each, const char* advice) {
  const std::string name = each.value("condition", "?");
  const std::string text = printable(each.value("text", ""));
  if (each.value("met", false)) return {name, State::Fine, text};
  return {name, State::Fault, text, advice};
}

void addRights(std::vector<Finding>& findings, DaemonStatus& daemon) {
  for (const json& each : daemon.startConditions(kOwnBundle, true, false)) {
    const std::string name = each.value("condition", "");
    if (name == "bundle") {
      findings.push_back(condition(
          each, "the daemon must find Quorvelctl.app: below /System/Applications, or in its QUORVEL_BUNDLE_PATH"));
    }
    if (name == "entitlement") {
      findings.push_back(condition(each,
                                   "install /etc/quorvel/entitlements/com.tarnwick.quorvelctl.json, root's and "
                                   "writable by nobody else; \"users\" in it names who"));
    }
  }
}

Finding user(const json& device) {
  const int64_t user = device.value("userIdentifier", int64_t{0});
  if (user == 0) return {"user", State::Fine, "the daemon is root's"};
  return {"user", State::Unknown,
          "the daemon runs as user " + std::to_string(user) + ": extensions run as that user too"};
}

Finding texts(const json& device) {
  if (device.value("hasTexts", false)) return {"texts", State::Fine, "installed"};
  return {"texts", State::Fault, "users see keys in place of texts",
          "install /System/Library/Frameworks/Quorvel.framework"};
}

}  // namespace

std::vector<Finding> checkSystem() { return {socket(), recorder(), landlock(), seccomp(), cgroups()}; }

std::vector<Finding> checkDaemon() {
  DaemonStatus daemon;
  const json device = daemon.device();
  const std::string version = printable(device.value("version", "?"));
  std::vector<Finding> findings{version == CTL_VERSION
                                    ? Finding{"version", State::Fine, version}
                                    : Finding{"version", State::Fault,
                                              "the daemon is " + version + ", quorvelctl " CTL_VERSION,
                                              "install both from one build, and restart the daemon"}};
  findings.push_back(user(device));
  findings.push_back(service(device, "display",
                             "no display was there when the daemon started: it records a test picture",
                             "set DISPLAY (and XAUTHORITY) in /etc/quorvel/session.env, and restart the daemon"));
  findings.push_back(service(device, "sound", "no sound server answers: it records a tone",
                             "start PulseAudio, or name its socket by PULSE_SERVER in /etc/quorvel/session.env"));
  findings.push_back(service(device, "encoder", "",
                             "install quorveld-movies.so anew: it belongs beside the daemon, or in lib/quorveld"));
  findings.push_back(condition(device.value("store", json::object()),
                               "make it a directory of the daemon's user, on a disk that can be written"));
  findings.push_back(condition(device.value("space", json::object()), "remove files from that disk"));
  addRights(findings, daemon);
  findings.push_back(texts(device));
  return findings;
}

}  // namespace ctl
