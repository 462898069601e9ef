// One of many applications that are connected to the daemon. Prints, in milliseconds, what its admission took
// (from the connection to the first answer), and what a state query took at each SIGUSR1; ends at SIGTERM.

#include <signal.h>
#include <systemd/sd-bus.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>

namespace {

using Clock = std::chrono::steady_clock;

constexpr char kName[] = "com.tarnwick.quorveld";
constexpr char kPath[] = "/com/tarnwick/quorveld";
constexpr char kInterface[] = "com.tarnwick.quorveld.QVDaemonProtocol";

void check(int status, const char* what) {
  if (status >= 0) return;
  std::fprintf(stderr, "%s: %d\n", what, -status);
  std::exit(EXIT_FAILURE);
}

/// A new connection.
sd_bus* connect() {
  sd_bus* bus = nullptr;
  check(sd_bus_new(&bus), "bus");
  const std::string address = "unix:path=" + std::string(std::getenv("XDG_RUNTIME_DIR")) + "/" + kName;
  check(sd_bus_set_address(bus, address.c_str()), "address");
  check(sd_bus_start(bus), "start");
  return bus;
}

void askState(sd_bus* bus) {
  sd_bus_message* reply = nullptr;
  check(sd_bus_call_method(bus, kName, kPath, kInterface, "synchronousGetCurrentState", nullptr, &reply, nullptr),
        "query");
  sd_bus_message_unref(reply);
}

void print(const char* what, Clock::time_point since) {
  std::printf("%s %.3f\n", what, std::chrono::duration<double, std::milli>(Clock::now() - since).count());
  std::fflush(stdout);
}

}  // namespace

int main() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGUSR1);
  sigaddset(&signals, SIGTERM);
  sigprocmask(SIG_BLOCK, &signals, nullptr);
  const Clock::time_point began = Clock::now();
  sd_bus* bus = connect();
  askState(bus);
  print("admitted", began);
  for (int signal = 0; sigwait(&signals, &signal) == 0 && signal == SIGUSR1;) {
    const Clock::time_point asked = Clock::now();
    askState(bus);
    print("state", asked);
  }
  sd_bus_unref(bus);
}
