#include <fmt/format.h>

#include <CLI/CLI.hpp>

#include "bench/DaemonRun.h"
#include "bench/Percentiles.h"
#include "client/DebugServiceProxy.h"

// Measures an empty call to the daemon.
namespace {

constexpr int kWarmUpPings = 100;

double timedPing(client::DebugServiceProxy& service) {
  std::optional<TLError> error;
  const double start = bench::secondsNow();
  const auto answer = service.ping("bench", &error);
  const double seconds = bench::secondsNow() - start;
  if (!answer) throw std::runtime_error("ping: " + platform::printable(error));
  return seconds;
}

int run(int argc, char** argv) {
  int pings = 10000;
  CLI::App app("Times pings over one connection to a daemon of its own.", "ping_benchmark");
  app.add_option("--pings", pings, "How many (default: 10000)")->check(CLI::Range(1, 100000000));
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  bench::DaemonRun daemon(scratch, scratch / "state");
  client::DebugServiceProxy service(daemon.runtimeDirectory());
  for (int i = 0; i < kWarmUpPings; ++i) timedPing(service);
  bench::Percentiles times;
  for (int i = 0; i < pings; ++i) times.add(timedPing(service));
  daemon.stop();
  fmt::print("pings={} ping_median_us={:.1f} ping_p95_us={:.1f} ping_max_us={:.1f}\n", pings,
             times.at(0.5) * 1e6, times.at(0.95) * 1e6, times.at(1) * 1e6);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("ping_benchmark", run, argc, argv);
}
