#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <variant>

#include "cli/MailFile.h"
#include "cli/MailWalker.h"
#include "cli/MessageParser.h"

namespace testsupport {

// Calls `take` with each of the sample mails: the path of its file, its bytes, its place, and what
// the parser makes of it. Anything that cannot be read is a failure of the test.
inline void forEachSampleMail(
    const std::function<void(const std::string& path, std::string_view bytes,
                             const cli::MessageOrigin& origin, const TLIndexableItem& item)>&
        take) {
  const auto fail = [](const std::string& where, const std::string& reason) {
    ADD_FAILURE() << where << ": " << reason;
    return true;
  };
  cli::MessageParser parser;
  std::string path;
  const cli::MailSink sink{[&](std::string_view bytes, const cli::MessageOrigin& origin) {
                             const auto result = parser.parse(bytes, origin);
                             const auto& message = std::get<cli::ParsedMessage>(result);
                             EXPECT_FALSE(message.cut);
                             take(path, bytes, origin, *message.item);
                             return true;
                           },
                           fail, [](const std::string& ignored) { ADD_FAILURE() << ignored; },
                           [](uint64_t) {}};
  const auto readFile = [&](const std::string& file, bool named, uint64_t) {
    path = file;
    return cli::readMailFile(file, named, sink);
  };
  cli::walkMail(TALLOW_SAMPLE_MAIL, {readFile, fail});
}

}  // namespace testsupport
