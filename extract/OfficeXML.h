#pragma once

#include <expat.h>

#include <memory>
#include <string_view>

#include "extract/TextExtraction.h"

namespace extract {

// Collects the text of one XML file of an office document: of OpenDocument the paragraphs and
// headings, of Office Open XML the text runs. Elements are known by their names without prefix.
// Deleted text of tracked changes is left out. Declares no entity and opens nothing. One thread.
class OfficeXML {
 public:
  static constexpr int kMaxDepth = 512;

  // `kind` is openDocument or officeXML. `text` must outlive this object.
  OfficeXML(Kind kind, TextCollector& text);

  // Takes the next part of the file. False if it is not well-formed, too deep, or defines entities,
  // and if the text is done; then no more is taken.
  bool feed(std::string_view part);
  // The same at the end of the file.
  bool end();

 private:
  struct Free {
    void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
  };

  void opened(std::string_view name);
  void closed(std::string_view name);
  [[nodiscard]] bool isText(std::string_view name) const;
  [[nodiscard]] bool isSkipped(std::string_view name) const;
  void stop() { XML_StopParser(_parser.get(), XML_FALSE); }

  const bool _openDocument;
  TextCollector& _text;
  const std::unique_ptr<XML_ParserStruct, Free> _parser;
  int _depth = 0;
  int _textDepth = 0;     // of nested elements with text
  int _skippedDepth = 0;  // of nested elements whose text is skipped
};

}  // namespace extract
