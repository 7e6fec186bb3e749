#pragma once

#include <tallow/Error.h>
#include <tallow/Item.h>
#include <tallow/Query.h>

#include <chrono>
#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tallow {

// The version of the library that is loaded, such as "1.0.0".
[[nodiscard]] const char* version();

// Where the sockets of the user's daemon are: $RUNTIME_DIRECTORY, else tallow in $XDG_RUNTIME_DIR,
// else /run/tallow.
[[nodiscard]] std::string defaultRuntimeDirectory();

// How to reach a daemon, and as whom.
class Settings {
 public:
  // `name` identifies the client in the daemon's log, and owns its stored state.
  explicit Settings(std::string_view name);
  Settings(const Settings& other);
  Settings& operator=(const Settings& other);
  ~Settings();

  // The protection class, which selects the index; "default" unless set.
  void setProtectionClass(std::string_view protectionClass);
  // defaultRuntimeDirectory() unless set.
  void setRuntimeDirectory(std::string_view directory);
  // How long a call waits for a daemon that is not running yet; 0 unless set.
  void setPatience(std::chrono::milliseconds patience);

 private:
  friend class Client;
  struct Impl;
  std::unique_ptr<Impl> _impl;
};

// A word that a search replaced because it found too little as typed.
struct ReplacedWord {
  std::string typed;
  std::string replacement;
  // "spelling", "synonym" or "stem"; the replacement of a stem is the beginning of words.
  std::string reason;
};

// A connection to the daemon. The first call connects, and so does the first call after the
// connection was lost. Each operation waits for its reply: searches at most two minutes, changes of
// the index at most six hours, since they wait for changes that came before. On failure `error`, if
// not null, is set.
//
// Threads: one at a time, except `interrupt`; clients are independent of each other. Nothing is
// written to the standard error or to a log.
class Client {
 public:
  explicit Client(const Settings& settings);
  Client(const Client&) = delete;
  Client& operator=(const Client&) = delete;
  ~Client();

  // Items with a known identifier replace those in the index. A list that is too long for one call
  // is sent in several, in order; the first failure ends the operation, and earlier calls keep
  // their effect.
  [[nodiscard]] bool index(std::span<const Item> items, Error* error);

  // Deletes by identifier; fails for an identifier that is not in the index, after those before it
  // in the list have been deleted.
  [[nodiscard]] bool remove(std::span<const std::string> identifiers, Error* error);
  // Deletes all items of the groups.
  [[nodiscard]] bool removeGroups(std::span<const std::string> groups, Error* error);
  // Deletes everything in the index of the protection class, also what other clients indexed.
  [[nodiscard]] bool removeAll(Error* error);

  // Deletes, then indexes, and then stores the state, so that a client can tell after a failure how
  // far it came. The state is any bytes.
  [[nodiscard]] bool update(std::span<const Item> items, std::span<const std::string> removed,
                            std::string_view state, Error* error);
  // Reads the state last stored under the client's name: nullopt in `state` if there is none.
  [[nodiscard]] bool lastState(std::optional<std::string>& state, Error* error);

  static constexpr int64_t kNoMaximum = std::numeric_limits<int64_t>::max();

  // Best first. Nullopt on failure.
  [[nodiscard]] std::optional<std::vector<Item>> search(const Query& query, int64_t maximum,
                                                        Error* error);
  // The words that the last search of this client replaced. Nullopt on failure, also if the
  // connection was lost since.
  [[nodiscard]] std::optional<std::vector<ReplacedWord>> replacedWords(Error* error);

  // From any thread: ends the current operation and prevents later ones, which fail as
  // unreachable.
  void interrupt();

 private:
  struct Impl;
  std::unique_ptr<Impl> _impl;
};

}  // namespace tallow
