#pragma once

#include <string>
#include <string_view>
#include <vector>

// Small files of the kinds that attachments have, made by the tests themselves.
namespace samples {

struct ZipEntry {
  std::string name;
  std::string content;
};

// A zip file; `deflated` compresses its entries.
[[nodiscard]] std::string zip(const std::vector<ZipEntry>& entries, bool deflated = true);

// The bytes as gzip(1) or xz(1) compress them.
enum class Compression { gzip, xz };
[[nodiscard]] std::string compressed(const std::string& bytes, Compression by);

// An office document with these paragraphs.
[[nodiscard]] std::string docx(const std::vector<std::string>& paragraphs);
[[nodiscard]] std::string odt(const std::vector<std::string>& paragraphs);

// A PDF file with one line of Latin text on each page. `font` is the font's dictionary.
[[nodiscard]] std::string pdf(const std::vector<std::string>& pages,
                              std::string_view font = "/Subtype/Type1/BaseFont/Helvetica");

// A PDF file with a page that says 京都, in a font without a table of its own: its character map is
// one of the library's data.
[[nodiscard]] std::string japanesePDF();

// A PDF file whose page tree promises `count` pages with the same content.
[[nodiscard]] std::string pdfOfManyPages(size_t count);

// A PDF file that cannot be read without a password, but for the stream that it lacks.
[[nodiscard]] std::string encryptedPDF();

}  // namespace samples
