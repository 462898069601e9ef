#pragma once

#include <quorvel/Recorder.h>

#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>

#include "tools/quorvelctl/Failure.h"
#include "tools/quorvelctl/recorder/Loop.h"
#include "tools/quorvelctl/recorder/OutputFile.h"

namespace ctl {

/// Records the screen, and brings the movie to where it is wanted: into a file, or into the photo library. What happens
/// it says by lines of JSON on standard output.
///
/// Threading: the loop's thread.
class SystemRecorder {
 public:
  /// Without a file the movie goes into the photo library.
  SystemRecorder(Loop& loop, std::unique_ptr<OutputFile> file);

  void record(int width, int height, bool microphone);
  /// Ends a recording that a former run of this program left.
  void finish();
  /// A movie that waits in the store.
  void save(const std::string& movieURL);

 private:
  quorvel::RecorderOptions options();
  void start(const quorvel::StartOptions& wanted);
  void stop();
  void ended(const quorvel::StopResult& result);
  void deliver(const std::string& movieURL, bool isNewest);
  void copy(const quorvel::OpenMovieResult& movie, bool isNewest);
  void putIntoLibrary(const std::string& movieURL);
  static void say(const nlohmann::json& line);
  /// Work whose Failure ends the program.
  void guarded(const std::function<void()>& work);
  void fail(const Failure& failure);
  void fail(const quorvel::Error& error, const std::string& what);

  Loop& loop_;
  const std::unique_ptr<OutputFile> file_;
  bool isEnding_ = false;
  /// Last, so that it goes first.
  std::unique_ptr<quorvel::Recorder> recorder_;
};

}  // namespace ctl
