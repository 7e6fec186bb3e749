#include "desktop/MailSearch.h"

#include <fmt/format.h>

#include <array>
#include <utility>

#include "cli/HitSearch.h"
#include "cli/MailPlaces.h"
#include "cli/SavedSearches.h"
#include "cli/StateDirectory.h"
#include "cli/Terminal.h"
#include "platform/Clock.h"
#include "platform/Log.h"

namespace desktop {

namespace {

constexpr size_t kMaxColumns = 120;
// More than kMaxColumns characters take, so that a subject of a megabyte costs no more.
constexpr size_t kMaxTextBytes = 2048;

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "DesktopSearch");
  return handle;
}

std::string replaced(std::string text, std::string_view from, std::string_view to) {
  for (size_t at = 0; (at = text.find(from, at)) != std::string::npos; at += to.size()) {
    text.replace(at, from.size(), to);
  }
  return text;
}

FoundMail mailOf(const TLIndexableItem& item) {
  const std::array<std::string, 3> details{cli::authorsText(item), cli::dateText(item),
                                           cli::folderName(item)};
  FoundMail mail{platform::toUTF8(platform::orEmpty(item.identifier())),
                 displayText(cli::subjectText(item)),
                 {}};
  if (mail.subject.empty()) mail.subject = "(no subject)";
  for (const std::string& detail : details) {
    if (detail.empty()) continue;
    mail.details += (mail.details.empty() ? "" : " · ") + displayText(detail);
  }
  return mail;
}

}  // namespace

std::string displayText(std::string_view text) {
  const std::string line =
      cli::fitted(cli::cleanForTerminal(text.substr(0, kMaxTextBytes)), kMaxColumns);
  return replaced(replaced(line, "<", "‹"), ">", "›");
}

std::optional<cli::Settings> settingsIfOn() {
  const auto read = cli::readSettings();
  if (const auto* wrong = std::get_if<std::string>(&read)) log().error("{}", *wrong);
  const auto* settings = std::get_if<cli::Settings>(&read);
  if (settings == nullptr || !settings->desktopSearch) return std::nullopt;
  return *settings;
}

MailSearch::MailSearch(std::string runtimeDirectory, std::function<void()> wake)
    : _runtimeDirectory(std::move(runtimeDirectory)),
      _service(_runtimeDirectory),
      _worker(
          "tallow.desktop",
          [this](const std::string& words, const std::stop_token& stop) {
            return run(words, stop);
          },
          std::move(wake)) {}

FoundMails MailSearch::run(const std::string& words, const std::stop_token& stop) {
  const auto settings = settingsIfOn();
  if (!settings || words.size() > kMaxWordBytes) return {};
  cli::Options options;
  options.runtimeDirectory = _runtimeDirectory;
  options.protectionClass = settings->desktopClass;
  options.arguments = cli::argumentsOf(words);
  options.limit = kMaxMails;
  std::optional<TLError> error;
  auto mails = find(options, stop, &error);
  // The daemon may have been restarted.
  if (!mails && rpc::isUnreachable(error)) mails = find(options, stop, &error);
  if (!mails) log().info("Nothing was searched: {}", platform::printable(error));
  return mails.value_or(FoundMails());
}

std::optional<FoundMails> MailSearch::find(const cli::Options& options, const std::stop_token& stop,
                                           TLErrorOut error) {
  cli::Options expanded = options;
  if (!cli::expandSavedSearches(expanded.arguments, error)) return std::nullopt;
  const auto input = cli::queryInput(expanded, platform::secondsSince1970(), error);
  if (!input) return std::nullopt;
  // The daemon would make an index for it.
  if (cli::isUnknownClass(expanded)) return FoundMails();
  cli::MailFacts facts(cli::offsetsOfSync(expanded));
  const auto outcome = cli::findHits(expanded, input->plan, _service, facts, error, stop);
  if (!outcome) return std::nullopt;
  FoundMails mails;
  for (const cli::Hit& hit : outcome->hits) {
    if (mails.size() < kMaxMails) mails.push_back(mailOf(*hit.item));
  }
  return mails;
}

}  // namespace desktop
