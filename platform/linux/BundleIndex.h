#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/Bundles.h"
#include "platform/Localization.h"
#include "platform/threads/RareLog.h"

namespace qv::platform {

/// What a file or directory was when it was last looked at.
class FileState {
 public:
  [[nodiscard]] static FileState of(const std::string& path, bool followsLink = false);
  [[nodiscard]] bool isDirectory() const { return isDirectory_; }
  [[nodiscard]] bool exists() const { return inode_ != 0; }
  /// Whether what was read after this look is surely what is there at `now`. Not of one that had just changed: it may
  /// have changed again within a tick of the file system's clock.
  [[nodiscard]] bool isStill(const FileState& now) const;

 private:
  uint64_t device_ = 0, inode_ = 0;
  int64_t changed_ = 0;  // ns
  bool isDirectory_ = false;
  bool isSettled_ = true;
};

/// The bundles below some directories. They are found once; after that only directories that changed are read again.
/// Links are not followed, and at most 1000 directories are searched below each entry of a root, to a depth of 6: so
/// no bundle hides another one.
///
/// Threading: thread-safe, blocking. One search goes on at a time.
class BundleIndex {
 public:
  BundleIndex(std::vector<std::string> roots, Localization& localization);
  ~BundleIndex();
  /// Costs one look at the disk where it finds what it knows; otherwise one at each known directory.
  [[nodiscard]] BundleRef find(const std::string& identifier);
  /// Sorted by path.
  [[nodiscard]] std::vector<BundleRef> all();

 private:
  struct Node;
  struct Search;
  void refresh();
  void update(Node& node, Search search);
  void updateChild(Node& child, Search search);
  void readInfo(Node& node);
  static std::map<std::string, Node> readEntries(const std::string& directory, std::map<std::string, Node> known);
  void collect(const Node& node);

  const std::vector<std::string> roots_;
  Localization& localization_;
  platform::RareLog unsearched_;
  std::mutex mutex_;                          ///< for all below
  std::vector<std::unique_ptr<Node>> trees_;  ///< one for each root
  std::map<std::string, const Node*> byIdentifier_;
  std::map<std::string, BundleRef> byPath_;
};

}  // namespace qv::platform
