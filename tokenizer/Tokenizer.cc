#include "tokenizer/Tokenizer.h"

#include <unicode/uchar.h>
#include <unicode/utext.h>

#include <algorithm>
#include <bitset>
#include <exception>
#include <utility>

#include "platform/Log.h"
#include "tokenizer/lexemon/Lexemon.h"

namespace tokenizer {

namespace {

using lexemon::analysis::DefaultAnalyzerFactory;
using lexemon::analysis::TokenStream;
using lexemon::analysis::tokenattributes::CharTermAttribute;
using lexemon::util::ULocale;

constexpr platform::Log kLog(platform::kSubsystem, "Tokenizer");
constexpr size_t kListReserve = 16;

void appendWord(TLStringView word, std::string& out, std::vector<uint32_t>& offsets) {
  offsets.push_back(static_cast<uint32_t>(out.size()));
  platform::appendUTF8(word, out);
  out.push_back(' ');
}

// The library's objects for one locale. The constructor throws if the library rejects it.
struct Library {
  explicit Library(const std::string& name)
      : factory(std::make_unique<DefaultAnalyzerFactory>(
            DefaultAnalyzerFactory::Options(DefaultAnalyzerFactory::kOptions))),
        locale(name, "", "", "") {
    static_cast<void>(factory->analyzer(locale));
  }
  [[nodiscard]] const lexemon::analysis::Analyzer& analyzer() const {
    return factory->analyzer(locale);
  }

  std::unique_ptr<DefaultAnalyzerFactory> factory;
  ULocale locale;
};

class LexemonTokenizer : public Tokenizer {
 public:
  explicit LexemonTokenizer(const std::string& locale) : _library(locale) {}

  void TokenizeToText(TLStringView text, std::string& out,
                      std::vector<uint32_t>& offsets) const override {
    forEachWord(text, [&](const TLString& word) { appendWord(word, out, offsets); });
  }

  void TokenizeToList(TLStringView text, std::vector<TLString>& out) const override {
    if (out.empty() && out.capacity() < kListReserve) out.reserve(kListReserve);
    forEachWord(text, [&](const TLString& word) { out.push_back(word); });
  }

 private:
  template <typename Take>
  void forEachWord(TLStringView text, const Take& take) const {
    try {
      const auto chain = _library.analyzer().tokenize(text);
      const lexemon::Token* last = chain->getLast();
      lexemon::TokenIterator token(chain->getFirst(), last == nullptr ? nullptr : last->getNext());
      for (const lexemon::TokenIterator end = token.end(); token != end; ++token) {
        if ((*token).isSignificant()) take((*token).getCleanValue());
      }
    } catch (const std::exception& exception) {
      kLog.error("Failed to tokenize text with exception: {}", exception.what());
    }
  }

  const Library _library;
};

class FastLexemonTokenizer : public Tokenizer {
 public:
  explicit FastLexemonTokenizer(const std::string& locale) : _library(locale) {}

  void TokenizeToText(TLStringView text, std::string& out,
                      std::vector<uint32_t>& offsets) const override {
    UErrorCode status = U_ZERO_ERROR;
    const UTextHandle opened(utext_openUChars(nullptr, text.data(), length(text), &status));
    if (U_FAILURE(status)) {
      kLog.error("Failed to tokenize text with exception: {}", static_cast<int>(status));
      return;
    }
    forEachTerm(opened.get(), [&](const TLString& word) { appendWord(word, out, offsets); });
  }

  void TokenizeToList(TLStringView text, std::vector<TLString>& out) const override {
    UText buffer = UTEXT_INITIALIZER;
    UErrorCode status = U_ZERO_ERROR;
    const UTextHandle opened(utext_openUChars(&buffer, text.data(), length(text), &status));
    if (U_FAILURE(status)) return;
    if (out.empty() && out.capacity() < kListReserve) out.reserve(kListReserve);
    forEachTerm(opened.get(), [&](const TLString& word) { out.push_back(word); });
  }

 private:
  struct UTextCloser {
    void operator()(UText* text) const { utext_close(text); }
  };
  using UTextHandle = std::unique_ptr<UText, UTextCloser>;

  static int64_t length(TLStringView text) { return static_cast<int64_t>(text.size()); }

  template <typename Take>
  void forEachTerm(UText* text, const Take& take) const {
    const std::unique_ptr<TokenStream> stream = _library.analyzer().tokenStream(text);
    if (stream->getAttribute() == nullptr) {
      stream->addAttributeImpl(std::make_shared<CharTermAttribute>());
    }
    const CharTermAttribute& current = *stream->getAttribute();
    stream->reset();
    while (stream->increment()) take(current.term());
    stream->end();
    stream->close();
  }

  const Library _library;
};

class SpaceTokenizer : public Tokenizer {
 public:
  void TokenizeToText(TLStringView text, std::string& out,
                      std::vector<uint32_t>& offsets) const override {
    const size_t start = out.size();
    platform::appendUTF8(text, out);
    for (size_t i = start; i < out.size(); ++i) {
      if (out[i] != ' ' && (i == start || out[i - 1] == ' ')) {
        offsets.push_back(static_cast<uint32_t>(i));
      }
    }
  }

  void TokenizeToList(TLStringView text, std::vector<TLString>& out) const override {
    std::string bytes;
    std::vector<uint32_t> offsets;
    TokenizeToText(text, bytes, offsets);
    offsets.push_back(static_cast<uint32_t>(bytes.size() + 1));
    for (size_t i = 0; i + 1 < offsets.size(); ++i) {
      const std::string_view word(bytes.data() + offsets[i], offsets[i + 1] - offsets[i] - 1);
      out.push_back(platform::fromUTF8(word));
    }
  }
};

}  // namespace

std::unique_ptr<Tokenizer> NewLexemonTokenizer(const std::string& locale) {
  kLog.info("Creating lexemon tokenizer for locale: {}", locale);
  try {
    return std::make_unique<LexemonTokenizer>(locale);
  } catch (const std::exception& exception) {
    kLog.error("Failed to create lexemon tokenizer for locale: {} with exception: {}", locale,
               exception.what());
    return nullptr;
  }
}

std::unique_ptr<Tokenizer> NewFastLexemonTokenizer(const std::string& locale) {
  kLog.info("Creating fast lexemon tokenizer for locale: {}", locale);
  try {
    return std::make_unique<FastLexemonTokenizer>(locale);
  } catch (const std::exception& exception) {
    kLog.error("Failed to create fast lexemon tokenizer for locale: {} with exception: {}", locale,
               exception.what());
    return nullptr;
  }
}

std::unique_ptr<Tokenizer> NewSpaceTokenizer() {
  kLog.info("Creating space tokenizer");
  return std::make_unique<SpaceTokenizer>();
}

}  // namespace tokenizer

namespace {

using UnitSet = std::bitset<0x10000>;

UnitSet makeSpecialUnits() {
  constexpr uint32_t kCategories =
      U_GC_P_MASK | U_GC_S_MASK | U_GC_Z_MASK | U_GC_CC_MASK | U_GC_CF_MASK;
  UnitSet units;
  for (UChar32 c = 0; c < 0x10000; ++c) {
    units[static_cast<size_t>(c)] = (U_GET_GC_MASK(c) & kCategories) != 0;
  }
  return units;
}

}  // namespace

bool isSpecialUnit(char16_t unit) {
  static const UnitSet kSpecial = makeSpecialUnits();
  return kSpecial[unit];
}

bool hasTrailingSpecialChar(TLStringView text) {
  return !text.empty() && isSpecialUnit(text.back());
}
