#pragma once

#include <functional>
#include <optional>
#include <stop_token>
#include <string>
#include <string_view>
#include <vector>

#include "cli/QueryInput.h"
#include "cli/Settings.h"
#include "client/SearchServiceProxy.h"
#include "platform/LatestWorker.h"

namespace desktop {

// A mail in a list of results. The texts are ready to be shown (see displayText).
struct FoundMail {
  std::string identifier;
  std::string subject;
  std::string details;  // sender, date and folder
};
using FoundMails = std::vector<FoundMail>;

// The number of mails that a search finds at most.
inline constexpr size_t kMaxMails = 10;
// Longer input finds nothing.
inline constexpr size_t kMaxWordBytes = 4096;

// A text from mail for one line of a desktop's list, as valid UTF-8 of at most 120 columns. Beside
// what cleanForTerminal does, < and > become single quotation marks, so that no desktop can read
// markup in it.
[[nodiscard]] std::string displayText(std::string_view text);

// Searches as `tallow search` does, on its own thread ("tallow.desktop") and connection. Reads the
// user's settings for each search, and finds nothing unless they switch the desktop search on, nor
// when the search fails; the log has the reason.
//
// `wake` is called on that thread when a result is ready. Used by one thread. No call waits, except
// the destructor, which interrupts the current call.
class MailSearch {
 public:
  MailSearch(std::string runtimeDirectory, std::function<void()> wake);
  ~MailSearch() { _service.interrupt(); }
  MailSearch(const MailSearch&) = delete;
  MailSearch& operator=(const MailSearch&) = delete;

  // Replaces the search before, which then has no result.
  void submit(std::string words) { _worker.submit(std::move(words)); }
  // The result of the last search, once.
  [[nodiscard]] std::optional<FoundMails> take() { return _worker.take(); }

 private:
  // Runs on the worker's thread, like the following functions.
  FoundMails run(const std::string& words, const std::stop_token& stop);
  std::optional<FoundMails> find(const cli::Options& options, const std::stop_token& stop,
                                 TLErrorOut error);

  const std::string _runtimeDirectory;
  client::SearchServiceProxy _service;
  platform::LatestWorker<std::string, FoundMails> _worker;  // last: its thread uses the others
};

// The user's settings if they switch the desktop search on. Nullopt otherwise; wrong settings are
// logged.
[[nodiscard]] std::optional<cli::Settings> settingsIfOn();

}  // namespace desktop
