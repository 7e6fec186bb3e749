#include <fmt/format.h>
#include <fmt/ranges.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>

#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

using salt::Index;
using namespace std::string_literals;

namespace {

constexpr uint32_t kHistories = 24;
constexpr size_t kSteps = 60;
constexpr unsigned kMaxSeconds = 60;  // for one run; longer means a deadlock

struct Step {
  enum class Kind { operation, vacuum, compact, reopen };

  Kind kind = Kind::operation;
  salttest::Operation operation;
  std::string prefix;  // for the scan that follows
};

struct History {
  Index::Options options;
  std::vector<Step> steps;
};

std::ostream& operator<<(std::ostream& stream, const History& history) {
  const Index::Options& op = history.options;
  stream << fmt::format(
      "match {} to {}, zone {}, page {}, shard {}, shards {}, hot {}, batch {}, compact {}\n",
      op.MinMatchLen, op.MaxMatchLen, op.MaxZoneSize, op.MaxPageSuffixes, op.MaxShardSuffixes,
      op.MaxShards, op.MaxHotSuffixes, op.MaxBatchBytes, op.CompactAfterVacuum);
  for (const auto& [kind, operation, prefix] : history.steps) {
    constexpr const char* kNames[] = {"operation", "vacuum", "compact", "reopen"};
    stream << kNames[static_cast<int>(kind)];
    if (kind == Step::Kind::operation) {
      stream << fmt::format(" on {},{}, merge {}, at {}: ", operation.docID, operation.zoneID,
                            operation.merge, fmt::join(operation.offsets, ","))
             << testing::PrintToString(operation.text);
    }
    stream << "; scan " << testing::PrintToString(prefix) << '\n';
  }
  return stream;
}

class Generator {
 public:
  explicit Generator(uint32_t seed) : _random(seed) {}

  History history() {
    History made{options(), std::vector<Step>(kSteps)};
    for (Step& step : made.steps) fill(&step);
    return made;
  }

 private:
  template <typename Value>
  Value oneOf(std::initializer_list<Value> values) {
    return values.begin()[_random() % values.size()];
  }

  Index::Options options() {
    using Lengths = std::pair<uint8_t, uint8_t>;
    Index::Options op;
    std::tie(op.MinMatchLen, op.MaxMatchLen) =
        oneOf({Lengths{32, 100}, Lengths{3, 10}, Lengths{0, 255}, Lengths{1, 1}, Lengths{0, 0}});
    op.MaxZoneSize = oneOf({200u, 200000u});
    op.MaxPageSuffixes = oneOf({0u, 1u, 2u, 3u, 4u, 5u, 50u});
    op.MaxShardSuffixes = oneOf({0u, 1u, 100u, 1000u, 1000000u});
    op.MaxShards = oneOf({1u, 2u, 16u, UINT32_MAX});
    op.MaxHotSuffixes = oneOf({0u, 1u, 4u, 4u, 100u, 1000000u});
    op.MaxBatchBytes = oneOf({0u, 1u, 1000u, 1000000u});
    op.CompactAfterVacuum = _random() % 8 == 0;
    return op;
  }

  void fill(Step* step) {
    const auto dice = _random() % 40;
    step->prefix = prefix();
    if (dice < 3) {
      step->kind = Step::Kind::vacuum;
    } else if (dice < 5) {
      step->kind = Step::Kind::reopen;
    } else if (dice < 6) {
      step->kind = Step::Kind::compact;
    } else {
      fill(&step->operation, dice < 8);
      step->operation.merge = dice >= 13;
    }
  }

  void fill(salttest::Operation* made, bool removes) {
    made->docID = 1 + _random() % 16 * oneOf({1u, 1u, 50u});
    if (removes) return;
    made->zoneID = oneOf<uint16_t>({1, 1, 1, 129, 256, 65535});
    const bool known = !_texts.empty() && _random() % 4 == 0;
    made->text = known ? _texts[_random() % _texts.size()]
                       : salttest::randomText(_random, _random() % oneOf({10u, 100u, 300u}));
    made->offsets = salttest::randomOffsets(_random, made->text);
    _texts.push_back(made->text);
  }

  // Usually a prefix that occurs: a piece of a text, perhaps changed at its end.
  std::string prefix() {
    if (_texts.empty() || _random() % 8 == 0) {
      return salttest::randomText(_random, _random() % 150);
    }
    const std::string& text = _texts[_random() % _texts.size()];
    std::string piece = text.substr(_random() % (text.size() + 1));
    piece.resize(std::min<size_t>(piece.size(), _random() % oneOf({6u, 6u, 130u, 300u})));
    if (_random() % 4 == 0) piece += "a \0z"s[_random() % 4];
    return piece;
  }

  std::mt19937 _random;
  std::vector<std::string> _texts;
};

// Applies the steps to the index and to the model, while merges run freely.
class Run {
 public:
  Run(const History& history, const std::string& path)
      : _history(history),
        _model(history.options),
        _path(path),
        _index(salttest::newIndex(path, history.options)) {}

  // The first fault, or empty.
  std::string fault() {
    for (size_t i = 0; i < _history.steps.size(); ++i) {
      const Step& step = _history.steps[i];
      std::string found = take(step);
      if (found.empty()) found = look(step.prefix);
      if (!found.empty()) return fmt::format("step {}: {}", i + 1, found);
    }
    return reopen();
  }

 private:
  std::string take(const Step& step) {
    switch (step.kind) {
      case Step::Kind::operation:
        return carryOut(*_index, step.operation) == carryOut(_model, step.operation)
                   ? ""
                   : "the index answers otherwise";
      case Step::Kind::vacuum:
        _index->Vacuum();
        return "";
      case Step::Kind::compact:
        _index->Compact();
        return "";
      case Step::Kind::reopen:
        return reopen();
    }
    return "";
  }

  // A merge may be running, so the shard of a suffix is unknown.
  std::string look(const std::string& prefix) {
    for (const std::string& text : {""s, prefix}) {
      auto found = salttest::scan(*_index, text);
      auto expected = _model.scan(text);
      std::sort(found.begin(), found.end());
      std::sort(expected.begin(), expected.end());
      if (found != expected) return compared(text, found, expected);
      const std::string fault = comparedPlaces(text, expected);
      if (!fault.empty()) return fault;
    }
    if (!_index->Validate() || _log.count("Validation failed") != 0) return "Validate";
    return _model.difference(_index->GetMetrics());
  }

  // Closing the index waits for its merge. Then the keys tell where each suffix is, and scans must
  // follow that order.
  std::string reopen() {
    _index.reset();
    const salttest::Keys keys = salttest::readKeys(_path);
    if (salttest::storedMetrics(keys).VacuumInProgress) return "VacuumInProgress";
    const std::string found = difference(keys, &_model);
    if (!found.empty()) return found;
    _index = salttest::loadIndex(_path);
    if (!_index) return "LoadIndex";
    for (const Step& step : _history.steps) {
      const auto results = salttest::scan(*_index, step.prefix);
      const auto expected = _model.scan(step.prefix);
      if (results != expected) return compared(step.prefix, results, expected);
    }
    return "";
  }

  // The second scan of a prefix may be answered from the cache.
  std::string comparedPlaces(const std::string& prefix, const std::vector<std::string>& suffixes) {
    for (int time = 0; time < 2; ++time) {
      const auto found = salttest::scanPlaces(*_index, prefix);
      const salttest::Places expected = salttest::placesOf(suffixes);
      // Suffixes of deleted documents may be counted.
      if (found->places == expected.places && found->suffixes >= expected.suffixes) continue;
      const std::vector<std::string> places(found->places.begin(), found->places.end());
      return fmt::format("{} places, ", found->suffixes) + compared(prefix, places, suffixes);
    }
    return "";
  }

  static std::string compared(const std::string& prefix, const std::vector<std::string>& found,
                              const std::vector<std::string>& expected) {
    return fmt::format("scan {} finds {} instead of {}", testing::PrintToString(prefix),
                       testing::PrintToString(found), testing::PrintToString(expected));
  }

  const History& _history;
  const testsupport::LogCapture _log;
  salttest::Model _model;
  const std::string _path;
  std::unique_ptr<Index> _index;
};

// Runs in its own process, so that an assertion or a deadlock is a fault like any other. Because of
// the fork, this test program must not start threads.
std::string faultOf(const History& history) {
  const testsupport::TemporaryDirectory directory;
  int ends[2];
  EXPECT_EQ(pipe(ends), 0);
  const pid_t child = fork();
  if (child == 0) {
    alarm(kMaxSeconds);
    const std::string fault = Run(history, directory / "index").fault();
    _exit(write(ends[1], fault.data(), fault.size()) == static_cast<ssize_t>(fault.size()) ? 0 : 1);
  }
  close(ends[1]);
  std::string fault;
  char piece[4096];
  for (ssize_t size = 0; (size = read(ends[0], piece, sizeof piece)) > 0;) {
    fault.append(piece, static_cast<size_t>(size));
  }
  close(ends[0]);
  int status = 0;
  EXPECT_EQ(waitpid(child, &status, 0), child);
  return status == 0 ? fault : fmt::format("the process ended with status {:#x}", status);
}

// Merges run at their own pace, so a fault need not show every time.
bool fails(const History& history) {
  for (int i = 0; i < 3; ++i) {
    if (!faultOf(history).empty()) return true;
  }
  return false;
}

// Removes what the failure does not need: steps, large groups first, then the ends of texts.
History shortest(History failing) {
  const auto accept = [&failing](History shorter) {
    const bool good = fails(shorter);
    if (good) failing = std::move(shorter);
    return good;
  };
  for (size_t piece = failing.steps.size() / 2; piece > 0; piece /= 2) {
    for (size_t at = 0; at < failing.steps.size();) {
      History shorter = failing;
      const auto begin = shorter.steps.begin() + static_cast<ptrdiff_t>(at);
      const size_t count = std::min(piece, failing.steps.size() - at);
      shorter.steps.erase(begin, begin + static_cast<ptrdiff_t>(count));
      if (!accept(std::move(shorter))) at += piece;
    }
  }
  for (size_t at = 0; at < failing.steps.size(); ++at) {
    for (History shorter = failing; !shorter.steps[at].operation.text.empty(); shorter = failing) {
      auto& [docID, zoneID, text, offsets, merge] = shorter.steps[at].operation;
      text.resize(text.size() / 2);
      std::erase_if(offsets, [end = text.size()](uint32_t offset) { return offset >= end; });
      if (!accept(shorter)) break;
    }
  }
  return failing;
}

class Histories : public testing::TestWithParam<uint32_t> {};

TEST_P(Histories, AgreeWithTheModel) {
  for (uint32_t i = 0; i < kHistories / 4; ++i) {
    const uint32_t seed = testsupport::firstSeed() + GetParam() * (kHistories / 4) + i;
    const History history = Generator(seed).history();
    const std::string fault = faultOf(history);
    ASSERT_EQ(fault, "") << "seed " << seed << ", in short:\n" << shortest(history);
  }
}

// Four tests, which can run in parallel.
INSTANTIATE_TEST_SUITE_P(Random, Histories, testing::Range(0u, 4u));

}  // namespace
