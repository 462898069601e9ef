#pragma once

#include <cerrno>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/FileSystem.h"

namespace qv::fakes {

/// A disk in memory. Doubled and trailing separators are read as one, as on a disk. Directories
/// list in the order in which their entries were made. "/" exists.
///
/// Threading: thread-safe.
class FakeFileSystem final : public platform::FileSystem {
 public:
  enum class Operation { CreateDirectory, List, Attributes, Remove, Move, FreeSize, Read };

  FakeFileSystem() { add("/", {4096, {}, {}, true}, {}); }

  /// Makes a file, and the directories above it.
  void addFile(const std::string& path, const std::string& content, platform::Date modified = {},
               std::optional<platform::Date> created = std::nullopt) {
    std::lock_guard lock(mutex_);
    addParents(normal(path));
    add(normal(path), {content.size(), modified, created.value_or(modified), false}, content);
  }
  /// Makes a file of a size, without content.
  void addFileOfSize(const std::string& path, uint64_t size, platform::Date modified = {}) {
    std::lock_guard lock(mutex_);
    addParents(normal(path));
    add(normal(path), {size, modified, modified, false}, {});
  }
  /// Makes a directory (whose entry has the size `size`), and those above it.
  void addDirectory(const std::string& path, uint64_t size = 4096, platform::Date modified = {}) {
    std::lock_guard lock(mutex_);
    addParents(normal(path));
    add(normal(path), {size, modified, modified, true}, {});
  }
  /// Every later `operation` on `path` fails with this errno; 0 lets it work again.
  void failOn(Operation operation, const std::string& path, int errnum) {
    std::lock_guard lock(mutex_);
    failures_[{operation, normal(path)}] = errnum;
  }
  void setFreeSize(uint64_t bytes) {
    std::lock_guard lock(mutex_);
    freeSize_ = bytes;
  }
  /// How often something was changed or asked for (itemExists is not counted).
  [[nodiscard]] size_t operations() const {
    std::lock_guard lock(mutex_);
    return operations_;
  }

  bool itemExists(const std::string& path) override {
    std::lock_guard lock(mutex_);
    return find(normal(path)) != nullptr;
  }

  std::optional<platform::Error> createDirectory(const std::string& path) override {
    std::lock_guard lock(mutex_);
    const std::string at = normal(path);
    if (auto error = begin(Operation::CreateDirectory, at)) return error;
    if (find(at)) return platform::Error::posix(EEXIST, at);
    const Entry* parent = find(parentOf(at));
    if (!parent) return platform::Error::posix(ENOENT, at);
    if (!parent->attributes.isDirectory) return platform::Error::posix(ENOTDIR, at);
    add(at, {4096, {}, {}, true}, {});
    return std::nullopt;
  }

  platform::Result<std::vector<std::string>> contentsOfDirectory(const std::string& path) override {
    using Names = std::vector<std::string>;
    return of<Names>(Operation::List, path, [this](const Entry& directory) -> platform::Result<Names> {
      if (!directory.attributes.isDirectory) return platform::Error::posix(ENOTDIR, directory.path);
      Names names;
      for (const Entry& entry : entries_) {
        if (entry.path != "/" && parentOf(entry.path) == directory.path)
          names.push_back(entry.path.substr(entry.path.rfind('/') + 1));
      }
      return names;
    });
  }

  platform::Result<platform::FileAttributes> attributesOfItem(const std::string& path) override {
    return of<platform::FileAttributes>(Operation::Attributes, path,
                                        [](const Entry& entry) { return entry.attributes; });
  }

  std::optional<platform::Error> removeItem(const std::string& path) override {
    std::lock_guard lock(mutex_);
    const std::string at = normal(path);
    if (auto error = begin(Operation::Remove, at)) return error;
    if (!find(at)) return platform::Error::posix(ENOENT, at);
    std::erase_if(entries_, [&](const Entry& entry) { return entry.path == at || entry.path.starts_with(at + "/"); });
    return std::nullopt;
  }

  std::optional<platform::Error> moveItem(const std::string& source, const std::string& destination) override {
    std::lock_guard lock(mutex_);
    const std::string from = normal(source);
    const std::string to = normal(destination);
    if (auto error = begin(Operation::Move, from)) return error;
    if (!find(from)) return platform::Error::posix(ENOENT, from);
    if (find(to)) return platform::Error::posix(EEXIST, to);
    if (!find(parentOf(to))) return platform::Error::posix(ENOENT, to);
    for (Entry& entry : entries_) {
      if (entry.path == from || entry.path.starts_with(from + "/")) entry.path = to + entry.path.substr(from.size());
    }
    return std::nullopt;
  }

  platform::Result<uint64_t> freeSizeOfFileSystem(const std::string& path) override {
    return of<uint64_t>(Operation::FreeSize, path, [this](const Entry&) { return freeSize_; });
  }

  platform::Result<std::string> readFile(const std::string& path) override {
    return of<std::string>(Operation::Read, path, [](const Entry& entry) -> platform::Result<std::string> {
      if (entry.attributes.isDirectory) return platform::Error::posix(EISDIR, entry.path);
      return entry.content;
    });
  }

 private:
  struct Entry {
    std::string path;
    platform::FileAttributes attributes;
    std::string content;
  };

  /// What `operation` finds out of an entry that is there.
  template <typename T, typename Read>
  platform::Result<T> of(Operation operation, const std::string& path, const Read& read) {
    std::lock_guard lock(mutex_);
    const std::string at = normal(path);
    if (auto error = begin(operation, at)) return *error;
    const Entry* entry = find(at);
    if (!entry) return platform::Error::posix(ENOENT, at);
    return read(*entry);
  }
  static std::string normal(const std::string& path) {
    std::string out;
    for (const char c : path) {
      if (c != '/' || out.empty() || out.back() != '/') out += c;
    }
    if (out.size() > 1 && out.back() == '/') out.pop_back();
    return out;
  }
  static std::string parentOf(const std::string& path) {
    const size_t slash = path.rfind('/');
    return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
  }
  const Entry* find(const std::string& path) const {
    for (const Entry& entry : entries_) {
      if (entry.path == path) return &entry;
    }
    return nullptr;
  }
  void add(const std::string& path, platform::FileAttributes attributes, const std::string& content) {
    std::erase_if(entries_, [&](const Entry& entry) { return entry.path == path; });
    entries_.push_back({path, attributes, content});
  }
  void addParents(const std::string& path) {
    const std::string parent = parentOf(path);
    if (find(parent)) return;
    addParents(parent);
    add(parent, {4096, {}, {}, true}, {});
  }
  std::optional<platform::Error> begin(Operation operation, const std::string& path) {
    ++operations_;
    const auto it = failures_.find({operation, path});
    if (it == failures_.end() || it->second == 0) return std::nullopt;
    return platform::Error::posix(it->second, path);
  }

  mutable std::mutex mutex_;
  std::vector<Entry> entries_;
  std::map<std::pair<Operation, std::string>, int> failures_;
  size_t operations_ = 0;
  uint64_t freeSize_ = 10'000'000'000;
};

}  // namespace qv::fakes
