#pragma once

#include <string>

#include "platform/Localization.h"
#include "platform/MovieSalvage.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

/// What a crash or a loss of power left in the temporary store.
///
/// Threading: the caller's thread, at the daemon's start, before any recording.
class QVUnfinishedMovies {
 public:
  QVUnfinishedMovies(QVTemporaryFiles files, platform::MovieSalvage& salvage, platform::Localization& localization)
      : files_(files), salvage_(salvage), localization_(localization) {}

  /// Finishes every movie of the temporary store that was left unfinished, and keeps it
  /// under a name of its own ("Chess_recovered_02-29-2024 19-35-12.mp4", with the time at which it broke off), so
  /// that the next recording of that application does not replace it. From then on it ages out like the
  /// others. What cannot be finished is kept under such a name too, as it is, also where nothing in it can be read.
  /// Only a file into which no media was ever written is removed. Finished movies, and those that another process is
  /// writing, are not touched. Every outcome but these is logged.
  void _srSalvageUnfinishedMovies();

 private:
  [[nodiscard]] platform::Result<std::string> recoveredStem(const std::string& name);
  [[nodiscard]] platform::Result<std::string> keepAside(const std::string& name);
  void removeWithoutMedia(const std::string& name);
  void keepDamaged(const std::string& name, const platform::Error& damage);
  void finishMovie(const std::string& name);

  const QVTemporaryFiles files_;
  platform::MovieSalvage& salvage_;
  platform::Localization& localization_;
};

}  // namespace qv
