#pragma once

#include <cstdarg>
#include <string>

namespace upload {

/// What libavformat writes to its log while this object lives, on the thread that made it. A failed call's code alone
/// tells too little: a host name that is unknown and a certificate that is wrong are both "Input/output error".
///
/// Threading: one thread. One at a time on it.
class LibraryLog {
 public:
  /// Once in a process: lines of threads that have no LibraryLog go to standard error.
  static void install();

  LibraryLog();
  ~LibraryLog();
  LibraryLog(const LibraryLog&) = delete;
  LibraryLog& operator=(const LibraryLog&) = delete;
  /// The first error, which is the cause of those after it; empty where there was none.
  [[nodiscard]] const std::string& firstError() const { return firstError_; }

 private:
  static void write(void* object, int level, const char* format, va_list arguments);
  std::string firstError_;
};

}  // namespace upload
