#include <benchmark/benchmark.h>

#include "html/TALHTMLParsing.h"

namespace {

constexpr std::string_view kNewsletter =
    "<tr><td class=\"cell\" style=\"padding: 0 12px; font-family: Arial, sans-serif\">"
    "<a href=\"https://example.org/track?id=123456&amp;u=abcdef\" target=\"_blank\">The news of "
    "the "
    "week</a>&nbsp;&mdash; what happened in the world of mail, and why it matters for "
    "you.</td></tr>"
    "\r\n";
constexpr std::string_view kProse =
    "<p>Thanks for your message. I will be back in the office on Monday and look at the papers "
    "then; if it can't wait please call, the number is in the signature as ever.</p>\r\n";

void extract(benchmark::State& state, std::string_view unit) {
  std::string html = "<html><head><title>t</title></head><body>";
  while (html.size() < 200000) html += unit;
  for ([[maybe_unused]] auto _ : state) {
    benchmark::DoNotOptimize(
        TALPlainTextFromHTMLData(html, 2147483647, nullptr, platform::kEncodingUTF8));
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * html.size()));
}

}  // namespace

BENCHMARK_CAPTURE(extract, newsletter, kNewsletter);
BENCHMARK_CAPTURE(extract, prose, kProse);
BENCHMARK_CAPTURE(extract, brackets, std::string_view("<"));
BENCHMARK_CAPTURE(extract, entities, std::string_view("&amp;"));

BENCHMARK_MAIN();
