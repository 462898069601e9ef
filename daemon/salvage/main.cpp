// What crashes left in the temporary store, for quorvelctl, which may name no part of the daemon:
//
//   quorveld-salvage              every movie, and changes nothing
//   quorveld-salvage NAME...      finishes these where that can be done, and keeps them as the daemon does at its start
//
// Run by root it becomes the user whose store it is. A daemon may run meanwhile: whatever somebody records or finishes
// is locked. For each movie it prints four texts, each ended by NUL: its name as it is now, what it is (below), its
// seconds where they are known, and what is wrong. Where the store itself cannot be read there is one, without a name,
// and the end is 1.
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/DeviceRoot.h"
#include "platform/linux/ICULocalization.h"
#include "platform/linux/JSONPreferenceStore.h"
#include "platform/linux/PosixFileSystem.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/threads/Log.h"
#include "support/QVDeviceLayout.h"
#include "support/QVUnfinishedMovies.h"

namespace {

using namespace qv;

const char* wordFor(StoredMovie::Fate fate) {
  using enum StoredMovie::Fate;
  switch (fate) {
    case Finished:
      return "finished";
    case Recovered:
      return "recovered";
    case Mended:
      return "mended";
    case Unfinished:
      return "unfinished";
    case InUse:
      return "in use";
    case Removed:
      return "removed";
    case Damaged:
      return "damaged";
    case Unreadable:
      break;
  }
  return "unreadable";
}

void print(const std::string& text) { std::fwrite(text.c_str(), 1, text.size() + 1, stdout); }

void print(const StoredMovie& movie) {
  print(movie.name);
  print(wordFor(movie.fate));
  print(movie.seconds ? std::to_string(*movie.seconds) : "");
  print(movie.error ? movie.error->localizedDescription() : "");
}

/// Names are entries of the store, and no way out of it.
bool isName(std::string_view text) { return !text.empty() && text.find('/') == std::string_view::npos; }

/// So that root touches nothing that the store's owner could have put in the way.
bool becomeOwnerOf(const std::string& store) {
  struct stat info {};
  if (::geteuid() != 0 || ::lstat(store.c_str(), &info) != 0 || info.st_uid == 0) return true;
  return ::setgroups(0, nullptr) == 0 && ::setresgid(info.st_gid, info.st_gid, info.st_gid) == 0 &&
         ::setresuid(info.st_uid, info.st_uid, info.st_uid) == 0;
}

int look(QVUnfinishedMovies& unfinished) {
  const auto movies = unfinished.movies();
  if (!movies) print(StoredMovie{"", StoredMovie::Fate::Unreadable, std::nullopt, movies.error()});
  if (!movies) return EXIT_FAILURE;
  for (const StoredMovie& movie : movies.value()) print(movie);
  return EXIT_SUCCESS;
}

}  // namespace

int main(int argc, char** argv) {
  platform::PosixFileSystem disk;
  platform::Platform platform;
  platform.deviceRoot = platform::deviceRootFromEnvironment();
  platform.fileSystem = &disk;
  platform::JSONPreferenceStore preferences(platform.deviceRoot + kPreferencesDirectory);
  platform::ICULocalization localization(preferences, kPreferenceDomain);
  platform::mp4::MP4MovieSalvage salvage;
  const QVTemporaryFiles files(platform);
  const std::string store = files._srTempPath();
  if (!becomeOwnerOf(store.substr(0, store.size() - 1))) return EXIT_FAILURE;
  QVUnfinishedMovies unfinished(files, salvage, localization);
  int status = argc < 2 ? look(unfinished) : EXIT_SUCCESS;
  for (int at = 1; at < argc; ++at) {
    if (isName(argv[at])) print(unfinished.salvaged(unfinished.movieNamed(argv[at])));
  }
  platform::flushLog();
  if (std::fflush(stdout) != 0) status = EXIT_FAILURE;
  return status;
}
