#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <vector>

#include "cli/MailFacts.h"
#include "cli/Results.h"

// Results by conversation.
namespace cli {

// More results than these are not put into threads: their mails have to be read.
inline constexpr size_t kMaxThreadedHits = 10000;

// Message-IDs of the References of one mail that count: the first, and the last of the rest.
inline constexpr size_t kMaxReferences = 100;

// The hits of one conversation, by their place among all hits, best first.
using Thread = std::vector<size_t>;

// Hits are in one thread where one refers to the other by its Message-ID, in References or
// In-Reply-To, or both refer to one message, be it found or not. Threads are in the order of their
// best hits. A mail that cannot be read is a thread of its own.
[[nodiscard]] std::vector<Thread> threadsOf(const Hits& hits, MailFacts& facts);

// What is shown: a part of the threads of these hits.
struct ThreadPage {
  const Hits& hits;
  std::span<const Thread> threads;
  size_t total = 0;      // of all threads
  bool complete = true;  // false: there may be more
};

// A line for each thread: the rank of its best hit, the date of its newest, their senders, the
// subject of the best, and the ranks of all where there are several. As resultsText is.
[[nodiscard]] std::string threadsText(const ThreadPage& page, const std::string& words,
                                      const Palette& palette, size_t columns);
// An object as of resultsJSON, with "threads", each with "subject" and "results", in place of
// "results".
[[nodiscard]] std::string threadsJSON(const ThreadPage& page, MailFacts& facts);

}  // namespace cli
