/// An application on the client library. It says "connected", takes commands on descriptor 3, and says one line for
/// each: start, stop (the movie's URL), open URL (what can be done with the descriptor), read PATH, discard. What has
/// failed is said by its code, or its errno.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <future>
#include <iostream>
#include <string>

#include "sdk/client/quorvel/Recorder.h"

namespace {

using namespace std::string_literals;

template <typename Result, typename Request>
Result ask(Request request) {
  std::promise<Result> answered;
  request([&](Result result) { answered.set_value(std::move(result)); });
  return answered.get_future().get();
}

std::string outcome(const std::optional<quorvel::Error>& error, const std::string& success = "ok") {
  return error ? std::to_string(error->code) : success;
}

std::string openPath(const std::string& path, int flags) {
  const int file = ::open(path.c_str(), flags | O_CLOEXEC);
  if (file < 0) return std::to_string(errno);
  ::close(file);
  return "ok";
}

std::string describe(const quorvel::OpenMovieResult& movie) {
  if (movie.error) return std::to_string(movie.error->code);
  char bytes[8] = {};
  const bool isMovie =
      ::pread(movie.file, bytes, sizeof bytes, 0) == sizeof bytes && std::string(bytes + 4, 4) == "ftyp";
  struct stat info {};
  ::fstat(movie.file, &info);
  return "movie=" + std::to_string(isMovie) + " bytes=" + std::to_string(info.st_size) +
         " write=" + (::pwrite(movie.file, "x", 1, 0) == 1 ? "ok" : std::to_string(errno)) +
         " reopen=" + openPath("/proc/self/fd/" + std::to_string(movie.file), O_RDWR);
}

std::string serve(quorvel::Recorder& recorder, const std::string& command, const std::string& argument) {
  if (command == "start") {
    const auto started = ask<quorvel::StartResult>([&](auto handler) {
      recorder.start({.windows = {static_cast<uint32_t>(::getpid())}, .width = 320, .height = 180}, handler);
    });
    return outcome(started.error);
  }
  if (command == "stop") {
    const auto stopped = ask<quorvel::StopResult>([&](auto handler) { recorder.stop(handler); });
    return outcome(stopped.error, stopped.movieURL);
  }
  if (command == "open") {
    return describe(ask<quorvel::OpenMovieResult>([&](auto handler) { recorder.openMovie(argument, handler); }));
  }
  if (command == "discard") {
    return outcome(ask<std::optional<quorvel::Error>>([&](auto handler) { recorder.discard(handler); }));
  }
  return command == "read" ? openPath(argument, O_RDONLY) : "what?";
}

}  // namespace

int main() {
  quorvel::RecorderOptions options;
  options.events.connected = [] { std::puts("connected"), std::fflush(stdout); };
  const auto recorder = quorvel::Recorder::create(std::move(options));
  recorder->keepConnected(true);
  std::FILE* const commands = ::fdopen(3, "r");
  char line[4096];
  while (commands != nullptr && std::fgets(line, sizeof line, commands) != nullptr) {
    std::string command = line;
    command.pop_back();
    const size_t end = std::min(command.find(' '), command.size());
    const std::string argument = command.substr(std::min(end + 1, command.size()));
    std::puts(serve(*recorder, command.substr(0, end), argument).c_str());
    std::fflush(stdout);
  }
}
