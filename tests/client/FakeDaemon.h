#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/Mutex.h"
#include "platform/RunLoop.h"
#include "rpc/Server.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// Both services of the daemon, in this process, with replies chosen by the test. Every call is
// recorded as "Member(argument, ...)"; lists as [n bytes, ...] or [text, ...].
//
// Answers run on a thread of the RPC layer. They may be set at any time and apply from the next
// call on.
class FakeDaemon {
 public:
  using Answer = std::function<void(rpc::Reply&)>;

  FakeDaemon();
  ~FakeDaemon();
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  // By default a member replies with arbitrary values that match its signature.
  void answer(const std::string& member, Answer answer);
  // Errors for the next calls of a member, one each, before `answer` applies.
  void failOnce(const std::string& member, TLError error);
  // Replies with an error to every IndexItems with an item whose bytes contain `text`.
  void refuseItemsWith(const std::string& text, TLError error);

  [[nodiscard]] const std::string& runtimeDirectory() const { return _directory.path(); }
  [[nodiscard]] std::vector<std::string> calls() const;
  // Items in wire form from all successful calls.
  [[nodiscard]] std::vector<std::string> indexedItems() const;
  void stop();

 private:
  using Values = rpc::Values;

  void addMethod(rpc::Interface& interface, const char* member, const char* input,
                 const char* output, Values values);
  void serve(const char* member, const std::string& signature, const Values& values,
             rpc::Arguments& arguments, rpc::Reply& reply);

  TemporaryDirectory _directory;
  rpc::Interface _search;
  rpc::Interface _explanation;
  rpc::Interface _debug;
  mutable platform::Mutex _mutex;
  std::map<std::string, Answer> _answers TL_GUARDED_BY(_mutex);
  std::map<std::string, std::vector<TLError>> _failures TL_GUARDED_BY(_mutex);
  std::vector<std::string> _calls TL_GUARDED_BY(_mutex);
  std::vector<std::string> _indexed TL_GUARDED_BY(_mutex);
  std::string _refusedText TL_GUARDED_BY(_mutex);
  TLError _refusal TL_GUARDED_BY(_mutex);
  platform::RunLoop _loop;
  std::vector<std::unique_ptr<rpc::Listener>> _listeners;
  std::thread _thread;
};

}  // namespace testsupport
