#include "usersyntax/Names.h"

#include <unicode/locid.h>
#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>

#include "platform/Text.h"

namespace usersyntax {

namespace {

// The first row of each value has its English name. Names are in the form that `folded` produces.
struct FieldName {
  std::string_view name;
  Field field;
};
constexpr FieldName kFields[] = {
    {"any", Field::any},
    {"from", Field::from},
    {"to", Field::to},
    {"cc", Field::cc},
    {"bcc", Field::bcc},
    {"with", Field::with},
    {"subject", Field::subject},
    {"body", Field::body},
    {"attachment", Field::attachment},
    {"folder", Field::folder},
    {"list", Field::list},
    {"id", Field::id},
    {"type", Field::type},
    {"is", Field::is},
    {"has", Field::has},
    {"date", Field::date},
    {"before", Field::before},
    {"after", Field::after},
    {"larger", Field::larger},
    {"smaller", Field::smaller},
    // Synonyms.
    {"author", Field::from},
    {"in", Field::folder},
    {"file", Field::attachment},
    {"msgid", Field::id},
    // German
    {"von", Field::from},
    {"an", Field::to},
    {"kopie", Field::cc},
    {"blindkopie", Field::bcc},
    {"mit", Field::with},
    {"betreff", Field::subject},
    {"inhalt", Field::body},
    {"anhang", Field::attachment},
    {"ordner", Field::folder},
    {"liste", Field::list},
    {"typ", Field::type},
    {"ist", Field::is},
    {"hat", Field::has},
    {"datum", Field::date},
    {"vor", Field::before},
    {"nach", Field::after},
    {"großer", Field::larger},
    {"grosser", Field::larger},
    {"groesser", Field::larger},
    {"kleiner", Field::smaller},
    // French, and Spanish if the word is the same
    {"de", Field::from},
    {"a", Field::to},
    {"copie", Field::cc},
    {"avec", Field::with},
    {"objet", Field::subject},
    {"sujet", Field::subject},
    {"corps", Field::body},
    {"dossier", Field::folder},
    {"piece", Field::attachment},
    {"est", Field::is},
    {"avant", Field::before},
    {"apres", Field::after},
    // Spanish
    {"para", Field::to},
    {"copia", Field::cc},
    {"con", Field::with},
    {"asunto", Field::subject},
    {"cuerpo", Field::body},
    {"adjunto", Field::attachment},
    {"carpeta", Field::folder},
    {"lista", Field::list},
    {"tipo", Field::type},
    {"es", Field::is},
    {"tiene", Field::has},
    {"fecha", Field::date},
    {"antes", Field::before},
    {"despues", Field::after},
    {"mayor", Field::larger},
    {"menor", Field::smaller},
};

struct FlagName {
  std::string_view name;
  Flag flag;
};
constexpr FlagName kFlags[] = {
    {"read", Flag::read},
    {"unread", Flag::unread},
    {"flagged", Flag::flagged},
    {"replied", Flag::replied},
    {"junk", Flag::junk},
    {"attachment", Flag::hasAttachment},
    {"seen", Flag::read},
    {"new", Flag::unread},
    {"starred", Flag::flagged},
    {"answered", Flag::replied},
    {"spam", Flag::junk},
    {"attachments", Flag::hasAttachment},
    // German
    {"gelesen", Flag::read},
    {"ungelesen", Flag::unread},
    {"markiert", Flag::flagged},
    {"beantwortet", Flag::replied},
    {"anhang", Flag::hasAttachment},
    // French
    {"lu", Flag::read},
    {"nonlu", Flag::unread},
    {"marque", Flag::flagged},
    {"repondu", Flag::replied},
    {"piece", Flag::hasAttachment},
    // Spanish
    {"leido", Flag::read},
    {"noleido", Flag::unread},
    {"marcado", Flag::flagged},
    {"respondido", Flag::replied},
    {"adjunto", Flag::hasAttachment},
};

struct ConnectiveName {
  std::string_view word;
  Connective connective;
};
constexpr ConnectiveName kConnectives[] = {
    {"AND", Connective::conjunction},  {"OR", Connective::disjunction},
    {"NOT", Connective::negation},     {"UND", Connective::conjunction},
    {"ODER", Connective::disjunction}, {"NICHT", Connective::negation},
    {"OU", Connective::disjunction},   {"SAUF", Connective::negation},
};

}  // namespace

std::string folded(std::string_view text) {
  UErrorCode status = U_ZERO_ERROR;
  const icu::Normalizer2* const normalizer = icu::Normalizer2::getNFDInstance(status);
  const TLString units = platform::fromUTF8(text);
  icu::UnicodeString whole(units.data(), static_cast<int32_t>(units.size()));
  whole.toLower(icu::Locale::getRoot());
  if (U_SUCCESS(status)) whole = normalizer->normalize(whole, status);
  TLString bare;
  for (int32_t i = 0; i < whole.length(); ++i) {
    if (u_charType(whole[i]) != U_NON_SPACING_MARK) bare.push_back(whole[i]);
  }
  return platform::toUTF8(bare);
}

std::optional<Field> fieldNamed(std::string_view name) {
  const std::string wanted = folded(name);
  for (const FieldName& row : kFields) {
    if (row.name == wanted && row.field != Field::any) return row.field;
  }
  return std::nullopt;
}

std::optional<Flag> flagNamed(Field field, std::string_view name) {
  const std::string wanted = folded(name);
  for (const FlagName& row : kFlags) {
    if (row.name != wanted) continue;
    const bool ofHas = row.flag == Flag::hasAttachment;
    if (ofHas == (field == Field::has)) return row.flag;
  }
  return std::nullopt;
}

Connective connectiveNamed(std::string_view word) {
  for (const ConnectiveName& row : kConnectives) {
    if (row.word == word) return row.connective;
  }
  return Connective::none;
}

std::string_view nameOf(Field field) {
  for (const FieldName& row : kFields) {
    if (row.field == field) return row.name;
  }
  return {};
}

std::string_view nameOf(Flag flag) {
  for (const FlagName& row : kFlags) {
    if (row.flag == flag) return row.name;
  }
  return {};
}

}  // namespace usersyntax
