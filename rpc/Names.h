#pragma once

#include <algorithm>
#include <cstddef>
#include <string>

// What the two ends of the RPC must agree on.
namespace rpc {

// The services. Each has a socket of its name in the runtime directory.
inline constexpr const char* kSearchServiceName = "com.quill.tallowsearch.SearchService";
inline constexpr const char* kDebugServiceName = "com.quill.tallow.DebugService";

// The second interface of the search service's object.
inline constexpr const char* kSearchExplanationName = "com.quill.tallowsearch.SearchExplanation";

// The D-Bus error name for error objects; the body has message, domain and code.
inline constexpr const char* kErrorName = "com.quill.tallow.Error";
inline constexpr const char* kInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";

// Maximum number of elements of an array argument. Eight bytes on the wire become an object in
// memory, so a longer array is refused, and the client sends several calls.
inline constexpr size_t kMaxArrayElements = 262144;

// The path of a service's only object.
[[nodiscard]] inline std::string objectPath(const std::string& serviceName) {
  std::string path = '/' + serviceName;
  std::replace(path.begin(), path.end(), '.', '/');
  return path;
}

}  // namespace rpc
