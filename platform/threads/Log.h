#pragma once

#include <atomic>
#include <functional>
#include <string>
#include <string_view>

namespace qv::platform {

/// What a line means (docs/logging.md has the table with examples).
enum class LogLevel {
  Error,   ///< Something failed that should not have; a person should look.
  Notice,  ///< Input from other processes or actions performed: a few lines per recording.
  Info,    ///< Detail of a flow, useful with a problem at hand.
  Debug,   ///< Per frame or per buffer. Off unless asked for; then it costs one load and a branch.
};

/// Where a line goes.
enum class LogChannel {
  System,   ///< syslog / journal, and standard error when that is a terminal or a file.
  Console,  ///< standard error only.
};

/// Subsystem tags, printed in brackets before the text.
namespace logs {
inline constexpr const char kDaemon[] = "daemon";
inline constexpr const char kSession[] = "session";
inline constexpr const char kWriter[] = "writer";
inline constexpr const char kCapture[] = "capture";
inline constexpr const char kExtensions[] = "extensions";
inline constexpr const char kUI[] = "ui";
inline constexpr const char kSupport[] = "support";
inline constexpr const char kIPC[] = "ipc";
inline constexpr const char kScreen[] = "screen";
inline constexpr const char kAudio[] = "audio";
inline constexpr const char kMovie[] = "movie";
inline constexpr const char kPlatform[] = "platform";
}  // namespace logs

struct LogLine {
  LogLevel level;
  LogChannel channel;
  const char* category;
  std::string text;
};

namespace detail {
extern std::atomic<LogLevel> logThreshold;
__attribute__((format(printf, 4, 5))) void writeLog(LogLevel level, LogChannel channel, const char* category,
                                                    const char* format, ...);
}  // namespace detail

inline bool logIsOn(LogLevel level) { return level <= detail::logThreshold.load(std::memory_order_relaxed); }

/// The most detailed level that is written. Starts as Notice, or as what the environment variable
/// QUORVEL_LOG names: error, notice, info, debug.
void setLogLevel(LogLevel level);
/// Replaces the system log and the console, e.g. by a test's recorder; called on the logging
/// thread's behalf at once, in the thread that logs. An empty function restores the real ones.
void setLogSink(std::function<void(const LogLine&)> sink);
/// Waits until every line logged so far has been written out.
void flushLog();

}  // namespace qv::platform

/// A line is formatted in the calling thread and written by another, through a bounded queue: no
/// frame ever waits for the log. Lines that found the queue full are counted and reported.
#define QV_LOG_AT(level, category, ...)                                                                   \
  do {                                                                                                    \
    if (::qv::platform::logIsOn(level))                                                                   \
      ::qv::platform::detail::writeLog(level, ::qv::platform::LogChannel::System, category, __VA_ARGS__); \
  } while (false)
#define QV_LOG(category, ...) QV_LOG_AT(::qv::platform::LogLevel::Notice, category, __VA_ARGS__)
#define QV_LOG_INFO(category, ...) QV_LOG_AT(::qv::platform::LogLevel::Info, category, __VA_ARGS__)
#define QV_LOG_ERROR(category, ...) QV_LOG_AT(::qv::platform::LogLevel::Error, category, __VA_ARGS__)
#define QV_LOG_DEBUG(category, ...) QV_LOG_AT(::qv::platform::LogLevel::Debug, category, __VA_ARGS__)
#define QV_CONSOLE(category, ...)                                                                                  \
  ::qv::platform::detail::writeLog(::qv::platform::LogLevel::Error, ::qv::platform::LogChannel::Console, category, \
                                   __VA_ARGS__)
