#pragma once

#include <functional>
#include <optional>

#include "cli/MailReader.h"
#include "cli/Options.h"
#include "platform/LatestWorker.h"
#include "screen/Search.h"

namespace mailscreen {

// Reads mails for the screen on its own thread ("tallow.preview"). Same rules as Searcher.
class MailLoader {
 public:
  // Limits of a preview: the bytes read from the mail and the length of the text shown.
  static constexpr size_t kPreviewBytes = size_t{1} << 20;
  static constexpr size_t kPreviewText = size_t{64} << 10;

  MailLoader(const cli::Options& options, std::function<void()> wake);

  void submit(MailRequest request) { _worker.submit(std::move(request)); }
  [[nodiscard]] std::optional<Mail> take() { return _worker.take(); }

 private:
  Mail load(const MailRequest& request);

  cli::MailReader _reader;
  platform::LatestWorker<MailRequest, Mail> _worker;
};

}  // namespace mailscreen
