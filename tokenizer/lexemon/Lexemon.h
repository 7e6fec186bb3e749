#pragma once

#include <unicode/utext.h>

#include <bitset>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "platform/Mutex.h"
#include "platform/Text.h"
#include "tokenizer/lexemon/WordScanner.h"

// The linguistic library under the tokenizers, built on ICU. WordScanner defines what a word is and
// how it is cleaned.
//
// Threads: an analyzer factory, its analyzers and the registration service may be used by many
// threads at once; chains, streams and attributes by one thread at a time.
namespace lexemon {

// One token of a chain, owned by the chain.
class Token {
 public:
  Token(bool significant, TLString cleanValue)
      : _significant(significant), _cleanValue(std::move(cleanValue)) {}

  // Null after the last.
  [[nodiscard]] const Token* getNext() const { return _next; }
  // False for a token that stands for text without words; its clean value is empty.
  [[nodiscard]] bool isSignificant() const { return _significant; }
  [[nodiscard]] const TLString& getCleanValue() const { return _cleanValue; }

 private:
  friend class TokenChain;

  const Token* _next = nullptr;
  const bool _significant;
  const TLString _cleanValue;
};

class TokenChain {
 public:
  TokenChain() = default;
  TokenChain(const TokenChain&) = delete;
  TokenChain& operator=(const TokenChain&) = delete;

  void append(bool significant, TLString cleanValue);

  // Null for an empty chain.
  [[nodiscard]] const Token* getFirst() const {
    return _tokens.empty() ? nullptr : &_tokens.front();
  }
  [[nodiscard]] const Token* getLast() const { return _tokens.empty() ? nullptr : &_tokens.back(); }

 private:
  std::deque<Token> _tokens;
};

// Iterates from a first token up to, but not including, an end token.
class TokenIterator {
 public:
  TokenIterator(const Token* first, const Token* end) : _token(first), _end(end) {}

  const Token& operator*() const { return *_token; }
  TokenIterator& operator++() {
    _token = _token->getNext();
    return *this;
  }
  bool operator!=(const TokenIterator& other) const { return _token != other._token; }
  [[nodiscard]] TokenIterator end() const { return {_end, _end}; }

 private:
  const Token* _token;
  const Token* _end;
};

namespace util {

class ULocale {
 public:
  // Throws std::invalid_argument for a name without a language.
  ULocale(const std::string& name, const std::string& country, const std::string& variant,
          const std::string& keywords);

  // In canonical form, e.g. "en_US".
  [[nodiscard]] const std::string& name() const { return _name; }

 private:
  std::string _name;
};

class StringUtils {
 public:
  [[nodiscard]] static std::string to_string(TLStringView text) { return platform::toUTF8(text); }
  [[nodiscard]] static TLString to_u16string(std::string_view bytes) {
    return platform::fromUTF8(bytes);
  }
};

}  // namespace util

namespace analysis {

class TokenStream;

namespace tokenattributes {

// The current term of a stream; its buffer is reused.
class CharTermAttribute {
 public:
  [[nodiscard]] const TLString& term() const { return _term; }

 private:
  friend class analysis::TokenStream;

  TLString _term;
};

}  // namespace tokenattributes

namespace util {

class AttributeSource {
 public:
  // Null until one is added.
  [[nodiscard]] tokenattributes::CharTermAttribute* getAttribute() const { return _term.get(); }
  void addAttributeImpl(std::shared_ptr<tokenattributes::CharTermAttribute> term) {
    _term = std::move(term);
  }

 protected:
  std::shared_ptr<tokenattributes::CharTermAttribute> _term;
};

}  // namespace util

// The terms of a text. Requires a term attribute. Before reset, and after end or close, it has no
// terms.
class TokenStream : public util::AttributeSource {
 public:
  // Both must outlive the stream.
  TokenStream(UText* text, const std::string& locale);

  void reset();
  // Moves to the next term; false after the last. Throws std::runtime_error if ICU fails.
  [[nodiscard]] bool increment();
  void end() { _scanner.reset(); }
  void close() { _scanner.reset(); }

 private:
  const TLString _copy;  // for a text that is not in memory as one piece
  const TLStringView _text;
  const std::string& _locale;
  std::optional<WordScanner> _scanner;
};

// Splits texts by the rules of one locale.
class Analyzer {
 public:
  // Throws std::runtime_error if ICU has no rules.
  explicit Analyzer(std::string locale);

  [[nodiscard]] std::unique_ptr<TokenChain> tokenize(TLStringView text) const;
  [[nodiscard]] std::unique_ptr<TokenStream> tokenStream(UText* text) const;

 private:
  const std::string _locale;
};

class DefaultAnalyzerFactory {
 public:
  using Options = std::bitset<12>;

  // The only set of options that is implemented.
  static constexpr unsigned long kOptions = 2058;

  // Throws std::invalid_argument for any other set.
  explicit DefaultAnalyzerFactory(Options options);

  // Created at the first call and owned by the factory. Throws as Analyzer does.
  [[nodiscard]] const Analyzer& analyzer(const lexemon::util::ULocale& locale);

 private:
  platform::Mutex _mutex;
  std::map<std::string, std::unique_ptr<Analyzer>> _analyzers TL_GUARDED_BY(_mutex);
};

}  // namespace analysis

namespace resources {

// ICU contains all of its data, so a registered path is merely stored.
class DataRegistrationService {
 public:
  static void registerDataPathForLanguage(const std::string& language, const std::string& path);
  [[nodiscard]] static std::optional<std::string> dataPathForLanguage(const std::string& language);
};

}  // namespace resources

}  // namespace lexemon
