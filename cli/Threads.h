#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <vector>

#include "cli/MailFacts.h"
#include "cli/Results.h"

// Groups results by conversation.
namespace cli {

// Maximum number of results to group, because each mail must be read.
inline constexpr size_t kMaxThreadedHits = 10000;

// Maximum number of References of one mail that count: the first, and the last of the others.
inline constexpr size_t kMaxReferences = 100;

// The hits of one conversation as indexes into all hits, best first.
using Thread = std::vector<size_t>;

// Hits are in one thread if one refers to the other by Message-ID, in References or In-Reply-To, or
// if both refer to the same message, found or not. Threads are ordered by their best hit. A mail
// that cannot be read is its own thread.
[[nodiscard]] std::vector<Thread> threadsOf(const Hits& hits, MailFacts& facts);

// The part of the threads to show.
struct ThreadPage {
  const Hits& hits;
  std::span<const Thread> threads;
  size_t total = 0;      // of all threads
  bool complete = true;  // false: there may be more
};

// One line per thread: the rank of its best hit, the date of its newest hit, all senders, the
// subject of the best hit, and all ranks if there are several. Otherwise as resultsText.
[[nodiscard]] std::string threadsText(const ThreadPage& page, const std::string& words,
                                      const Palette& palette, size_t columns);
// An object as from resultsJSON, with "threads" instead of "results"; each thread has "subject" and
// "results".
[[nodiscard]] std::string threadsJSON(const ThreadPage& page, MailFacts& facts);

}  // namespace cli
