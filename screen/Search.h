#pragma once

#include <string>
#include <vector>

#include "cli/Options.h"
#include "screen/Glyphs.h"

// The messages between the screen and its worker threads.
namespace mailscreen {

// A request for a page of results.
struct Search {
  std::string words;
  std::string folder;  // empty for all
  cli::SortOrder order = cli::SortOrder::relevance;
  bool threads = false;
  size_t offset = 0;  // results, or conversations, before the page
  size_t limit = 0;

  bool operator==(const Search&) const = default;
  // Whether both start at the same result of the same list; the limits may differ.
  [[nodiscard]] bool isLike(const Search& other) const {
    return words == other.words && folder == other.folder && order == other.order &&
           threads == other.threads && offset == other.offset;
  }
};

// A result to show. Texts have at most kMaxRowColumns columns, with the matched words marked.
struct Row {
  std::string identifier;
  // The path of its file; for a Maildir file without the flags, as in the identifier; empty if it
  // has no file.
  std::string path;
  // The path, with ":OFFSET" for a message of an mbox file; the identifier if it has no file.
  std::string place;
  std::string folder;
  Glyphs date;
  Glyphs from;
  Glyphs subject;
  size_t together = 1;   // number of results in the conversation, if it is the best one
  bool follows = false;  // another result of the conversation above
};

inline constexpr size_t kMaxRowColumns = 300;

enum class Failure {
  none,
  query,        // the text cannot be searched for
  unreachable,  // the daemon is not running or has ended
  refused       // by the daemon, or there is no index
};

struct Found {
  Search search;
  std::vector<Row> rows = {};
  size_t total = 0;                     // number of known results, or conversations
  bool complete = true;                 // there are no more
  std::vector<std::string> words = {};  // to mark in a mail
  std::string remark = {};              // for the user
  Failure failure = Failure::none;
  std::string reason = {};  // of the failure
};

// A request to show a mail.
struct MailRequest {
  std::string identifier;
  std::vector<std::string> words;  // to mark
  bool whole = false;              // otherwise only the beginning, for a preview

  bool operator==(const MailRequest&) const = default;
};

struct Mail {
  MailRequest request;
  Glyphs text;       // or the reason why there is none
  bool cut = false;  // the mail is longer than was requested
};

}  // namespace mailscreen
