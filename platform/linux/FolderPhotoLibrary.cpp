#include "platform/linux/FolderPhotoLibrary.h"

#include <cerrno>
#include <filesystem>
#include <mutex>
#include <system_error>
#include <utility>

#include "platform/linux/FileCopy.h"
#include "platform/linux/SmallFile.h"
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
  std::once_flag swept;

  /// Removes copies that a former process did not finish. None of ours has begun yet.
  void sweep() const {
    std::error_code failure;
    for (const auto& entry : std::filesystem::directory_iterator(path, failure)) {
      if (!entry.path().filename().string().starts_with(kUnfinishedCopyPrefix)) continue;
      std::error_code ignored;
      std::filesystem::remove(entry.path(), ignored);
    }
  }

  std::optional<Error> add(const std::string& source) {
    const auto file = openRegularFile(source);
    if (!file) return file.error();
    if (auto error = makeDirectories(path)) return error;
    std::call_once(swept, [this] { sweep(); });
    const std::filesystem::path name = std::filesystem::path(source).filename();
    const auto copied = copyIntoDirectory(file.value(), path, [&](int attempt) { return numberedName(name, attempt); });
    return copied ? std::nullopt : std::optional(copied.error());
  }
};

FolderPhotoLibrary::FolderPhotoLibrary(const std::string& directory, Executor& executor)
    : folder_(new Folder{directory, {}}), executor_(executor) {}

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
