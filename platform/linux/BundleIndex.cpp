#include "platform/linux/BundleIndex.h"

#include <sys/stat.h>
#include <time.h>

#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/linux/DirectoryBundle.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

namespace fs = std::filesystem;

constexpr const char kInfoFile[] = "/Info.json";
constexpr const char kPlugIns[] = "/PlugIns";
constexpr int kMaximumDepth = 6;
constexpr int kMaximumDirectories = 1000;
constexpr int64_t kNanosecondsPerSecond = 1'000'000'000;
/// Longer than a tick of any file system's clock here.
constexpr int64_t kSettlingTime = 100'000'000;

int64_t nanoseconds(const timespec& time) { return time.tv_sec * kNanosecondsPerSecond + time.tv_nsec; }

/// Whether a directory may be a bundle, or hold some.
bool isWorthSearching(const fs::directory_entry& entry) {
  std::error_code failure;
  if (!entry.is_directory(failure) || entry.is_symlink(failure)) return false;
  const std::string name = entry.path().filename();
  return !name.starts_with('.') && !name.ends_with(kLocalizationSuffix) && name != "Resources";
}

}  // namespace

FileState FileState::of(const std::string& path, bool followsLink) {
  FileState state;
  struct stat info {};
  if ((followsLink ? ::stat(path.c_str(), &info) : ::lstat(path.c_str(), &info)) != 0) return state;
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  state.device_ = info.st_dev;
  state.inode_ = info.st_ino;
  state.changed_ = nanoseconds(info.st_ctim);
  state.isDirectory_ = S_ISDIR(info.st_mode);
  state.isSettled_ = nanoseconds(now) - state.changed_ > kSettlingTime;
  return state;
}

bool FileState::isStill(const FileState& now) const {
  return isSettled_ && device_ == now.device_ && inode_ == now.inode_ && changed_ == now.changed_;
}

struct BundleIndex::Node {
  std::string path;
  bool isRoot = false;  // never a bundle itself
  FileState info;
  FileState searched;
  BundleRef bundle;
  std::map<std::string, Node> children;  // by name
};

/// How far a search may still go. All that are below one entry of a root share `budget`.
struct BundleIndex::Search {
  int depth;
  int* budget;
};

BundleIndex::BundleIndex(std::vector<std::string> roots, Localization& localization)
    : roots_(std::move(roots)), localization_(localization), trees_(roots_.size()) {}

BundleIndex::~BundleIndex() = default;

BundleRef BundleIndex::find(const std::string& identifier) {
  if (identifier.empty()) return nullptr;
  std::lock_guard lock(mutex_);
  auto it = byIdentifier_.find(identifier);
  if (it == byIdentifier_.end() || !it->second->info.isStill(FileState::of(it->second->path + kInfoFile, true))) {
    refresh();
    it = byIdentifier_.find(identifier);
  }
  return it == byIdentifier_.end() ? nullptr : it->second->bundle;
}

std::vector<BundleRef> BundleIndex::all() {
  std::lock_guard lock(mutex_);
  refresh();
  std::vector<BundleRef> bundles;
  for (const auto& [path, bundle] : byPath_) bundles.push_back(bundle);
  return bundles;
}

void BundleIndex::refresh() {
  byIdentifier_.clear();
  byPath_.clear();
  for (size_t i = 0; i < roots_.size(); ++i) {
    auto& tree = trees_[i];
    const std::string path = canonicalPath(roots_[i]);
    if (!tree || tree->path != path) {
      tree = std::make_unique<Node>();
      tree->path = path;
      tree->isRoot = true;
    }
    if (path.empty()) continue;
    update(*tree, {.depth = 0, .budget = nullptr});
    collect(*tree);
  }
}

void BundleIndex::update(Node& node, Search search) {
  if (!node.isRoot) readInfo(node);
  const std::string directory = node.bundle ? node.path + kPlugIns : node.path;
  search.depth += node.bundle ? 2 : 1;
  const auto now = FileState::of(directory);
  if (!now.isDirectory() || search.depth > kMaximumDepth) return node.children.clear();
  if (!node.searched.isStill(now)) node.children = readEntries(directory, std::exchange(node.children, {}));
  node.searched = now;
  for (auto& [name, child] : node.children) {
    int ownBudget = kMaximumDirectories;
    updateChild(child, {.depth = search.depth, .budget = node.isRoot ? &ownBudget : search.budget});
  }
}

void BundleIndex::updateChild(Node& child, Search search) {
  if (--*search.budget >= 0) return update(child, search);
  child.bundle = nullptr;
  child.info = {};
  child.children.clear();
  child.searched = {};
  if (const auto number = unsearched_.count()) {
    QV_LOG_ERROR(logs::kPlatform, "too many directories, such as %s is not searched (%llu times)", child.path.c_str(),
                 static_cast<unsigned long long>(*number));
  }
}

void BundleIndex::readInfo(Node& node) {
  const auto info = FileState::of(node.path + kInfoFile, true);
  if (node.info.isStill(info)) return;
  node.bundle = info.exists() ? std::make_shared<const DirectoryBundle>(node.path, localization_) : nullptr;
  node.info = info;
}

/// Of those that were known, what is known stays.
std::map<std::string, BundleIndex::Node> BundleIndex::readEntries(const std::string& directory,
                                                                  std::map<std::string, Node> known) {
  std::map<std::string, Node> entries;
  std::error_code failure;
  for (fs::directory_iterator it(directory, failure), end; !failure && it != end; it.increment(failure)) {
    if (!isWorthSearching(*it)) continue;
    const std::string name = it->path().filename();
    auto former = known.extract(name);
    // A directory that became a bundle, or was one, had others below it.
    if (former && former.mapped().path == it->path()) {
      entries.insert(std::move(former));
    } else {
      entries[name].path = it->path();
    }
  }
  return entries;
}

void BundleIndex::collect(const Node& node) {
  // A root may be given twice, or lie in another.
  if (node.bundle && byPath_.emplace(node.path, node.bundle).second) {
    byIdentifier_.emplace(node.bundle->bundleIdentifier(), &node);
  }
  for (const auto& [name, child] : node.children) collect(child);
}

}  // namespace qv::platform
