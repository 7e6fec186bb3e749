#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <future>
#include <latch>
#include <system_error>
#include <thread>

#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "platform/Queue.h"
#include "rpc/Inlet.h"
#include "rpc/Server.h"
#include "tests/support/LogCapture.h"
#include "tests/support/RawMessages.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using testsupport::connectTo;
using testsupport::receiveSome;

constexpr const char* kService = "com.quill.test.Echo";
constexpr const char* kPath = "/com/quill/test/Echo";

// Waits for the other side to close; true once it has.
bool waitForEnd(int descriptor) {
  char buffer[4096];
  ssize_t n;
  do {
    pollfd readable{descriptor, POLLIN, 0};
    poll(&readable, 1, -1);
    n = read(descriptor, buffer, sizeof buffer);
  } while (n > 0 || (n < 0 && errno == EAGAIN));
  return n == 0 || errno == ECONNRESET;
}

std::string messageOf(const char* member, const char* signature, const std::string& body) {
  return testsupport::rawCall(kPath, kService, member, signature, body);
}

class Client {
 public:
  explicit Client(const std::string& path) {
    descriptor = connectTo(path).release();
    sd_bus_new(&bus);
    sd_bus_set_fd(bus, descriptor, descriptor);
    EXPECT_GE(sd_bus_start(bus), 0);
  }
  ~Client() { sd_bus_close_unref(bus); }

  // Sends a call, its arguments as sd-bus takes them, and returns its cookie; 0 if that fails.
  template <typename... Arguments>
  uint64_t send(const char* member, const char* signature, Arguments... arguments) const {
    sd_bus_message* call = nullptr;
    sd_bus_message_new_method_call(bus, &call, nullptr, kPath, kService, member);
    sd_bus_message_append(call, signature, arguments...);
    uint64_t cookie = 0;  // reading it requests a reply
    const bool sent = sd_bus_send(bus, call, &cookie) >= 0 && sd_bus_flush(bus) >= 0;
    sd_bus_message_unref(call);
    return sent ? cookie : 0;
  }

  // Makes a call. The text of the reply, "" if it is no text, or the name of the error.
  template <typename... Arguments>
  std::string call(const char* interface, const char* member, const char* signature,
                   Arguments... arguments) const {
    sd_bus_error error{};
    sd_bus_message* reply = nullptr;
    sd_bus_call_method(bus, nullptr, kPath, interface, member, &error, &reply, signature,
                       arguments...);
    const char* result = error.name;
    if (reply != nullptr) sd_bus_message_read(reply, "s", &result);
    std::string answer = result == nullptr ? "" : result;
    sd_bus_error_free(&error);
    sd_bus_message_unref(reply);
    return answer;
  }
  std::string echo(const std::string& text, const char* interface = kService) const {
    return call(interface, "Echo", "s", text.c_str());
  }

  sd_bus* bus = nullptr;
  int descriptor;
};

// A service with an Echo that replies from another thread, a Make that replies with many bytes, and
// a Hold to which the test replies.
class RPCTest : public testing::Test {
 protected:
  RPCTest() : queue("echo") {
    const auto add = [this](const char* member, const char* input, const char* output,
                            auto handler) {
      interface.methods.push_back({member, input, output, {}, handler});
    };
    add("Echo", "s", "s", [this](rpc::Arguments& arguments, auto reply) {
      std::string text(arguments.readString());
      if (text == "fail") return reply->sendError({"Domain", -2, "went wrong"});
      if (text == "memory") throw std::bad_alloc();
      if (text == "thread") throw std::system_error(EAGAIN, std::generic_category());
      if (text == "binary") return reply->send({std::string("\xFF\0x", 3)});
      queue.submit([text, reply] { reply->send({text}); });
    });
    add("Make", "x", "aay", [](rpc::Arguments& arguments, auto reply) {
      const auto size = static_cast<size_t>(arguments.readInt64());
      reply->send({rpc::BytesArray{std::string(size, 'b')}});
    });
    add("Hold", "", "", [this](rpc::Arguments&, auto reply) { held.set_value(std::move(reply)); });
    add("List", "as", "s", [](rpc::Arguments& arguments, auto reply) {
      reply->send({std::to_string(arguments.readStringArray().size())});
    });
    listener = rpc::makeListener(loop, directory.path(), kService);
    listener->setDelegate([this](rpc::Listener& l, rpc::Connection& connection) {
      connection.addExportedInterface(interface);
      for (const auto& other : interfaces) connection.addExportedInterface(other);
      return l.serviceName() == connection.serviceName();
    });
    std::optional<TLError> error;
    EXPECT_TRUE(listener->resume(&error)) << platform::printable(error);
    thread = std::thread([this] { loop.run(); });
  }

  void stop() {
    loop.post([this] { listener->invalidate(1000); });
    loop.stop();
    if (thread.joinable()) thread.join();
  }
  ~RPCTest() override { stop(); }

  std::string path() const { return directory / kService; }

  // Makes a call of the client to which the test replies later.
  std::shared_ptr<rpc::Reply> hold(const Client& client) {
    held = {};
    EXPECT_NE(client.send("Hold", ""), 0u);
    return held.get_future().get();
  }

  // Waits until no connection has a running thread.
  static void waitForThreads() {
    const auto serving = [] {
      for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
        const auto name = platform::readFile(task.path() / "comm", 64, nullptr);
        if (name == "tallow.rpc\n") return true;
      }
      return false;
    };
    while (serving()) std::this_thread::yield();
  }

  testsupport::TemporaryDirectory directory;
  testsupport::LogCapture log;
  platform::SerialQueue queue;
  std::promise<std::shared_ptr<rpc::Reply>> held;
  std::vector<std::shared_ptr<rpc::Reply>> replies;
  rpc::Interface interface;
  std::vector<rpc::Interface> interfaces;  // additional interfaces, set before a client connects
  platform::RunLoop loop;
  std::unique_ptr<rpc::Listener> listener;
  std::thread thread;
};

}  // namespace

TEST_F(RPCTest, AnswersAndReportsErrorsByName) {
  const Client client(path());
  EXPECT_EQ(client.echo("hello"), "hello");
  EXPECT_EQ(client.echo("fail"), "com.quill.tallow.Error");
  EXPECT_EQ(client.call(kService, "Nothing", ""), SD_BUS_ERROR_UNKNOWN_METHOD);
  EXPECT_EQ(client.call(kService, "Echo", "x", int64_t{1}), rpc::kInvalidArgs);
  EXPECT_EQ(client.echo("still here"), "still here");
}

TEST_F(RPCTest, AMemberIsThatOfItsInterface) {
  interfaces.push_back(
      {{{"Echo", "s", "s", {}, [](rpc::Arguments&, auto reply) { reply->send({"other"}); }},
        {"Row",
         "",
         "a(sss)",
         {},
         [](rpc::Arguments&, auto reply) {
           reply->send({rpc::TextRows{{"a", "b\xFF", std::string("\0", 1)}, {"", "", ""}}});
         }}},
       "org.example.Other"});
  const Client client(path());
  EXPECT_EQ(client.echo("x"), "x");
  EXPECT_EQ(client.echo("x", "org.example.Other"), "other");
  EXPECT_EQ(client.echo("x", "org.example.Third"), SD_BUS_ERROR_UNKNOWN_METHOD);
  sd_bus_message* reply = nullptr;
  ASSERT_GE(sd_bus_call_method(client.bus, nullptr, kPath, "org.example.Other", "Row", nullptr,
                               &reply, ""),
            0);
  const char *a = nullptr, *b = nullptr, *c = nullptr;
  EXPECT_GT(sd_bus_message_enter_container(reply, 'a', "(sss)"), 0);
  EXPECT_GT(sd_bus_message_read(reply, "(sss)", &a, &b, &c), 0);
  EXPECT_EQ(fmt::format("{} {} {}", a, b, c), "a b\uFFFD \uFFFD");
  EXPECT_GT(sd_bus_message_read(reply, "(sss)", &a, &b, &c), 0);
  EXPECT_EQ(sd_bus_message_read(reply, "(sss)", &a, &b, &c), 0);
  sd_bus_message_unref(reply);
}

TEST_F(RPCTest, TheSocketIsPrivateAndOnlyAStaleOneIsReplaced) {
  struct stat info;
  ASSERT_EQ(stat(path().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0600u);
  platform::RunLoop other;
  auto second = rpc::makeListener(other, directory.path(), kService);
  std::optional<TLError> error;
  EXPECT_FALSE(second->resume(&error));
  EXPECT_NE(error->message.find("is served by a running daemon"), std::string::npos);
  EXPECT_EQ(Client(path()).echo("first"), "first");
  stop();
  EXPECT_FALSE(platform::fileExists(path()));
  testsupport::listenAt(path()).reset();
  EXPECT_TRUE(second->resume(nullptr));
  EXPECT_FALSE(
      rpc::makeListener(other, directory / std::string(100, 'd'), kService)->resume(nullptr));
}

// Some libraries send the call together with the end of the authentication.
TEST_F(RPCTest, AnEagerCallIsAnsweredAtOnce) {
  using namespace std::string_literals;
  const platform::FileDescriptor socket = connectTo(path());
  const std::string eager =
      testsupport::authenticationLines() + "BEGIN\r\n" + messageOf("Echo", "s", "\2\0\0\0hi\0"s);
  ASSERT_TRUE(testsupport::sendAll(socket.get(), eager));
  std::string answer;
  while (answer.find("hi") == std::string::npos) {
    const std::string more = receiveSome(socket.get());
    ASSERT_FALSE(more.empty());
    answer += more;
  }
}

TEST_F(RPCTest, AClientThatEndsDuringACallAffectsNobodyElse) {
  {
    const Client client(path());
    const auto reply = hold(client);
    shutdown(client.descriptor, SHUT_RDWR);
    queue.submit([reply] { reply->send({}); });
  }
  queue.drain();
  EXPECT_EQ(Client(path()).echo("next"), "next");
}

TEST_F(RPCTest, AClientThatNeverReadsIsClosed) {
  const Client client(path());
  for (int i = 0; i < 2000 && client.send("Make", "x", int64_t{100000}) != 0;) ++i;
  pollfd closed{client.descriptor, POLLRDHUP, 0};
  EXPECT_EQ(poll(&closed, 1, -1),
            1);  // closed by the other side, because nothing has been read here
  EXPECT_EQ(Client(path()).echo("other"), "other");
  EXPECT_TRUE(log.contains("replies are not read"));
}

TEST_F(RPCTest, AReplyBeyondTheProtocolLimitsIsAnError) {
  EXPECT_EQ(Client(path()).call(kService, "Make", "x", int64_t{200} << 20),
            SD_BUS_ERROR_LIMITS_EXCEEDED);
}

TEST_F(RPCTest, InvalidBytesEndOnlyTheirOwnConnection) {
  for (const std::string& bytes :
       {std::string("GET / HTTP/1.0\r\n\r\n"), std::string(100000, '\xFF'),
        std::string("\0AUTH EXTERNAL 39393939\r\nBEGIN\r\nl\1", 34)}) {
    const platform::FileDescriptor socket = connectTo(path());
    testsupport::sendAll(socket.get(), bytes);
    shutdown(socket.get(), SHUT_WR);
    EXPECT_TRUE(waitForEnd(socket.get()));
  }
  EXPECT_EQ(Client(path()).echo("alive"), "alive");
}

// The connection that has been idle longest is evicted, but never a working one while others are
// silent.
TEST_F(RPCTest, ConnectionsAreLimitedAndSilentOnesAreEvicted) {
  const Client working(path());
  EXPECT_EQ(working.echo("before"), "before");
  std::vector<platform::FileDescriptor> silent;
  for (size_t i = 0; i < rpc::kMaxConnections; ++i) silent.push_back(connectTo(path()));
  EXPECT_TRUE(waitForEnd(silent.front().get()));
  EXPECT_EQ(Client(path()).echo("new"), "new");
  EXPECT_EQ(working.echo("after"), "after");
  for (const auto& socket : silent) EXPECT_TRUE(waitForEnd(socket.get()));
  silent.clear();
  EXPECT_EQ(log.count("not authenticated in time") + log.count("evicted for a new connection"),
            rpc::kMaxConnections);
  EXPECT_EQ(working.echo("still"), "still");
}

TEST_F(RPCTest, AConnectionWithCallsInFlightIsNotEvicted) {
  std::vector<std::unique_ptr<Client>> busy;
  for (size_t i = 0; i < rpc::kMaxConnections; ++i) {
    busy.push_back(std::make_unique<Client>(path()));
    replies.push_back(hold(*busy.back()));
  }
  EXPECT_TRUE(waitForEnd(connectTo(path()).get()));
  EXPECT_TRUE(log.contains("Refusing connection"));
  replies.pop_back();  // without an answer
  EXPECT_EQ(busy.back()->echo("heard"), "heard");
  EXPECT_EQ(Client(path()).echo("room"), "room");
}

// With four calls in flight no more are read, but replies are still sent and the end of the peer is
// noticed.
TEST_F(RPCTest, APausedConnectionStillSendsAndNoticesTheEnd) {
  {
    const Client client(path());
    const uint64_t cookie = client.send("Make", "x", int64_t{20} << 20);
    ASSERT_NE(cookie, 0u);
    while (replies.size() < rpc::kMaxPendingCalls) replies.push_back(hold(client));
    sd_bus_message* answer = nullptr;
    while (answer == nullptr && sd_bus_wait(client.bus, UINT64_MAX) >= 0) {
      while (sd_bus_process(client.bus, &answer) > 0 && answer == nullptr) {
      }
    }
    ASSERT_NE(answer, nullptr);
    uint64_t answered = 0;
    sd_bus_message_get_reply_cookie(answer, &answered);
    EXPECT_EQ(answered, cookie);
    sd_bus_message_unref(answer);
  }
  // Its thread ends although its calls are still in flight.
  waitForThreads();
}

// The headers are valid; the errors show only when the content is read.
TEST_F(RPCTest, RefusesContentThatDoesNotMatchItsSignature) {
  const auto call = [this](const char* member, const char* signature, const std::string& body) {
    return testsupport::answerTo(messageOf(member, signature, body), path());
  };
  using namespace std::string_literals;
  EXPECT_THAT(call("Echo", "s", "\2\0\0\0hi\0"s), testing::HasSubstr("hi"));
  const std::vector<std::pair<const char*, std::string>> bad{
      {"s", "\2\0\0\0\xFF\xFE\0"s},  // invalid UTF-8
      {"s", "\2\0\0\0hi!"s},         // no terminating NUL
      {"s", "\xFF\0\0\0hi\0"s},      // longer than the body
      {"s", ""s},
  };
  for (const auto& [signature, body] : bad) {
    EXPECT_THAT(call("Echo", signature, body),
                testing::AnyOf(testing::HasSubstr(rpc::kInvalidArgs), testing::IsEmpty()));
  }
  EXPECT_THAT(call("List", "as", "\x10\0\0\0\4\0\0\0abcd"s),
              testing::AnyOf(testing::HasSubstr(rpc::kInvalidArgs), testing::IsEmpty()));
  const std::vector<std::string> many(rpc::kMaxArrayElements + 1);
  EXPECT_THAT(call("List", "as", testsupport::RawBody().texts(many).content()),
              testing::HasSubstr(rpc::kInvalidArgs));
  EXPECT_EQ(Client(path()).echo("alive"), "alive");
}

TEST_F(RPCTest, AHandlerThatFailsAnswersItsCall) {
  const Client client(path());
  EXPECT_EQ(client.echo("memory"), SD_BUS_ERROR_NO_MEMORY);
  EXPECT_EQ(client.echo("thread"), rpc::kErrorName);
  EXPECT_EQ(client.echo("binary"), "\uFFFD\uFFFDx");
  EXPECT_EQ(client.echo("next"), "next");
}

TEST(RPCFramer, FindsMessagesHoweverTheInputIsSplit) {
  std::string stream = std::string(1, '\0') + "AUTH EXTERNAL 30\r\nBEGIN x\r\nBEGIN\r\n";
  const size_t authentication = stream.size();
  std::vector<size_t> sizes;
  for (const size_t size : {0, 1000, 70000}) {
    const std::string message = messageOf("Echo", "s", std::string(size, 'm'));
    sizes.push_back(message.size());
    stream += message;
  }
  for (const size_t step : {size_t{1}, size_t{7}, size_t{16}, size_t{4096}, stream.size()}) {
    rpc::Framer framer;
    std::vector<size_t> found;
    size_t at = 0;
    while (at < stream.size()) {
      const auto piece = framer.next(std::string_view(stream).substr(at, step));
      ASSERT_NE(piece.part, rpc::Framer::Part::unacceptable);
      at += piece.size;
      if (piece.part == rpc::Framer::Part::begins) found.push_back(framer.messageBytes());
      if (piece.part == rpc::Framer::Part::ends && found.empty()) {
        EXPECT_EQ(at, authentication);
      }
    }
    EXPECT_EQ(found, sizes);
    EXPECT_FALSE(framer.inMessage());
  }
  rpc::Framer endless;
  EXPECT_EQ(endless.next(std::string(20000, 'A')).part, rpc::Framer::Part::unacceptable);
  for (const std::string& header :
       {std::string("x") + std::string(15, '\0'), std::string("l") + std::string(15, '\0'),
        std::string("l\0\0\0\xFF\xFF\xFF\xFF\0\0\0\0\1\0\0\0", 16)}) {
    rpc::Framer framer;
    EXPECT_EQ(framer.next("BEGIN\r\n").part, rpc::Framer::Part::ends);
    EXPECT_EQ(framer.next(header).part, rpc::Framer::Part::unacceptable);
  }
}

// Large requests wait for each other, small ones do not, and one above the budget is let in when it
// is the only one.
TEST(RPCRequestBudget, LimitsTheBytesOfAllRequests) {
  rpc::RequestBudget budget;
  int resumed = 0;
  const auto resume = [&resumed] { ++resumed; };
  const size_t half = rpc::kMaxWaitingBytes / 2;
  EXPECT_TRUE(budget.take(half + 1, resume));
  EXPECT_FALSE(budget.take(half, resume));
  EXPECT_TRUE(budget.take(rpc::kSmallMessageBytes, resume));
  EXPECT_FALSE(budget.take(3 * half, resume));
  budget.give(rpc::kSmallMessageBytes);
  EXPECT_EQ(resumed, 2);
  EXPECT_FALSE(budget.take(3 * half, resume));
  budget.give(half + 1);
  EXPECT_EQ(resumed, 3);
  EXPECT_TRUE(budget.take(3 * half, resume));
}

TEST_F(RPCTest, PendingRepliesAreSentBeforeTheEnd) {
  const Client client(path());
  auto error = std::async(std::launch::async, [&] { return client.call(kService, "Hold", ""); });
  auto reply = held.get_future().get();
  queue.submit([reply = std::move(reply)] { reply->send({}); });
  queue.drain();
  stop();
  EXPECT_EQ(error.get(), "");
}
