#include <benchmark/benchmark.h>
#include <leveldb/db.h>
#include <leveldb/write_batch.h>

#include <cmath>
#include <filesystem>
#include <memory>
#include <random>

#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/PostingSet.h"
#include "salt/Search.h"

namespace {

constexpr uint32_t kTokensPerZone = 300;
constexpr uint32_t kVocabulary = 20000;
constexpr uint16_t kZone = 7;

struct Zone {
  std::string text;
  std::vector<uint32_t> offsets;
};

// Words with a 1/rank distribution, as in mail.
class Texts {
 public:
  Texts() {
    for (uint32_t i = 0; i < kVocabulary; ++i) {
      std::string word;
      for (size_t n = 2 + _random() % 9; n > 0; --n) {
        word += static_cast<char>('a' + _random() % 26);
      }
      _words.push_back(word);
    }
  }

  [[nodiscard]] const std::string& word(size_t rank) const { return _words[rank]; }

  Zone next() {
    Zone zone;
    std::uniform_real_distribution<double> exponent(0, std::log(kVocabulary));
    for (uint32_t i = 0; i < kTokensPerZone; ++i) {
      zone.offsets.push_back(static_cast<uint32_t>(zone.text.size()));
      zone.text += _words[static_cast<size_t>(std::exp(exponent(_random))) % kVocabulary] + ' ';
    }
    return zone;
  }

 private:
  std::mt19937 _random{11};
  std::vector<std::string> _words;
};

class ScratchPath {
 public:
  explicit ScratchPath(const std::string& name)
      : _path(std::filesystem::temp_directory_path() /
              (name + std::to_string(std::random_device()()))) {}
  ~ScratchPath() { std::filesystem::remove_all(_path); }
  [[nodiscard]] std::string string() const { return _path.string(); }

 private:
  std::filesystem::path _path;
};

std::unique_ptr<salt::Index> newIndex(const ScratchPath& path) {
  salt::Index::Options options;
  options.Path = path.string();
  return std::unique_ptr<salt::Index>(salt::NewIndex(options));
}

// Several zones per document, as the indexer adds them: one long text and some short ones.
void addDocument(salt::Index& index, uint32_t docID, Zone zone) {
  index.AddZone(docID, kZone, zone.text, zone.offsets, true);
  for (uint16_t zoneID = 1; zoneID < kZone; ++zoneID) {
    std::vector<uint32_t> offsets{0};
    index.AddZone(docID, zoneID, zone.text.substr(0, 30), offsets, true);
  }
}

void AddZone(benchmark::State& state) {
  const ScratchPath path("salt-bench-add");
  const auto index = newIndex(path);
  Texts texts;
  std::vector<Zone> zones(2000);
  for (Zone& zone : zones) zone = texts.next();
  uint32_t docID = 0;
  for (auto _ : state) {
    ++docID;
    addDocument(*index, docID, zones[docID % zones.size()]);
  }
  state.SetItemsProcessed(state.iterations() * (kTokensPerZone + kZone - 1));
}
BENCHMARK(AddZone)->Iterations(10000)->Unit(benchmark::kMicrosecond);

// The upper bound for AddZone: raw batches with the same keys and texts.
void RawBatches(benchmark::State& state) {
  const ScratchPath path("salt-bench-raw");
  salt::Database database = salt::openDatabase(path.string(), salt::OpenMode::create);
  const salt::Index::Options op;
  Texts texts;
  std::vector<Zone> zones(2000);
  for (Zone& zone : zones) zone = texts.next();
  salt::SuffixMeta meta;
  std::string key;
  leveldb::WriteBatch batch;
  const auto add = [&](uint16_t zoneID, std::string_view text, const auto& offsets) {
    batch.Put(salt::slice(salt::TextKey(255, meta.DocID, zoneID).view()), salt::slice(text));
    meta.ZoneID = zoneID;
    for (const uint32_t offset : offsets) {
      const std::string_view suffix = text.substr(offset);
      meta.Offset = offset;
      salt::suffixKey(0, suffix.substr(0, salt::suffixLength(suffix, op)), meta, &key);
      batch.Put(key, {});
    }
    database.db->Write({}, &batch);
    batch.Clear();
  };
  for (auto _ : state) {
    ++meta.DocID;
    const Zone& zone = zones[meta.DocID % zones.size()];
    add(kZone, zone.text, zone.offsets);
    for (uint16_t zoneID = 1; zoneID < kZone; ++zoneID) {
      add(zoneID, std::string_view(zone.text).substr(0, 30), std::vector<uint32_t>{0});
    }
  }
  state.SetItemsProcessed(state.iterations() * (kTokensPerZone + kZone - 1));
}
BENCHMARK(RawBatches)->Iterations(10000)->Unit(benchmark::kMicrosecond);

// An index of 1,500 documents, either all hot or all in pages, with the database fully compacted.
struct Filled {
  ScratchPath path{"salt-bench-read"};
  Texts texts;
  std::unique_ptr<salt::Index> index = newIndex(path);

  explicit Filled(bool merged) {
    for (uint32_t docID = 1; docID <= kDocuments; ++docID) {
      addDocument(*index, docID, texts.next());
    }
    if (merged) {
      index->Vacuum();
      index.reset();  // waits for the merge
      index.reset(salt::LoadIndex(path.string()));
    }
    index->Compact();
  }

  static constexpr uint32_t kDocuments = 1500;
};

Filled& filled(bool merged) {
  static Filled hot(false);
  static Filled pages(true);
  return merged ? pages : hot;
}

// Arguments: whether the suffixes are in pages, and the rank of the word in the vocabulary.
void ScanPrefix(benchmark::State& state) {
  Filled& data = filled(state.range(0) != 0);
  const std::string prefix = data.texts.word(static_cast<size_t>(state.range(1))) + ' ';
  uint64_t results = 0;
  for (auto _ : state) {
    data.index->ScanPrefix(prefix, [&results](const salt::SuffixMeta&) {
      ++results;
      return true;
    });
  }
  state.SetItemsProcessed(static_cast<int64_t>(results));
}
BENCHMARK(ScanPrefix)
    ->ArgsProduct({{0, 1}, {1, 30, 1000}})
    ->ArgNames({"pages", "rank"})
    ->Unit(benchmark::kMicrosecond);

// The scan that a search uses. Last argument: whether the result of the previous scan is cached.
void ScanPlaces(benchmark::State& state) {
  Filled& data = filled(state.range(0) != 0);
  const std::string prefix = data.texts.word(static_cast<size_t>(state.range(1))) + ' ';
  uint64_t results = 0;
  uint64_t places = 0;
  static uint32_t unused = Filled::kDocuments;
  for (auto _ : state) {
    if (state.range(2) == 0) {
      state.PauseTiming();
      data.index->DeleteDoc(++unused);  // empties the cache
      state.ResumeTiming();
    }
    const auto found = data.index->ScanPlaces({prefix}, SIZE_MAX);
    found.front()->forEachZone([&places](uint16_t, const auto& docs) { places += docs.size(); });
    results += found.front()->suffixes();
  }
  benchmark::DoNotOptimize(places);
  state.SetItemsProcessed(static_cast<int64_t>(results));
}
BENCHMARK(ScanPlaces)
    ->ArgsProduct({{0, 1}, {1, 30}, {0}})
    ->ArgNames({"pages", "rank", "remembered"})
    ->Iterations(200)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK(ScanPlaces)
    ->ArgsProduct({{1}, {1, 30}, {1}})
    ->ArgNames({"pages", "rank", "remembered"})
    ->Unit(benchmark::kMicrosecond);

// Merges 460,000 hot suffixes; the argument is the number of documents merged before.
void Merge(benchmark::State& state) {
  uint64_t suffixes = 0;
  for (auto _ : state) {
    state.PauseTiming();
    const ScratchPath path("salt-bench-merge");
    auto index = newIndex(path);
    Texts texts;
    uint32_t docID = 0;
    const auto add = [&](int64_t documents) {
      for (; documents > 0; --documents) addDocument(*index, ++docID, texts.next());
    };
    const auto reopen = [&] {
      index.reset();
      index.reset(salt::LoadIndex(path.string()));
    };
    add(state.range(0));
    index->Vacuum();
    reopen();
    add(Filled::kDocuments);
    suffixes += index->GetMetrics().Suffixes;
    state.ResumeTiming();
    index->Vacuum();
    index.reset();
  }
  state.SetItemsProcessed(static_cast<int64_t>(suffixes));
}
BENCHMARK(Merge)->Arg(0)->Arg(1500)->Iterations(1)->Unit(benchmark::kMillisecond)->UseRealTime();

// Two whole words and the start of a third, with a limit below the size of the index. Last
// argument: whether a search without limit ran before, as before one with modified words.
void Search(benchmark::State& state) {
  Filled& data = filled(state.range(0) != 0);
  const auto term = [](const std::string& token) {
    saltsearch::Term made;
    made.tokens = {token};
    made.tokenScores = {1.0};
    made.zones = {kZone, 1, 2};
    made.zoneScores = {0.5, 0.3, 0.2};
    return made;
  };
  const auto search = [&](size_t maxSuffixes) {
    std::vector<saltsearch::Term> terms{term(data.texts.word(40) + ' '),
                                        term(data.texts.word(5) + ' '),
                                        term(data.texts.word(20).substr(0, 2))};
    benchmark::DoNotOptimize(saltsearch::Search(*data.index, terms, {50, maxSuffixes, 0.01}));
  };
  data.index->DeleteDoc(2 * Filled::kDocuments);  // empties the cache
  if (state.range(1) != 0) search(SIZE_MAX);
  for (auto _ : state) search(100000);
}
BENCHMARK(Search)
    ->Args({0, 0})
    ->Args({1, 0})
    ->Args({1, 1})
    ->ArgNames({"pages", "remembered"})
    ->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
