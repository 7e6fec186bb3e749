#pragma once

#include <tallow/Error.h>

#include <memory>
#include <optional>
#include <string_view>

namespace tallow {

// What a search looks for. After a move a query may only be assigned to or destroyed. One thread at
// a time.
class Query {
 public:
  // Messages that contain all words, in any field. The last word is a prefix, as if it was still
  // being typed, unless a space follows. Case and accents do not matter.
  [[nodiscard]] static Query words(std::string_view text);

  // The same, but only messages that also match an expression; see below.
  [[nodiscard]] static std::optional<Query> words(std::string_view text, std::string_view filter,
                                                  Error* error);

  // Messages that match an expression such as `kTLItemAuthors == "Mara"`; see tallow-query(7).
  // The daemon does not look up times and flags, nor what nests in an OR: check these on the
  // results. Nullopt with an error for an expression that cannot be parsed or names an unknown
  // attribute.
  [[nodiscard]] static std::optional<Query> expression(std::string_view text, Error* error);

  Query(const Query& other);
  Query(Query&& other) noexcept;
  Query& operator=(const Query& other);
  Query& operator=(Query&& other) noexcept;
  ~Query();

 private:
  friend class Client;
  struct Impl;
  explicit Query(std::unique_ptr<Impl> impl);

  std::unique_ptr<Impl> _impl;
};

}  // namespace tallow
