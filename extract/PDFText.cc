#include <poppler-document.h>
#include <poppler-page.h>

#include <algorithm>
#include <memory>

#include "extract/TextExtraction.h"
#include "platform/Text.h"

namespace extract {

namespace {

constexpr int kMaxPages = 10000;

// A page with a word and no table of its objects, as short as the library accepts it.
constexpr std::string_view kSmallPDF =
    "%PDF-1.4\n"
    "1 0 obj\n<</Type/Catalog/Pages 2 0 R>>\nendobj\n"
    "2 0 obj\n<</Type/Pages/Kids[3 0 R]/Count 1>>\nendobj\n"
    "3 0 obj\n<</Type/Page/Parent 2 0 R/MediaBox[0 0 200 200]"
    "/Resources<</Font<</F 4 0 R>>>>/Contents 5 0 R>>\nendobj\n"
    "4 0 obj\n<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>\nendobj\n"
    "5 0 obj\n<</Length 34>>\nstream\nBT /F 12 Tf 20 90 Td (ready) Tj ET\nendstream\nendobj\n"
    "trailer\n<</Root 1 0 R>>\n";

std::unique_ptr<poppler::document> open(std::string_view bytes) {
  poppler::set_debug_error_function([](const std::string&, void*) {}, nullptr);
  return std::unique_ptr<poppler::document>(
      poppler::document::load_from_raw_data(bytes.data(), static_cast<int>(bytes.size())));
}

std::string textOf(const poppler::page& page) {
  const poppler::ustring units = page.text({}, poppler::page::non_raw_non_physical_layout);
  TLString text(units.begin(), units.end());
  std::erase(text, u'\uFEFF');
  return platform::toUTF8(text);
}

}  // namespace

Extraction textOfPDF(std::string_view bytes, size_t limit) {
  const auto document = open(bytes);
  if (document == nullptr) return {Outcome::damaged, {}};
  if (document->is_locked()) return {Outcome::encrypted, {}};
  TextCollector text(limit);
  const int pages = document->pages();
  int i = 0;
  for (; i < std::min(pages, kMaxPages) && !text.done(); ++i) {
    const std::unique_ptr<poppler::page> page(document->create_page(i));
    if (page != nullptr) text.append(textOf(*page));
    text.endLine();
  }
  return std::move(text).finish(pages > 0 && i == pages);
}

// The library frees what it has loaded with its last document, so one is kept.
void loadPDFLibrary() {
  static const std::unique_ptr<poppler::document> kept = open(kSmallPDF);
  (void)textOfPDF(kSmallPDF, kMaxTextBytes);
}

}  // namespace extract
