#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <filesystem>
#include <stdexcept>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "bench/RawBatches.h"

// Measures indexing through the daemon against the bound of its store: raw batches with the same
// keys and texts, written to the same kind of database in the same run.
namespace {

double megabytes(uint64_t bytes) {
  return static_cast<double>(bytes) / 1e6;
}

int run(int argc, char** argv) {
  std::vector<std::string> paths{TALLOW_SAMPLE_MAIL};
  std::string stateDirectory;
  CLI::App app(
      "Indexes mail in a daemon of its own and compares it to raw batches of the same keys.",
      "ingest_benchmark");
  app.add_option("MAIL", paths, "Maildirs, mbox files, directories (default: the sample mail)");
  app.add_option("--state", stateDirectory,
                 "Keep the index below this directory, which must be new or empty");
  CLI11_PARSE(app, argc, argv);

  const bench::ScratchDirectory scratch;
  if (stateDirectory.empty()) stateDirectory = scratch / "state";
  if (std::filesystem::exists(stateDirectory) && !std::filesystem::is_empty(stateDirectory)) {
    throw std::runtime_error(stateDirectory + " is not empty");
  }
  bench::ItemSpool spool(scratch);
  double start = bench::secondsNow();
  spool.fill(paths);
  const double parseSeconds = bench::secondsNow() - start;
  if (spool.items() == 0) throw std::runtime_error("there is no mail");

  bench::DaemonRun daemon(scratch, stateDirectory);
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  std::optional<TLError> error;
  // Creates the index, which should not count as indexing.
  const auto none =
      service.fetchLastClientState(bench::kClientName, bench::kProtectionClass, &error);
  if (error) throw std::runtime_error("opening: " + platform::printable(error));
  start = bench::secondsNow();
  const double cpuStart = daemon.cpuSeconds();
  spool.send(service);
  const double seconds = bench::secondsNow() - start;
  const double cpuSeconds = daemon.cpuSeconds() - cpuStart;
  const bench::Memory memory = daemon.memory();
  daemon.stop();

  const uint64_t stateBytes = bench::bytesOnDisk(stateDirectory);
  const uint64_t indexBytes = bench::bytesOnDisk(bench::indexPath(stateDirectory));
  const bench::RawRun raw =
      bench::writeRawBatches(bench::indexPath(stateDirectory), scratch / "raw");
  const auto mails = static_cast<double>(spool.items());
  const auto suffixes = static_cast<double>(raw.suffixes);
  fmt::print(
      "mails={} unreadable={} mail_mb={:.1f} suffixes={} parse_s={:.2f} rpc_s={:.2f} "
      "daemon_cpu_s={:.2f} "
      "mails_per_s={:.0f} mails_per_s_with_parsing={:.0f} suffixes_per_s={:.0f} "
      "rss_anon_mb={:.1f} rss_anon_peak_mb={:.1f} vm_hwm_mb={:.1f} state_mb={:.1f} "
      "index_mb={:.1f} raw_mb={:.1f} raw_s={:.2f} raw_cpu_s={:.2f} raw_suffixes_per_s={:.0f} "
      "index_vs_raw_cpu={:.2f} index_vs_raw={:.2f}\n",
      spool.items(), spool.unreadable(), megabytes(spool.mailBytes()), raw.suffixes, parseSeconds,
      seconds, cpuSeconds, mails / seconds, mails / (parseSeconds + seconds), suffixes / seconds,
      megabytes(memory.anonymous), megabytes(memory.anonymousPeak), megabytes(memory.residentPeak),
      megabytes(stateBytes), megabytes(indexBytes), megabytes(bench::bytesOnDisk(scratch / "raw")),
      raw.seconds, raw.cpuSeconds, suffixes / raw.seconds, raw.cpuSeconds / cpuSeconds,
      raw.seconds / seconds);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("ingest_benchmark", run, argc, argv);
}
