#include "platform/ffmpeg/FFmpegLog.h"

#include <cstdarg>
#include <cstdio>
#include <mutex>

#include "platform/ffmpeg/FFmpegHandles.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

void logLibraryLine(void*, int level, const char* format, va_list arguments) {
  if (level > AV_LOG_WARNING || !logIsOn(LogLevel::Info)) return;
  char text[512];
  std::vsnprintf(text, sizeof text, format, arguments);
  QV_LOG_INFO(logs::kMovie, "%s", text);
}

}  // namespace

void routeLibraryLog() {
  static std::once_flag once;
  std::call_once(once, [] { av_log_set_callback(logLibraryLine); });
}

}  // namespace qv::platform::ffmpeg
