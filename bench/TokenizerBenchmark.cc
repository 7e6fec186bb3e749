#include <benchmark/benchmark.h>

#include "tokenizer/Tokenizer.h"

namespace {

constexpr TLStringView kASCIIMail =
    u"On Tue, 3 Feb 2026 at 10:05, John Doe <john.doe@example.org> wrote:\r\n"
    u"> I don't think that the patch in drivers/net/foo_bar.c (line 1024) is right: the lock\r\n"
    u"> is taken twice when probe() fails, see https://example.org/list?id=42 for the trace.\r\n"
    u"Thanks for having a look at it. The version 3.14 of the series fixes this, and what you\r\n"
    u"found in the earlier one as well. Could you please test it on the other machine?\r\n\r\n";
constexpr TLStringView kGermanMail =
    u"Liebe Gr\u00FC\u00DFe aus K\u00F6ln! Wir haben gestern \u00FCber die Fahrt gesprochen und "
    u"wollen am 3. M\u00E4rz gegen 10:30 losfahren, wenn das Wetter es zul\u00E4sst.\r\n";
constexpr TLStringView kRussianMail =
    u"\u0414\u043E\u0431\u0440\u044B\u0439 \u0434\u0435\u043D\u044C, \u043A\u043E\u043B\u043B"
    u"\u0435\u0433\u0438! \u0412\u0441\u0442\u0440\u0435\u0447\u0430 \u0431\u0443\u0434\u0435"
    u"\u0442 \u0432 10:30.\r\n";
constexpr TLStringView kJapaneseMail =
    u"\u304A\u4E16\u8A71\u306B\u306A\u3063\u3066\u304A\u308A\u307E\u3059\u3002\u4F1A\u8B70\u306F"
    u"\u660E\u65E5\u306E\u5348\u524D\u3067\u3059\u3002\r\n";

TLString repeated(TLStringView unit) {
  TLString text;
  while (text.size() < 200000) text += unit;
  return text;
}

// Bytes per second refer to the UTF-8 text.
void run(benchmark::State& state, const tokenizer::Tokenizer& tokenizer, TLStringView unit) {
  const TLString text = repeated(unit);
  std::string out;
  std::vector<uint32_t> offsets;
  for ([[maybe_unused]] auto _ : state) {
    out.clear();
    offsets.clear();
    tokenizer.TokenizeToText(text, out, offsets);
    benchmark::DoNotOptimize(out.data());
  }
  const size_t bytes = platform::toUTF8(text).size();
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes));
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * offsets.size()));
}

void table(benchmark::State& state, TLStringView unit) {
  run(state, *tokenizer::NewFastLexemonTokenizer("en_US"), unit);
}

void unicode(benchmark::State& state, TLStringView unit) {
  run(state, *tokenizer::NewLexemonTokenizer("en_US"), unit);
}

}  // namespace

BENCHMARK_CAPTURE(table, ascii, kASCIIMail);
BENCHMARK_CAPTURE(unicode, ascii, kASCIIMail);
BENCHMARK_CAPTURE(table, german, kGermanMail);
BENCHMARK_CAPTURE(unicode, german, kGermanMail);
BENCHMARK_CAPTURE(table, russian, kRussianMail);
BENCHMARK_CAPTURE(unicode, russian, kRussianMail);
BENCHMARK_CAPTURE(table, japanese, kJapaneseMail);
BENCHMARK_CAPTURE(unicode, japanese, kJapaneseMail);

BENCHMARK_MAIN();
