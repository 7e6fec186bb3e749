#include "platform/URL.h"

#include <uriparser/Uri.h>

#include <utility>

std::optional<TLURL> TLURL::parse(std::string text) {
  UriUriA uri;
  const char* errorPosition = nullptr;
  if (uriParseSingleUriExA(&uri, text.data(), text.data() + text.size(), &errorPosition) !=
      URI_SUCCESS) {
    return std::nullopt;
  }
  const bool absolute = uri.scheme.first != nullptr;
  uriFreeUriMembersA(&uri);
  if (!absolute) return std::nullopt;
  return TLURL(std::move(text));
}
