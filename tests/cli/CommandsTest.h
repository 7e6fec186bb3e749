#pragma once

#include <gmock/gmock.h>

#include <cstdlib>
#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "platform/Text.h"
#include "querylang/TLQueryAdditions.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "tests/client/FakeDaemon.h"

using testing::HasSubstr;

// The commands in this process, with a daemon that answers as the test says.
class CommandsTest : public testing::Test {
 protected:
  using Arguments = std::vector<std::string>;
  using enum cli::ExitStatus;

  // The client's user files go into a directory of the test.
  CommandsTest() {
    for (const char* const name : {"XDG_STATE_HOME", "XDG_RUNTIME_DIR", "XDG_CONFIG_HOME"}) {
      setenv(name, (home / name).c_str(), 1);
    }
    setenv("TALLOW_SESSION", "test", 1);
  }

  // Runs the program with the arguments and captures its output.
  cli::ExitStatus run(Arguments arguments) {
    arguments.insert(arguments.begin(), {"tallow", "--runtime-dir", daemon.runtimeDirectory()});
    std::vector<const char*> argv;
    for (const std::string& argument : arguments) argv.push_back(argument.c_str());
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    cli::ExitStatus status = failure;
    const auto options = cli::parseCommandLine(static_cast<int>(argv.size()), argv.data(), status);
    if (options) status = cli::runCommand(*options);
    output = testing::internal::GetCapturedStdout();
    errors = testing::internal::GetCapturedStderr();
    return status;
  }
  // The same for a run that must end with this status.
  std::string outputOf(const Arguments& arguments, cli::ExitStatus status = done) {
    EXPECT_EQ(run(arguments), status) << testing::PrintToString(arguments) << errors;
    return output;
  }
  nlohmann::json jsonOf(Arguments arguments, cli::ExitStatus status = done) {
    arguments.insert(arguments.begin(), "--format=json");
    return nlohmann::json::parse(outputOf(arguments, status));
  }
  std::string errorsOf(const Arguments& arguments, cli::ExitStatus status = failure) {
    EXPECT_EQ(run(arguments), status) << testing::PrintToString(arguments);
    return errors;
  }

  void answerWith(std::vector<std::shared_ptr<TLIndexableItem>> items) {
    rpc::BytesArray bytes;
    for (const auto& item : items) bytes.push_back(item->data());
    daemon.answer("SearchItemsForQuery", [bytes](rpc::Reply& reply) { reply.send({bytes}); });
  }

  // The query of the last search that reached the daemon.
  [[nodiscard]] std::shared_ptr<TLQuery> lastQuery() const {
    const std::string begin = "SearchItemsForQuery(<";
    std::string call = begin;
    for (const std::string& one : daemon.calls()) {
      if (one.starts_with(begin)) call = one;
    }
    auto query = std::make_shared<TLQuery>();
    EXPECT_TRUE(query->initWithData(call.substr(begin.size(), call.rfind(">, ") - begin.size())));
    return query;
  }
  static std::string printed(const TLQuery& query) {
    return platform::toUTF8(*query.originalQuery()) +
           TLQueryAdditions::_stringifyQueryTree(query.root().get(), 0, true);
  }

  static std::shared_ptr<TLIndexableItem> result(const char* identifier) {
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(platform::fromUTF8(identifier));
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"Invoice \x1b[31m\u202E");
    item->addAttributeWithKeyStringValue(TLAttributeKey::CONTENT_SNIPPET, u"your invoice\u2008due");
    item->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, 1704700800);
    item->addPersonsWithKey(TLAttributeKey::AUTHORS, {u"billing@example.org"});
    auto card = std::make_shared<TLCard>();
    card->setTextScore(1.5F);
    card->setLightScore(0.75F);
    card->setFreshness(0.5);
    item->setCard(card);
    return item;
  }

  const testsupport::TemporaryDirectory home;
  testsupport::FakeDaemon daemon;
  std::string output;
  std::string errors;
};
