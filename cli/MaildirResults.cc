#include "cli/MaildirResults.h"

#include <fmt/format.h>

#include <nlohmann/json.hpp>

#include "cli/ByteSource.h"
#include "cli/Commands.h"
#include "cli/LinkFolder.h"
#include "cli/MailFile.h"
#include "cli/Results.h"

namespace cli {

namespace {

struct Counts {
  size_t linked = 0;
  size_t copied = 0;
  size_t leftOut = 0;
};

// The letters of a message that is not in a Maildir, from its Status fields.
std::string statusLetters(const std::string& identifier, MailFacts& facts) {
  using usersyntax::Flag;
  std::string letters;
  for (const auto& [flag, letter] :
       {std::pair(Flag::flagged, 'F'), {Flag::replied, 'R'}, {Flag::read, 'S'}}) {
    if (facts.flag(identifier, flag).value_or(false)) letters += letter;
  }
  return letters;
}

LinkedMail mailOf(const TLIndexableItem& item, const std::string& identifier,
                  const MailLocation& place, MailFacts& facts) {
  constexpr double kMaxSeconds = 1e12;
  const double date = dateOf(item).value_or(0);
  LinkedMail mail;
  mail.identifier = identifier;
  if (date > 0 && date < kMaxSeconds) mail.time = static_cast<int64_t>(date);
  const bool maildir = !place.offset && isMaildirFile(place.path);
  mail.isNew = maildir && place.path.compare(place.path.rfind('/') - 4, 4, "/new") == 0;
  mail.flags = maildir ? std::string(maildirFlags(place.path)) : statusLetters(identifier, facts);
  return mail;
}

// The field is left out if the identifier is too long for a line of a header.
std::string withNote(const std::string& identifier, const std::string& message) {
  constexpr size_t kMaxLine = 998;
  const std::string note = "X-Tallow-Copy-Of: " + identifier;
  return note.size() > kMaxLine ? message : note + '\n' + message;
}

// Fills a folder with one message after another.
class Filling {
 public:
  Filling(LinkFolder& folder, MailFacts& facts) : _folder(folder), _facts(facts) {}

  // False with an error if the folder cannot be written.
  bool add(const Hit& hit, TLErrorOut error) {
    if (addItem(*hit.item, error)) return true;
    for (const auto& copy : hit.copies) {
      if (!_failed && addItem(*copy, error)) return true;
    }
    if (!_failed) ++_counts.leftOut;
    return !_failed;
  }
  [[nodiscard]] const Counts& counts() const { return _counts; }

 private:
  // False if the message cannot be read.
  bool addItem(const TLIndexableItem& item, TLErrorOut error) {
    const std::string identifier = platform::toUTF8(platform::orEmpty(item.identifier()));
    const auto place = _facts.reader().locate(identifier);
    const auto compressed = place ? isCompressed(place->path) : std::nullopt;
    if (!compressed) return false;
    const LinkedMail mail = mailOf(item, identifier, *place, _facts);
    return place->offset || *compressed ? copy(mail, error) : link(mail, place->path, error);
  }

  bool link(const LinkedMail& mail, const std::string& path, TLErrorOut error) {
    _failed = !_folder.addLink(mail, path, error);
    if (!_failed) ++_counts.linked;
    return !_failed;
  }

  bool copy(const LinkedMail& mail, TLErrorOut error) {
    const auto message = _facts.reader().read(mail.identifier, kMaxMessageBytes, nullptr);
    if (!message) return false;
    _failed = !_folder.addCopy(mail, withNote(mail.identifier, *message), error);
    if (!_failed) ++_counts.copied;
    return !_failed;
  }

  LinkFolder& _folder;
  MailFacts& _facts;
  Counts _counts;
  bool _failed = false;  // the folder cannot be written
};

std::string summaryOf(const Counts& counts, const std::string& path) {
  const size_t all = counts.linked + counts.copied;
  std::string text =
      fmt::format("{} {} in {}", all, all == 1 ? "message" : "messages", cleanForTerminal(path));
  if (counts.copied > 0) text += fmt::format(", {} of them copied", counts.copied);
  return text + '\n';
}

std::string jsonOf(const Counts& counts, const std::string& path) {
  return jsonText({{"schema", 1},
                   {"maildir", path},
                   {"linked", counts.linked},
                   {"copied", counts.copied},
                   {"leftOut", counts.leftOut}});
}

}  // namespace

ExitStatus showMaildir(const Options& options, std::span<const Hit> hits, MailFacts& facts) {
  std::optional<TLError> error;
  const auto folder = LinkFolder::begin(options.maildir, &error);
  if (folder == nullptr) return complain(error);
  Filling filling(*folder, facts);
  for (const Hit& hit : hits) {
    if (!filling.add(hit, &error)) return complain(error);
  }
  if (!folder->publish(&error)) return complain(error);
  const Counts& counts = filling.counts();
  if (counts.leftOut > 0) {
    complain(fmt::format("{} messages cannot be read and are left out", counts.leftOut));
  }
  return print(options.format == OutputFormat::json ? jsonOf(counts, folder->path())
                                                    : summaryOf(counts, folder->path()),
               hits.empty() ? ExitStatus::nothingFound : ExitStatus::done);
}

ExitStatus emptyMaildir(const Options& options) {
  std::optional<TLError> error;
  const auto folder = LinkFolder::begin(options.maildir, &error);
  if (folder == nullptr || !folder->publish(&error)) return complain(error);
  return print(options.format == OutputFormat::json ? jsonOf({}, folder->path())
                                                    : summaryOf({}, folder->path()));
}

}  // namespace cli
