#include "tests/extract/Samples.h"

#include <archive.h>
#include <archive_entry.h>
#include <fmt/format.h>

namespace samples {

namespace {

// Joins the objects of a PDF file, numbered from 1, with a table of where they are. The first is
// the catalog.
std::string pdfOf(const std::vector<std::string>& objects, std::string_view trailer = {}) {
  std::string file = "%PDF-1.4\n";
  std::string table = fmt::format("xref\n0 {}\n0000000000 65535 f \n", objects.size() + 1);
  for (size_t i = 0; i < objects.size(); ++i) {
    table += fmt::format("{:010} 00000 n \n", file.size());
    file += fmt::format("{} 0 obj\n{}\nendobj\n", i + 1, objects[i]);
  }
  return file + table +
         fmt::format("trailer\n<</Size {}/Root 1 0 R{}>>\nstartxref\n{}\n%%EOF\n",
                     objects.size() + 1, trailer, file.size());
}

std::string streamOf(std::string_view content) {
  return fmt::format("<</Length {}>>\nstream\n{}\nendstream", content.size(), content);
}

std::string lineOf(std::string_view text) {
  return streamOf(fmt::format("BT /F 12 Tf 20 90 Td {} Tj ET", text));
}

constexpr const char* kPage =
    "<</Type/Page/Parent 2 0 R/MediaBox[0 0 600 200]/Resources<</Font<</F 3 0 R>>>>"
    "/Contents {} 0 R>>";

// The file that a writer of some format makes of these entries. Frees the writer.
std::string written(archive* writer, const std::vector<ZipEntry>& entries) {
  size_t room = 65536;
  for (const ZipEntry& entry : entries) room += entry.name.size() * 2 + entry.content.size() + 512;
  std::string file(room, '\0');
  size_t used = 0;
  archive_write_open_memory(writer, file.data(), file.size(), &used);
  archive_entry* const header = archive_entry_new();
  for (const ZipEntry& entry : entries) {
    archive_entry_clear(header);
    archive_entry_set_pathname(header, entry.name.c_str());
    archive_entry_set_size(header, static_cast<la_int64_t>(entry.content.size()));
    archive_entry_set_filetype(header, AE_IFREG);
    archive_write_header(writer, header);
    archive_write_data(writer, entry.content.data(), entry.content.size());
  }
  archive_entry_free(header);
  archive_write_free(writer);
  file.resize(used);
  return file;
}

}  // namespace

std::string zip(const std::vector<ZipEntry>& entries, bool deflated) {
  archive* const writer = archive_write_new();
  archive_write_set_format_zip(writer);
  archive_write_set_options(writer, deflated ? "zip:compression=deflate" : "zip:compression=store");
  return written(writer, entries);
}

std::string compressed(const std::string& bytes, Compression by) {
  archive* const writer = archive_write_new();
  archive_write_set_format_raw(writer);
  archive_write_add_filter(writer,
                           by == Compression::gzip ? ARCHIVE_FILTER_GZIP : ARCHIVE_FILTER_XZ);
  archive_write_set_bytes_in_last_block(writer, 1);
  return written(writer, {{"", bytes}});
}

std::string docx(const std::vector<std::string>& paragraphs) {
  std::string body;
  for (const std::string& paragraph : paragraphs) {
    body += fmt::format("<w:p><w:r><w:t>{}</w:t></w:r></w:p>", paragraph);
  }
  return zip({{"[Content_Types].xml", "<Types/>"},
              {"word/document.xml",
               "<?xml version=\"1.0\" encoding=\"UTF-8\"?><w:document xmlns:w=\"urn:w\"><w:body>" +
                   body + "</w:body></w:document>"}});
}

std::string odt(const std::vector<std::string>& paragraphs) {
  std::string body;
  for (const std::string& paragraph : paragraphs) body += "<text:p>" + paragraph + "</text:p>";
  return zip({{"mimetype", "application/vnd.oasis.opendocument.text"},
              {"content.xml",
               "<?xml version=\"1.0\"?><office:document-content xmlns:office=\"urn:o\" "
               "xmlns:text=\"urn:t\"><office:body>" +
                   body + "</office:body></office:document-content>"}});
}

std::string pdf(const std::vector<std::string>& pages, std::string_view font) {
  std::string kids;
  std::vector<std::string> objects{"<</Type/Catalog/Pages 2 0 R>>", "",
                                   fmt::format("<</Type/Font{}>>", font)};
  for (const std::string& page : pages) {
    kids += fmt::format("{} 0 R ", objects.size() + 1);
    objects.push_back(fmt::format(fmt::runtime(kPage), objects.size() + 2));
    objects.push_back(lineOf(page.starts_with('<') ? page : '(' + page + ')'));
  }
  objects[1] = fmt::format("<</Type/Pages/Kids[{}]/Count {}>>", kids, pages.size());
  return pdfOf(objects);
}

std::string japanesePDF() {
  return pdf({"<4EAC90FD>"},
             "/Subtype/Type0/BaseFont/Any/Encoding/UniJIS-UTF16-H/DescendantFonts[<</Type/Font"
             "/Subtype/CIDFontType0/BaseFont/Any/CIDSystemInfo<</Registry(Adobe)/Ordering(Japan1)"
             "/Supplement 4>>/FontDescriptor<</Type/FontDescriptor/FontName/Any/Flags 4>>>>]");
}

std::string pdfOfManyPages(size_t count) {
  std::string kids;
  for (size_t i = 0; i < count; ++i) kids += fmt::format("{} 0 R ", i + 5);
  std::vector<std::string> objects{"<</Type/Catalog/Pages 2 0 R>>",
                                   fmt::format("<</Type/Pages/Kids[{}]/Count {}>>", kids, count),
                                   "<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>",
                                   lineOf("(leaf of very many)")};
  for (size_t i = 0; i < count; ++i) objects.push_back(fmt::format(fmt::runtime(kPage), 4));
  return pdfOf(objects);
}

std::string encryptedPDF() {
  const std::string key(32, 'k');
  return pdfOf(
      {"<</Type/Catalog/Pages 2 0 R>>", "<</Type/Pages/Kids[]/Count 0>>"},
      fmt::format("/ID[<00><00>]/Encrypt<</Filter/Standard/V 1/R 2/P -4/O({})/U({})>>", key, key));
}

}  // namespace samples
