#include "platform/linux/FolderPhotoLibrary.h"

#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <mutex>
#include <utility>

#include "platform/linux/FileCopy.h"
#include "platform/linux/UserFolder.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr int kMaximumSameNames = 10000;

/// "movie.mp4", "movie 2.mp4", "movie 3.mp4", …
std::string numberedName(const std::filesystem::path& name, int attempt) {
  if (attempt >= kMaximumSameNames) return {};
  if (attempt == 0) return name;
  return name.stem().string() + " " + std::to_string(attempt + 1) + name.extension().string();
}

}  // namespace

struct FolderPhotoLibrary::Folder {
  const std::string path;
  const uid_t owner;
  std::once_flag swept;

  /// Removes copies that a former process did not finish. None of ours has begun yet.
  static void sweep(const FileDescriptor& directory) {
    for (const std::string& name : namesIn(directory)) {
      if (name.starts_with(kUnfinishedCopyPrefix)) ::unlinkat(directory.get(), name.c_str(), 0);
    }
  }

  std::optional<Error> add(const std::string& source) {
    const auto file = openRegularFile(source);
    if (!file) return file.error();
    const auto directory = openFolderOfUser(owner, path);
    if (!directory) return directory.error();
    std::call_once(swept, [&] { sweep(directory.value()); });
    const std::filesystem::path name = std::filesystem::path(source).filename();
    const auto copied = copyIntoDirectory(file.value(), directory.value(), owner,
                                          [&](int attempt) { return numberedName(name, attempt); });
    return copied ? std::nullopt : std::optional(copied.error());
  }
};

FolderPhotoLibrary::FolderPhotoLibrary(const std::string& directory, uid_t user, Executor& executor)
    : folder_(new Folder{directory, ::geteuid() == 0 ? user : ::geteuid(), {}}), executor_(executor) {}

void FolderPhotoLibrary::createAsset(const URL& file, PhotoResourceType type,
                                     std::function<void(const std::optional<Error>&)> completion) {
  executor_.post([folder = folder_, path = file.path(), type, completion = std::move(completion)] {
    std::optional<Error> error = Error::posix(EINVAL, "photo library");
    if (type == PhotoResourceType::Video && !path.empty()) error = folder->add(path);
    if (error) QV_LOG_ERROR(logs::kPlatform, "photo library: %s", error->description().c_str());
    if (completion) completion(error);
  });
}

}  // namespace qv::platform
