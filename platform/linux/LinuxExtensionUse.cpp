#include "platform/linux/LinuxExtensionUse.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace qv::platform {
namespace {

constexpr const char kReadOnlyTokenClass[] = "com.tarnwick.quorveld.read-only";

}  // namespace

std::shared_ptr<ExtensionProcesses> ExtensionProcesses::create(std::shared_ptr<ExtensionHost> host,
                                                               ExtensionRecordRef extension) {
  std::shared_ptr<ExtensionProcesses> processes(new ExtensionProcesses(host, std::move(extension)));
  host->uses.with([&](auto& uses) {
    const auto isSame = [&](const auto& use) {
      return use->extension_->identifier == processes->extension_->identifier;
    };
    processes->isBeyondBound_ = std::count_if(uses.begin(), uses.end(), isSame) >= std::ptrdiff_t{kMaximumUses};
    uses.insert(processes);
  });
  return processes;
}

ExtensionProcesses::ExtensionProcesses(const std::shared_ptr<ExtensionHost>& host, ExtensionRecordRef extension)
    : queue(std::make_shared<SerialQueue>("com.tarnwick.quorveld.extension", host->executor)),
      host_(host),
      extension_(std::move(extension)) {}

void ExtensionProcesses::begin(ExtensionRequestID request, std::vector<ExtensionItem> items,
                               ExtensionRequestHandlers handlers) {
  if (!isBeyondBound_ && !hasEnded_) {
    processForRequests().begin(request, std::move(items), std::move(handlers));
  } else if (handlers.began) {
    handlers.began(request, Error::posix(hasEnded_ ? ESHUTDOWN : EBUSY, "extension " + extension_->identifier));
  }
}

LinuxExtensionProcess& ExtensionProcesses::processForRequests() {
  if (all_.empty() || all_.back()->isEnding()) {
    all_.push_back(LinuxExtensionProcess::create(
        host_.lock(), tokens, queue, extension_,
        // Not within its own call.
        [queue = queue, weak = weak_from_this()](LinuxExtensionProcess* ended) {
          queue->async(weak, [ended](ExtensionProcesses& processes) { processes.processEnded(ended); });
        }));
  }
  return *all_.back();
}

void ExtensionProcesses::processEnded(const LinuxExtensionProcess* ended) {
  std::erase_if(all_, [&](const auto& process) { return process.get() == ended; });
  leaveWhenDead();
}

void ExtensionProcesses::endUse() {
  hasEnded_ = true;
  for (const auto& process : all_) process->terminate();
  leaveWhenDead();
}

void ExtensionProcesses::endAtOnce() {
  hasEnded_ = true;
  all_.clear();
}

void ExtensionProcesses::leaveWhenDead() {
  const auto host = host_.lock();
  if (!hasEnded_ || !all_.empty() || !host) return;
  host->uses.with([&](auto& uses) { uses.erase(shared_from_this()); });
}

LinuxExtensionUse::LinuxExtensionUse(std::shared_ptr<ExtensionHost> host, ExtensionRecordRef extension)
    : host_(std::move(host)), processes_(ExtensionProcesses::create(host_, std::move(extension))) {}

LinuxExtensionUse::~LinuxExtensionUse() {
  processes_->queue->async(std::weak_ptr(processes_), [](ExtensionProcesses& processes) { processes.endUse(); });
}

void LinuxExtensionUse::beginRequest(std::vector<ExtensionItem> inputItems, ExtensionRequestHandlers handlers) {
  const ExtensionRequestID request = ++host_->lastRequest;
  processes_->queue->async(
      std::weak_ptr(processes_),
      [request, items = std::move(inputItems), handlers = std::move(handlers)](ExtensionProcesses& processes) mutable {
        processes.begin(request, std::move(items), std::move(handlers));
      });
}

std::optional<std::string> LinuxExtensionUse::issueSandboxToken(const std::string& tokenClass,
                                                                const std::string& path) {
  if (tokenClass != kReadOnlyTokenClass) return std::nullopt;
  return processes_->tokens->issue(path);
}

void LinuxExtensionUse::revokeSandboxToken(const std::string& token) { processes_->tokens->revoke(token); }

}  // namespace qv::platform
