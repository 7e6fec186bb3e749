#pragma once

#include <optional>
#include <string>
#include <string_view>

// Names of fields, values and connectives in several languages.
namespace usersyntax {

enum class Field {
  any,  // no field was named
  from,
  to,
  cc,
  bcc,
  with,  // any of the four above
  subject,
  body,
  attachment,
  folder,
  list,
  id,
  type,
  // The following do not contain text.
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

// Ignores case and accents.
[[nodiscard]] std::optional<Field> fieldNamed(std::string_view name);
// For is: and has:.
[[nodiscard]] std::optional<Flag> flagNamed(Field field, std::string_view name);
// In capitals only; in small letters it is an ordinary word.
[[nodiscard]] Connective connectiveNamed(std::string_view word);

// The English name, as printed.
[[nodiscard]] std::string_view nameOf(Field field);
[[nodiscard]] std::string_view nameOf(Flag flag);

// Removes case and accents, for comparing names.
[[nodiscard]] std::string folded(std::string_view text);

}  // namespace usersyntax
