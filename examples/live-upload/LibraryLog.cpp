#include "LibraryLog.h"

#include <cstdio>

extern "C" {
#include <libavutil/log.h>
}

namespace upload {

namespace {

thread_local std::string* firstErrorOfThread = nullptr;

}  // namespace

void LibraryLog::install() { av_log_set_callback(&LibraryLog::write); }

LibraryLog::LibraryLog() { firstErrorOfThread = &firstError_; }

LibraryLog::~LibraryLog() { firstErrorOfThread = nullptr; }

void LibraryLog::write(void* object, int level, const char* format, va_list arguments) {
  if (level > AV_LOG_ERROR) return;
  char text[1024] = {};
  int isLineStart = firstErrorOfThread == nullptr;  // a prefix tells which object of the library speaks
  av_log_format_line2(object, level, format, arguments, text, sizeof text, &isLineStart);
  if (firstErrorOfThread == nullptr) {
    std::fputs(text, stderr);
  } else if (firstErrorOfThread->empty()) {
    *firstErrorOfThread = text;
    while (firstErrorOfThread->ends_with('\n')) firstErrorOfThread->pop_back();
  }
}

}  // namespace upload
