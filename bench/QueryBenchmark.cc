#include <benchmark/benchmark.h>

#include <string>

#include "platform/Log.h"
#include "querylang/TLQueryAdditions.h"

// Measures the way from the text of a query to its optimised tree, with logging as in a program.
namespace {

constexpr const char* kAttributes[] = {"kTLItemSubject", "kTLItemAuthors", "kTLItemTextContent",
                                       "kTLItemRecipients", "kTLItemAuthorEmailAddresses"};

std::string clause(size_t i) {
  return std::string(kAttributes[i % std::size(kAttributes)]) + " == \"*some words " +
         std::to_string(i) + "*\"cdw";
}

// A disjunction of distinct comparisons.
TLString chain(size_t clauses) {
  std::string text = clause(0);
  for (size_t i = 1; i < clauses; ++i) text += " || " + clause(i);
  return platform::fromUTF8(text);
}

// Connectives, constants, numbers, times, and words in five attributes, in groups.
TLString mixture(size_t clauses) {
  std::string text;
  for (size_t i = 0; i < clauses; i += 10) {
    if (i > 0) text += " && ";
    text += "(" + clause(i) + " || (" + clause(i + 1) +
            " && com_quill_mail_read = 1) || false || " +
            "com_quill_mail_dateReceived > $time.today(-7)) && (";
    for (size_t k = 0; k < std::size(kAttributes); ++k) {
      if (k > 0) text += " || ";
      text += std::string(kAttributes[k]) + " = \"word" + std::to_string(i) + "*\"cdw";
    }
    text += ")";
  }
  return platform::fromUTF8(text);
}

void report(benchmark::State& state, const TLString& text) {
  state.SetComplexityN(state.range(0));
  state.SetItemsProcessed(state.iterations() * state.range(0));
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(text.size()));
}

void parse(benchmark::State& state, TLString (*make)(size_t)) {
  const TLString text = make(static_cast<size_t>(state.range(0)));
  const std::string bytes = platform::toUTF8(text);
  for ([[maybe_unused]] auto _ : state) {
    sq::Tree tree;
    if (!sq::parse(bytes.c_str(), tree)) state.SkipWithError("the query does not parse");
    benchmark::DoNotOptimize(tree);
  }
  report(state, text);
}

void build(benchmark::State& state, TLString (*make)(size_t)) {
  const TLString text = make(static_cast<size_t>(state.range(0)));
  for ([[maybe_unused]] auto _ : state) {
    const auto query = TLQueryAdditions::initWithBeaconQueryString(text, true);
    if (!query->hasRoot()) state.SkipWithError("the query is empty");
    benchmark::DoNotOptimize(query);
  }
  report(state, text);
}

}  // namespace

#define SIZES RangeMultiplier(10)->Range(10, 100000)->Unit(benchmark::kMicrosecond)->Complexity()
BENCHMARK_CAPTURE(parse, chain, chain)->SIZES;
BENCHMARK_CAPTURE(build, chain, chain)->SIZES;
BENCHMARK_CAPTURE(build, mixture, mixture)->SIZES;

BENCHMARK_MAIN();
