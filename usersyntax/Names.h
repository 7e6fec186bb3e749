#pragma once

#include <optional>
#include <string>
#include <string_view>

// The names of fields, their values and connectives, in several languages.
namespace usersyntax {

enum class Field {
  any,  // no field was named
  from,
  to,
  cc,
  bcc,
  with,  // any of the four before
  subject,
  body,
  attachment,
  folder,
  list,
  id,
  type,
  // Those below do not hold text.
  is,
  has,
  date,
  before,
  after,
  larger,
  smaller
};

enum class Flag { read, unread, flagged, replied, junk, hasAttachment };

enum class Connective { none, conjunction, disjunction, negation };

// The name may be in any case, with or without accents.
[[nodiscard]] std::optional<Field> fieldNamed(std::string_view name);
// Of is: and has:.
[[nodiscard]] std::optional<Flag> flagNamed(Field field, std::string_view name);
// In capitals only: small letters make a word of the text.
[[nodiscard]] Connective connectiveNamed(std::string_view word);

// The English names, as they are printed.
[[nodiscard]] std::string_view nameOf(Field field);
[[nodiscard]] std::string_view nameOf(Flag flag);

// Case and accents taken off, for comparing names.
[[nodiscard]] std::string folded(std::string_view text);

}  // namespace usersyntax
