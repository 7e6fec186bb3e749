#include "tests/client/FakeDaemon.h"

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <gtest/gtest.h>

namespace testsupport {

namespace {

// The next argument, by its type; removes the type from the signature.
std::string readArgument(rpc::Arguments& arguments, std::string& signature,
                         std::vector<std::string>& items) {
  const auto take = [&](const char* type) {
    const std::string wanted(type);
    const bool matches = signature.compare(0, wanted.size(), wanted) == 0;
    if (matches) signature.erase(0, wanted.size());
    return matches;
  };
  if (take("aay")) {
    std::vector<std::string> sizes;
    for (const std::string_view bytes : arguments.readBytesArray()) {
      sizes.push_back(fmt::format("{} bytes", bytes.size()));
      items.emplace_back(bytes);
    }
    return fmt::format("[{}]", fmt::join(sizes, ", "));
  }
  if (take("as")) return fmt::format("[{}]", fmt::join(arguments.readStringArray(), ", "));
  if (take("ay")) return fmt::format("<{}>", arguments.readBytes());
  if (take("s")) return std::string(arguments.readString());
  if (take("b")) return arguments.readBoolean() ? "true" : "false";
  if (take("t")) return std::to_string(arguments.readUInt64());
  EXPECT_TRUE(take("x"));
  return std::to_string(arguments.readInt64());
}

}  // namespace

FakeDaemon::FakeDaemon() {
  using rpc::Bytes;
  addMethod(_search, "IndexItems", "aayss", "", {});
  addMethod(_search, "DeleteItemsWithIdentifiers", "asss", "", {});
  addMethod(_search, "IndexItemsDeleteItemsWithIdentifiers", "aayasbayss", "", {});
  addMethod(_search, "FetchLastClientState", "ss", "bay", {false, rpc::Bytes{}});
  addMethod(_search, "DeleteItemsWithDomainIdentifiers", "asss", "", {});
  addMethod(_search, "DeleteAllItems", "ss", "", {});
  addMethod(_search, "SearchItemsForQuery", "aytsx", "aay", {rpc::BytesArray{}});
  _explanation.name = "com.quill.tallowsearch.SearchExplanation";
  addMethod(_explanation, "FetchReplacedWords", "", "a(sss)", {rpc::TextRows{}});
  addMethod(_debug, "Ping", "s", "s", {std::string("pong")});
  addMethod(_debug, "FetchStatsForIndexer", "ss", "a{sv}", {rpc::Dictionary{}});
  addMethod(_debug, "FetchStatsForSalt", "ss", "s", {std::string("metrics")});
  addMethod(_debug, "ForceVacuumAndCompact", "s", "", {});
  for (auto [name, interface] : {std::pair("com.quill.tallowsearch.SearchService", &_search),
                                 std::pair("com.quill.tallow.DebugService", &_debug)}) {
    auto listener = rpc::makeListener(_loop, _directory.path(), name);
    listener->setDelegate([this, interface = interface](auto&, rpc::Connection& connection) {
      connection.addExportedInterface(*interface);
      if (interface == &_search) connection.addExportedInterface(_explanation);
      return true;
    });
    std::optional<TLError> error;
    EXPECT_TRUE(listener->resume(&error)) << platform::printable(error);
    _listeners.push_back(std::move(listener));
  }
  _thread = std::thread([this] { _loop.run(); });
}

FakeDaemon::~FakeDaemon() {
  stop();
}

void FakeDaemon::stop() {
  if (!_thread.joinable()) return;
  _loop.post([this] { _listeners.clear(); });
  _loop.stop();
  _thread.join();
}

void FakeDaemon::addMethod(rpc::Interface& interface, const char* member, const char* input,
                           const char* output, Values values) {
  interface.methods.push_back({member, input, output, std::vector<const char*>(),
                               [this, member, signature = std::string(input), values](
                                   rpc::Arguments& arguments, std::shared_ptr<rpc::Reply> reply) {
                                 serve(member, signature, values, arguments, *reply);
                               }});
}

void FakeDaemon::serve(const char* member, const std::string& signature, const Values& values,
                       rpc::Arguments& arguments, rpc::Reply& reply) {
  std::vector<std::string> texts;
  std::vector<std::string> items;
  for (std::string rest = signature; !rest.empty();) {
    texts.push_back(readArgument(arguments, rest, items));
  }
  Answer answer;
  {
    const platform::MutexLock lock(_mutex);
    _calls.push_back(fmt::format("{}({})", member, fmt::join(texts, ", ")));
    auto& failures = _failures[member];
    if (!failures.empty()) {
      const TLError error = failures.front();
      failures.erase(failures.begin());
      return reply.sendError(error);
    }
    for (const std::string& item : items) {
      if (!_refusedText.empty() && item.find(_refusedText) != std::string::npos) {
        return reply.sendError(_refusal);
      }
    }
    for (std::string& item : items) _indexed.push_back(std::move(item));
    const auto found = _answers.find(member);
    if (found != _answers.end()) answer = found->second;
  }
  if (answer) return answer(reply);
  reply.send(values);
}

void FakeDaemon::answer(const std::string& member, Answer answer) {
  const platform::MutexLock lock(_mutex);
  _answers[member] = std::move(answer);
}

void FakeDaemon::failOnce(const std::string& member, TLError error) {
  const platform::MutexLock lock(_mutex);
  _failures[member].push_back(std::move(error));
}

void FakeDaemon::refuseItemsWith(const std::string& text, TLError error) {
  const platform::MutexLock lock(_mutex);
  _refusedText = text;
  _refusal = std::move(error);
}

std::vector<std::string> FakeDaemon::calls() const {
  const platform::MutexLock lock(_mutex);
  return _calls;
}

std::vector<std::string> FakeDaemon::indexedItems() const {
  const platform::MutexLock lock(_mutex);
  return _indexed;
}

}  // namespace testsupport
