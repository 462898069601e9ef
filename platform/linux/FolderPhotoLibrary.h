#pragma once

#include <sys/types.h>

#include <memory>
#include <string>

#include "platform/PhotoLibrary.h"
#include "platform/threads/Executor.h"

namespace qv::platform {

/// A photo library that is a folder of movies, made at the first use. A movie keeps its name; where that is taken, "
/// 2", " 3", … stands before the extension. Only regular files are taken. Folder and movies are the user's, and nobody
/// else reads them; of a process that is not root they are its own user's.
///
/// Threading: thread-safe; the copying and the completion run on the executor.
class FolderPhotoLibrary final : public PhotoLibrary {
 public:
  FolderPhotoLibrary(const std::string& directory, uid_t user, Executor& executor);
  void createAsset(const URL& file, PhotoResourceType type,
                   std::function<void(const std::optional<Error>&)> completion) override;

 private:
  struct Folder;
  const std::shared_ptr<Folder> folder_;  // shared with copies that are going on
  Executor& executor_;
};

}  // namespace qv::platform
