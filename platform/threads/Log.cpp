#include "platform/threads/Log.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

#include "platform/threads/LogQuotas.h"

namespace qv::platform {
namespace {

constexpr size_t kMaximumQueuedLines = 4096;

LogLevel levelFromEnvironment() {
  const char* name = std::getenv("QUORVEL_LOG");
  const std::string_view level = name ? name : "";
  if (level == "error") return LogLevel::Error;
  if (level == "info") return LogLevel::Info;
  if (level == "debug") return LogLevel::Debug;
  return LogLevel::Notice;
}

int syslogPriority(LogLevel level) {
  switch (level) {
    case LogLevel::Error:
      return LOG_ERR;
    case LogLevel::Notice:
      return LOG_NOTICE;
    case LogLevel::Info:
      return LOG_INFO;
    case LogLevel::Debug:
      return LOG_DEBUG;
  }
  return LOG_NOTICE;
}

void writeOut(const LogLine& line) {
  static const bool hasSystemLog = ::access("/dev/log", W_OK) == 0;
  if (line.channel == LogChannel::System && hasSystemLog) {
    ::syslog(LOG_DAEMON | syslogPriority(line.level), "[%s] %s", line.category, line.text.c_str());
  }
  std::fprintf(stderr, "%s[%s] %s\n", line.level == LogLevel::Error ? "E " : "", line.category, line.text.c_str());
}

/// Never destroyed: lines may be logged until the very end of the process.
class LogWriter {
 public:
  void submit(LogLine line) {
    std::lock_guard lock(mutex_);
    if (sink_) {
      (*sink_)(line);
      return;
    }
    if (lines_.size() >= kMaximumQueuedLines) {
      ++lost_;
      return;
    }
    lines_.push_back(std::move(line));
    ++submitted_;
    if (!started_) {
      started_ = true;
      std::thread([this] { run(); }).detach();
    }
    changed_.notify_one();
  }

  void setSink(std::function<void(const LogLine&)> sink) {
    std::lock_guard lock(mutex_);
    sink_ = sink ? std::make_unique<std::function<void(const LogLine&)>>(std::move(sink)) : nullptr;
  }

  void flush() {
    std::unique_lock lock(mutex_);
    const auto target = submitted_;
    written_.wait(lock, [&] { return done_ >= target; });
  }

 private:
  void run() {
    std::unique_lock lock(mutex_);
    for (;;) {
      changed_.wait(lock, [this] { return !lines_.empty(); });
      std::deque<LogLine> batch;
      batch.swap(lines_);
      const size_t lost = std::exchange(lost_, 0);
      lock.unlock();
      for (const LogLine& line : batch) writeOut(line);
      if (lost > 0) {
        writeOut({LogLevel::Error, LogChannel::System, logs::kPlatform, std::to_string(lost) + " log lines were lost"});
      }
      lock.lock();
      done_ += batch.size();
      written_.notify_all();
    }
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::condition_variable written_;
  std::deque<LogLine> lines_;
  std::unique_ptr<std::function<void(const LogLine&)>> sink_;
  size_t lost_ = 0;
  uint64_t submitted_ = 0;
  uint64_t done_ = 0;
  bool started_ = false;
};

LogWriter& writer() {
  static LogWriter* const instance = new LogWriter;
  return *instance;
}

}  // namespace

namespace detail {

std::atomic<LogLevel> logThreshold{levelFromEnvironment()};

void writeLog(LogLevel level, LogChannel channel, const char* category, const char* format, ...) {
  if (!LogQuotas::Scope::admitsLine()) return;
  char buffer[1024];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(buffer, sizeof buffer, format, arguments);
  va_end(arguments);
  writer().submit({level, channel, category, buffer});
}

}  // namespace detail

void setLogLevel(LogLevel level) { detail::logThreshold.store(level, std::memory_order_relaxed); }
void setLogSink(std::function<void(const LogLine&)> sink) { writer().setSink(std::move(sink)); }
void flushLog() { writer().flush(); }

}  // namespace qv::platform
