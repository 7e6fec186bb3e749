#include "screen/MailLoader.h"

#include "cli/MailFile.h"
#include "cli/MailPlaces.h"
#include "cli/MailView.h"
#include "cli/Reading.h"

namespace mailscreen {

namespace {

// Cuts after a complete line, or after a complete character if that would lose more than half.
void cutText(std::string& text, size_t most) {
  size_t end = text.rfind('\n', most);
  if (end == std::string::npos || end < most / 2) {
    for (end = most; (static_cast<unsigned char>(text[end]) & 0xC0) == 0x80; --end) {
    }
  }
  text.resize(end);
}

}  // namespace

MailLoader::MailLoader(const cli::Options& options, std::function<void()> wake)
    : _reader(cli::offsetsOfSync(options)),
      _worker(
          "tallow.preview",
          [this](const MailRequest& request, const std::stop_token&) { return load(request); },
          std::move(wake)) {}

Mail MailLoader::load(const MailRequest& request) {
  Mail mail{request, {}};
  _reader.refresh();
  std::optional<TLError> error;
  const size_t most = request.whole ? cli::kMaxMessageBytes : kPreviewBytes;
  const auto bytes = cli::readSingleMessage(request.identifier, most, _reader, &error);
  const auto view = bytes ? cli::MailView::parse(*bytes) : nullptr;
  if (view == nullptr) {
    mail.text = lineOfGlyphs("(" + (bytes ? "not a mail message" : error->message) + ")");
    return mail;
  }
  const auto place = _reader.locate(request.identifier);
  std::string text =
      cli::readingText(*view, place ? place->path : "", request.words, markingPalette());
  mail.cut = !request.whole && (bytes->size() == most || text.size() > kPreviewText);
  if (mail.cut && text.size() > kPreviewText) cutText(text, kPreviewText);
  mail.text = glyphsOf(text);
  return mail;
}

}  // namespace mailscreen
