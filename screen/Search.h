#pragma once

#include <string>
#include <vector>

#include "cli/Options.h"
#include "screen/Glyphs.h"

// What goes between the screen and the threads that work for it.
namespace mailscreen {

// A page of results that is asked for.
struct Search {
  std::string words;
  std::string folder;  // empty for all
  cli::SortOrder order = cli::SortOrder::relevance;
  bool threads = false;
  size_t offset = 0;  // results, or conversations, before the page
  size_t limit = 0;

  bool operator==(const Search&) const = default;
  // Whether the results of both begin alike.
  [[nodiscard]] bool isLike(const Search& other) const {
    return words == other.words && folder == other.folder && order == other.order &&
           threads == other.threads && offset == other.offset;
  }
};

// A result as it is shown: texts of at most kMaxRowColumns, with words marked.
struct Row {
  std::string identifier;
  // Of its file; of a Maildir without its flags, as in the identifier; empty where it has none.
  std::string path;
  // The same, with ":OFFSET" for a message of an mbox file; else the identifier.
  std::string place;
  std::string folder;
  Glyphs date;
  Glyphs from;
  Glyphs subject;
  size_t together = 1;   // results in the conversation that it is the best of
  bool follows = false;  // another of the conversation above
};

inline constexpr size_t kMaxRowColumns = 300;

enum class Failure {
  none,
  query,        // what was typed cannot be searched for
  unreachable,  // the daemon is not there, or went away
  refused       // by the daemon, or there is no index
};

struct Found {
  Search search;
  std::vector<Row> rows = {};
  size_t total = 0;                     // results, or conversations, that are known of
  bool complete = true;                 // there are no others
  std::vector<std::string> words = {};  // to be marked in a mail
  std::string remark = {};              // for the user
  Failure failure = Failure::none;
  std::string reason = {};  // of the failure
};

// A mail that is to be shown.
struct MailRequest {
  std::string identifier;
  std::vector<std::string> words;  // to be marked
  bool whole = false;              // else the beginning, for a preview

  bool operator==(const MailRequest&) const = default;
};

struct Mail {
  MailRequest request;
  Glyphs text;       // or why there is none
  bool cut = false;  // there is more than was asked for
};

}  // namespace mailscreen
