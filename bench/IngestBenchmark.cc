#include <fmt/format.h>
#include <leveldb/db.h>
#include <leveldb/write_batch.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <filesystem>
#include <memory>
#include <stdexcept>

#include "bench/Corpus.h"
#include "bench/DaemonRun.h"
#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/Index.h"

// How fast mail gets into the index through the daemon, held against the bound of its store: bare
// batches of the same keys and texts, written to the same kind of database in the same run.
namespace {

// The text of one zone and where its suffixes begin, as ranges of the arrays of all.
struct Zone {
  uint32_t docID;
  uint16_t zoneID;
  size_t text;
  size_t textSize;
  size_t offsets = 0;
  size_t offsetCount = 0;
};

// What a finished index holds, document by document. Takes 8 bytes a suffix beside all texts.
struct IndexContents {
  salt::Index::OptionsBlock options;
  std::string texts;
  std::vector<Zone> zones;
  // Document, zone and offset of each suffix, so that the order of the numbers is that of the
  // zones.
  std::vector<uint64_t> suffixes;

  static constexpr unsigned kZoneShift = 18;
  static constexpr unsigned kDocShift = 32;
  static uint64_t packed(uint32_t docID, uint16_t zoneID, uint32_t offset) {
    return uint64_t{docID} << kDocShift | uint64_t{zoneID} << kZoneShift | offset;
  }
  static uint32_t offsetOf(uint64_t suffix) {
    return static_cast<uint32_t>(suffix & ((1U << kZoneShift) - 1));
  }
};

void collectSuffixes(const salt::Index& index, IndexContents& contents) {
  bool fit = true;
  index.ScanPrefix("", [&](const salt::SuffixMeta& meta) {
    fit = meta.Offset >> IndexContents::kZoneShift == 0 &&
          meta.ZoneID >> (IndexContents::kDocShift - IndexContents::kZoneShift) == 0;
    contents.suffixes.push_back(IndexContents::packed(meta.DocID, meta.ZoneID, meta.Offset));
    return fit;
  });
  if (!fit) throw std::runtime_error("a suffix does not fit into 64 bits");
  std::sort(contents.suffixes.begin(), contents.suffixes.end());
}

IndexContents readIndex(const std::string& path) {
  const std::unique_ptr<salt::Index> index(salt::LoadIndex(path));
  if (index == nullptr) throw std::runtime_error("the index cannot be opened again");
  IndexContents contents;
  contents.options = index->GetOptions();
  index->ForEachZone([&](uint32_t docID, uint16_t zoneID, std::string_view text) {
    contents.zones.push_back({docID, zoneID, contents.texts.size(), text.size()});
    contents.texts.append(text);
    return true;
  });
  std::sort(contents.zones.begin(), contents.zones.end(), [](const Zone& a, const Zone& b) {
    return std::pair(a.docID, a.zoneID) < std::pair(b.docID, b.zoneID);
  });
  collectSuffixes(*index, contents);
  size_t at = 0;
  for (Zone& zone : contents.zones) {
    const uint64_t end = IndexContents::packed(zone.docID, zone.zoneID, 0) +
                         (uint64_t{1} << IndexContents::kZoneShift);
    zone.offsets = at;
    while (at < contents.suffixes.size() && contents.suffixes[at] < end) ++at;
    zone.offsetCount = at - zone.offsets;
  }
  if (at != contents.suffixes.size()) throw std::runtime_error("a suffix has no zone");
  return contents;
}

struct Cost {
  double seconds;
  double cpuSeconds;
};

// What the zones take as one batch each. Making the keys from the texts is part of it.
Cost writeRaw(const IndexContents& contents, const std::string& path) {
  const salt::Database database = salt::openDatabase(path, salt::OpenMode::create);
  if (database.db == nullptr) throw std::runtime_error("the raw database cannot be made");
  leveldb::WriteBatch batch;
  std::string key;
  const double start = bench::secondsNow();
  const double cpuStart = bench::cpuSecondsNow();
  for (const Zone& zone : contents.zones) {
    const auto text = std::string_view(contents.texts).substr(zone.text, zone.textSize);
    constexpr uint8_t kTextShard = 255;
    batch.Clear();
    batch.Put(salt::slice(salt::TextKey(kTextShard, zone.docID, zone.zoneID).view()),
              salt::slice(text));
    salt::SuffixMeta meta;
    meta.DocID = zone.docID;
    meta.ZoneID = zone.zoneID;
    for (size_t i = 0; i < zone.offsetCount; ++i) {
      meta.Offset = IndexContents::offsetOf(contents.suffixes[zone.offsets + i]);
      const std::string_view suffix = text.substr(meta.Offset);
      salt::suffixKey(0, suffix.substr(0, salt::suffixLength(suffix, contents.options)), meta,
                      &key);
      batch.Put(key, {});
    }
    const leveldb::Status status = database.db->Write(leveldb::WriteOptions(), &batch);
    if (!status.ok()) throw std::runtime_error("raw database: " + status.ToString());
  }
  return {bench::secondsNow() - start, bench::cpuSecondsNow() - cpuStart};
}

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
  // Makes the index, which is no part of indexing.
  const auto none =
      service.fetchLastClientState(bench::kClientName, bench::kProtectionClass, &error);
  if (error) throw std::runtime_error("opening: " + platform::printable(error));
  start = bench::secondsNow();
  const double cpuStart = daemon.cpuSeconds();
  spool.send(service);
  const Cost sent{bench::secondsNow() - start, daemon.cpuSeconds() - cpuStart};
  const bench::Memory memory = daemon.memory();
  daemon.stop();

  const uint64_t stateBytes = bench::bytesOnDisk(stateDirectory);
  const uint64_t indexBytes = bench::bytesOnDisk(bench::indexPath(stateDirectory));
  const IndexContents contents = readIndex(bench::indexPath(stateDirectory));
  const Cost raw = writeRaw(contents, scratch / "raw");
  const auto mails = static_cast<double>(spool.items());
  const auto suffixes = static_cast<double>(contents.suffixes.size());
  fmt::print(
      "mails={} unreadable={} mail_mb={:.1f} suffixes={} parse_s={:.2f} rpc_s={:.2f} "
      "daemon_cpu_s={:.2f} "
      "mails_per_s={:.0f} mails_per_s_with_parsing={:.0f} suffixes_per_s={:.0f} "
      "rss_anon_mb={:.1f} rss_anon_peak_mb={:.1f} vm_hwm_mb={:.1f} state_mb={:.1f} "
      "index_mb={:.1f} raw_mb={:.1f} raw_s={:.2f} raw_cpu_s={:.2f} raw_suffixes_per_s={:.0f} "
      "index_vs_raw_cpu={:.2f} index_vs_raw={:.2f}\n",
      spool.items(), spool.unreadable(), megabytes(spool.mailBytes()), contents.suffixes.size(),
      parseSeconds, sent.seconds, sent.cpuSeconds, mails / sent.seconds,
      mails / (parseSeconds + sent.seconds), suffixes / sent.seconds, megabytes(memory.anonymous),
      megabytes(memory.anonymousPeak), megabytes(memory.residentPeak), megabytes(stateBytes),
      megabytes(indexBytes), megabytes(bench::bytesOnDisk(scratch / "raw")), raw.seconds,
      raw.cpuSeconds, suffixes / raw.seconds, raw.cpuSeconds / sent.cpuSeconds,
      raw.seconds / sent.seconds);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  return bench::guarded("ingest_benchmark", run, argc, argv);
}
