#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <future>
#include <latch>
#include <thread>

#include "platform/Files.h"
#include "platform/Queue.h"
#include "platform/RPC.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

constexpr const char* kService = "com.quill.test.Echo";
constexpr const char* kPath = "/com/quill/test/Echo";

int connectTo(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  EXPECT_EQ(connect(descriptor, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  return descriptor;
}

// True once the other side has closed; waits for it.
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

class Client {
 public:
  explicit Client(const std::string& path) {
    descriptor = connectTo(path);
    sd_bus_new(&bus);
    sd_bus_set_fd(bus, descriptor, descriptor);
    EXPECT_GE(sd_bus_start(bus), 0);
  }
  ~Client() { sd_bus_close_unref(bus); }

  sd_bus_message* newCall(const char* member) const {
    sd_bus_message* call = nullptr;
    sd_bus_message_new_method_call(bus, &call, nullptr, kPath, kService, member);
    return call;
  }

  // The text of the reply, or the name of the error.
  std::string echo(const std::string& text) const {
    sd_bus_error error{};
    sd_bus_message* reply = nullptr;
    sd_bus_call_method(bus, nullptr, kPath, kService, "Echo", &error, &reply, "s", text.c_str());
    const char* result = error.name;
    if (reply != nullptr) sd_bus_message_read(reply, "s", &result);
    std::string answer = result == nullptr ? "" : result;
    sd_bus_error_free(&error);
    sd_bus_message_unref(reply);
    return answer;
  }

  sd_bus* bus = nullptr;
  int descriptor;
};

// A service with an Echo that answers from another thread, a Make that answers with many bytes, and
// a Hold whose reply the test sends when it likes.
class RPCTest : public testing::Test {
 protected:
  RPCTest() : queue("echo") {
    interface.methods.push_back(
        {"Echo",
         "s",
         "s",
         {"input", "output"},
         [this](platform::RPCArguments& arguments, std::shared_ptr<platform::RPCReply> reply) {
           std::string text(arguments.readString());
           if (text == "fail") return reply->sendError({"Domain", -2, "went wrong"});
           queue.submit([text, reply] { reply->send({text}); });
         }});
    interface.methods.push_back(
        {"Make",
         "x",
         "aay",
         {"size", "bytes"},
         [](platform::RPCArguments& arguments, std::shared_ptr<platform::RPCReply> reply) {
           const auto size = static_cast<size_t>(arguments.readInt64());
           reply->send({platform::RPCBytesArray{std::string(size, 'b')}});
         }});
    interface.methods.push_back(
        {"Hold",
         "",
         "",
         {},
         [this](platform::RPCArguments&, std::shared_ptr<platform::RPCReply> reply) {
           held.set_value(std::move(reply));
         }});
    listener = platform::makeRPCListener(loop, directory.path(), kService);
    listener->setDelegate([this](platform::RPCListener& l, platform::RPCConnection& connection) {
      connection.setExportedInterface(&interface);
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

  testsupport::TemporaryDirectory directory;
  testsupport::LogCapture log;
  platform::SerialQueue queue;
  std::promise<std::shared_ptr<platform::RPCReply>> held;
  platform::RPCInterface interface;
  platform::RunLoop loop;
  std::unique_ptr<platform::RPCListener> listener;
  std::thread thread;
};

}  // namespace

TEST_F(RPCTest, AnswersAndReportsErrorsByName) {
  const Client client(path());
  EXPECT_EQ(client.echo("hello"), "hello");
  EXPECT_EQ(client.echo("fail"), "com.quill.tallow.Error");
  sd_bus_error error{};
  EXPECT_LT(
      sd_bus_call_method(client.bus, nullptr, kPath, kService, "Nothing", &error, nullptr, ""), 0);
  EXPECT_STREQ(error.name, "org.freedesktop.DBus.Error.UnknownMethod");
  sd_bus_error_free(&error);
  EXPECT_LT(sd_bus_call_method(client.bus, nullptr, kPath, kService, "Echo", &error, nullptr, "x",
                               int64_t{1}),
            0);
  EXPECT_STREQ(error.name, platform::kRPCInvalidArgs);
  sd_bus_error_free(&error);
  EXPECT_EQ(client.echo("still here"), "still here");
}

TEST_F(RPCTest, TheSocketIsPrivateAndALiveOneIsNotReplaced) {
  struct stat info;
  ASSERT_EQ(stat(path().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0600u);
  platform::RunLoop other;
  auto second = platform::makeRPCListener(other, directory.path(), kService);
  std::optional<TLError> error;
  EXPECT_FALSE(second->resume(&error));
  EXPECT_NE(error->message.find("is served by a running daemon"), std::string::npos);
  EXPECT_EQ(Client(path()).echo("first"), "first");
}

TEST(RPCListener, AStaleSocketIsReplaced) {
  const testsupport::TemporaryDirectory directory;
  platform::RunLoop loop;
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  (directory / kService).copy(address.sun_path, sizeof address.sun_path - 1);
  const int dead = socket(AF_UNIX, SOCK_STREAM, 0);
  ASSERT_EQ(bind(dead, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  close(dead);
  EXPECT_TRUE(platform::makeRPCListener(loop, directory.path(), kService)->resume(nullptr));
  EXPECT_FALSE(platform::fileExists(directory / kService));
  EXPECT_FALSE(platform::makeRPCListener(loop, directory / std::string(100, 'd'), kService)
                   ->resume(nullptr));
}

// The call comes in one piece with the end of the authentication, as some libraries send it.
TEST_F(RPCTest, AnEagerCallIsAnsweredAtOnce) {
  const int descriptor = connectTo(path());
  const std::string begin = "BEGIN\r\n";
  std::string authentication = std::string(1, '\0') + "AUTH EXTERNAL ";
  for (const char digit : std::to_string(getuid())) authentication += fmt::format("{:02x}", digit);
  authentication += "\r\n";
  ASSERT_GT(send(descriptor, authentication.data(), authentication.size(), 0), 0);
  char buffer[256];
  ASSERT_GT(recv(descriptor, buffer, sizeof buffer, 0), 0);
  // Little-endian method call, serial 1, object path, interface, member, signature "s", body "hi".
  std::string message("l\1\0\1\7\0\0\0\1\0\0\0", 12);
  std::string fields;
  const auto field = [&fields](char code, const char* type, const std::string& value) {
    while (fields.size() % 8 != 0) fields += '\0';
    fields += std::string({code, 1}) + type + '\0';
    if (*type != 'g') fields += std::string({static_cast<char>(value.size()), 0, 0, 0});
    if (*type == 'g') fields += static_cast<char>(value.size());
    fields += value + '\0';
  };
  field(1, "o", kPath);
  field(2, "s", kService);
  field(3, "s", "Echo");
  field(8, "g", "s");
  message += std::string({static_cast<char>(fields.size()), 0, 0, 0}) + fields;
  while (message.size() % 8 != 0) message += '\0';
  message += std::string("\2\0\0\0hi\0", 7);
  const std::string eager = begin + message;
  ASSERT_EQ(send(descriptor, eager.data(), eager.size(), 0), static_cast<ssize_t>(eager.size()));
  const ssize_t size = recv(descriptor, buffer, sizeof buffer, 0);
  EXPECT_NE(std::string(buffer, static_cast<size_t>(std::max<ssize_t>(size, 0))).find("hi"),
            std::string::npos);
  close(descriptor);
}

TEST_F(RPCTest, AClientThatVanishesInMidCallHarmsNobody) {
  {
    const Client client(path());
    sd_bus_message* call = client.newCall("Hold");
    uint64_t cookie = 0;  // asking for it asks for a reply
    sd_bus_send(client.bus, call, &cookie);
    sd_bus_flush(client.bus);
    sd_bus_message_unref(call);
    auto reply = held.get_future().get();
    shutdown(client.descriptor, SHUT_RDWR);
    queue.submit([reply] { reply->send({}); });
  }
  queue.drain();
  EXPECT_EQ(Client(path()).echo("next"), "next");
}

TEST_F(RPCTest, AClientThatNeverReadsIsClosed) {
  const Client client(path());
  for (int i = 0; i < 2000; ++i) {
    sd_bus_message* call = client.newCall("Make");
    sd_bus_message_append(call, "x", int64_t{100000});
    uint64_t cookie = 0;
    const int sent = sd_bus_send(client.bus, call, &cookie);
    sd_bus_message_unref(call);
    if (sent < 0 || sd_bus_flush(client.bus) < 0) break;
  }
  pollfd closed{client.descriptor, POLLRDHUP, 0};
  EXPECT_EQ(poll(&closed, 1, -1), 1);  // by the other side, as nothing has been read here
  EXPECT_EQ(Client(path()).echo("other"), "other");
  EXPECT_TRUE(log.contains("replies are not read"));
}

TEST_F(RPCTest, AReplyBeyondTheProtocolIsAnError) {
  const Client client(path());
  sd_bus_error error{};
  EXPECT_LT(sd_bus_call_method(client.bus, nullptr, kPath, kService, "Make", &error, nullptr, "x",
                               int64_t{200} << 20),
            0);
  EXPECT_STREQ(error.name, SD_BUS_ERROR_LIMITS_EXCEEDED);
  sd_bus_error_free(&error);
}

TEST_F(RPCTest, RubbishEndsOnlyItsOwnConnection) {
  for (const std::string& bytes :
       {std::string("GET / HTTP/1.0\r\n\r\n"), std::string(100000, '\xFF'),
        std::string("\0AUTH EXTERNAL 39393939\r\nBEGIN\r\nl\1", 34)}) {
    const int descriptor = connectTo(path());
    [[maybe_unused]] const ssize_t n = send(descriptor, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    shutdown(descriptor, SHUT_WR);
    EXPECT_TRUE(waitForEnd(descriptor));
    close(descriptor);
  }
  EXPECT_EQ(Client(path()).echo("alive"), "alive");
}

TEST_F(RPCTest, ConnectionsAreBoundedAndAnIdleOneTimesOut) {
  std::vector<int> idle;
  for (size_t i = 0; i < platform::kMaximumConnections; ++i) idle.push_back(connectTo(path()));
  const int refused = connectTo(path());
  EXPECT_TRUE(waitForEnd(refused));
  EXPECT_TRUE(log.contains("Refusing connection"));
  for (const int descriptor : idle) {
    EXPECT_TRUE(waitForEnd(descriptor));
    close(descriptor);
  }
  close(refused);
  EXPECT_EQ(log.count("not authenticated in time"), platform::kMaximumConnections);
}

TEST_F(RPCTest, WhatIsReadyGoesOutBeforeTheEnd) {
  const Client client(path());
  sd_bus_message* call = client.newCall("Hold");
  sd_bus_message* answer = nullptr;
  std::thread caller([&] { sd_bus_call(client.bus, call, 0, nullptr, &answer); });
  auto reply = held.get_future().get();
  queue.submit([reply = std::move(reply)] { reply->send({}); });
  queue.drain();
  stop();
  caller.join();
  EXPECT_NE(answer, nullptr);
  sd_bus_message_unref(answer);
  sd_bus_message_unref(call);
}
