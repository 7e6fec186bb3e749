// Runs clients that violate the protocol next to one that does not: calls with wrong bytes,
// connections that are silent, that send a byte per second, that never read. The daemon must
// survive, and the good client must get only correct answers. Exits with 1 otherwise.
#include <fmt/format.h>
#include <sys/resource.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <latch>
#include <map>
#include <optional>
#include <random>
#include <stop_token>
#include <thread>
#include <vector>

#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "platform/FileDescriptor.h"
#include "tests/daemon/DaemonProcess.h"
#include "tests/daemon/DaemonSupport.h"
#include "tests/support/DriverOptions.h"
#include "tests/support/RawMessages.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using client::SearchServiceProxy;
using platform::FileDescriptor;
using testsupport::DaemonProcess;
using testsupport::RawBody;
using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

constexpr const char* kUsage =
    "Usage: rpc_hostile_driver [--messages N] [--seed N]\n"
    "       rpc_hostile_driver --mode flood [--seconds N] [--max-mb N]\n";

constexpr const char* kGoodClass = "the class of the good client";
constexpr const char* kBadClass = "e";  // short, so that changing a few bytes gives another class
constexpr rlim_t kDescriptors = 512;    // of the daemon, which limits the number of its classes
constexpr int kMessagesOfConnection = 16;

struct Options {
  std::string mode = "messages";
  uint64_t messages = 1000000;
  uint64_t seconds = 30;
  uint64_t maxMegabytes = SIZE_MAX;  // anonymous memory of the daemon
  uint64_t seed = std::random_device()();
};

// A well-behaved client. Each of its searches has a single correct result.
class GoodClient {
 public:
  GoodClient(const std::string& directory, int batch) : _directory(directory), _batch(batch) {}

  // Runs until the stop or the first wrong answer, which is stored in `wrong`.
  void work(const std::stop_token& stop) {
    SearchServiceProxy service(_directory, rpc::Patience(5000));
    client::DebugServiceProxy debug(_directory, rpc::Patience(5000));
    while (!stop.stop_requested() && wrong.empty()) {
      std::optional<TLError> error;
      const std::string prefix = fmt::format("good{}x", _rounds++);
      if (_rounds % 20 == 1) {
        timed(_indexing, [&] {
          expect(service.indexItems(testsupport::mails(prefix, _batch), "good", kGoodClass, &error),
                 "index", error);
        });
        _indexed = prefix;
      }
      timed(_answers, [&] {
        const auto answer = debug.ping(prefix, &error);
        expect(answer && answer->find("Received " + prefix) == 0, "ping", error);
      });
      timed(_answers, [&] {
        const int64_t found = testsupport::search(service, _indexed + " ", kGoodClass);
        expect(found == _batch, fmt::format("search gives {} for {}", found, _batch), error);
      });
      if (_rounds == 1) _begun.count_down();
    }
  }

  // Waits until its first calls on both connections have ended. Until then its connections may be
  // evicted, because they have never made a call.
  void waitUntilBegun() const { _begun.wait(); }

  [[nodiscard]] std::string report() const {
    return fmt::format("good_rounds={} answers {} batches {}", _rounds, text(_answers),
                       text(_indexing));
  }

  std::string wrong;

 private:
  void expect(bool right, const std::string& what, const std::optional<TLError>& error) {
    if (!right && wrong.empty()) wrong = what + " " + platform::printable(error);
  }
  template <typename Work>
  static void timed(std::vector<double>& times, const Work& work) {
    const auto start = Clock::now();
    work();
    times.push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count());
  }
  static std::string text(const std::vector<double>& times) {
    const auto at = [&](double part) { return testsupport::percentile(times, part); };
    return fmt::format("p50_ms={:.2f} p99_ms={:.2f} max_ms={:.1f}", at(0.5), at(0.99), at(1));
  }

  const std::string _directory;
  const int _batch;
  int _rounds = 0;
  std::latch _begun{1};
  std::string _indexed;
  std::vector<double> _answers, _indexing;
};

// Valid messages for each service, one for each operation.
std::map<std::string, std::vector<std::string>> validCalls() {
  const std::string search = rpc::kSearchServiceName;
  const std::string debug = rpc::kDebugServiceName;
  const auto items = testsupport::mails("bad", 2);
  const std::vector<std::string> names{"bad0", "bad1"};
  TLQuery query;
  query.setRawQuery(u"word");
  query.setOriginalQuery(u"word");
  std::map<std::string, std::vector<std::string>> calls;
  const auto add = [&](const std::string& service, const char* member, const char* signature,
                       const RawBody& body) {
    calls[service].push_back(
        testsupport::rawCall(rpc::objectPath(service), service, member, signature, body.content()));
  };
  // Most operations end with a client or an index name, and a class.
  const auto named = [](RawBody body) { return body.text("n").text(kBadClass); };
  add(search, "IndexItems", "aayss", named(RawBody().bytesArray(items)));
  add(search, "DeleteItemsWithIdentifiers", "asss", named(RawBody().texts(names)));
  add(search, "IndexItemsDeleteItemsWithIdentifiers", "aayasbayss",
      named(RawBody().bytesArray(items).texts(names).number32(1).bytes("state")));
  add(search, "FetchLastClientState", "ss", named(RawBody()));
  add(search, "DeleteItemsWithDomainIdentifiers", "asss", named(RawBody().texts(names)));
  add(search, "DeleteAllItems", "ss", named(RawBody()));
  add(search, "SearchItemsForQuery", "aytsx",
      RawBody().bytes(query.data()).number64(0).text(kBadClass).number64(10));
  add(debug, "Ping", "s", RawBody().text("hello"));
  add(debug, "FetchStatsForIndexer", "ss", named(RawBody()));
  add(debug, "FetchStatsForSalt", "ss", named(RawBody()));
  add(debug, "ForceVacuumAndCompact", "s", RawBody().text(kBadClass));
  return calls;
}

std::string mutated(std::string message, std::mt19937& random) {
  if (random() % 50 == 0) message.resize(random() % message.size());
  for (size_t i = random() % 6 + 1; i > 0 && !message.empty(); --i) {
    // Changes the header as often as the content.
    const size_t range = random() % 2 == 0 ? std::min<size_t>(message.size(), 200) : message.size();
    message[random() % range] = static_cast<char>(random());
  }
  return message;
}

// Sends and receives, waiting only briefly, because a peer that was told a wrong length waits for
// the rest. False when the connection has ended.
bool exchange(int socket, std::string_view message) {
  while (!message.empty()) {
    const ssize_t size = send(socket, message.data(), message.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (size > 0) {
      message.remove_prefix(static_cast<size_t>(size));
      continue;
    }
    if (errno != EAGAIN) return false;
    pollfd ready{socket, POLLIN | POLLOUT, 0};
    if (poll(&ready, 1, 1000) <= 0) return false;
    if ((ready.revents & POLLIN) != 0 && testsupport::receiveSome(socket).empty()) return false;
  }
  char buffer[4096];
  ssize_t size;
  while ((size = recv(socket, buffer, sizeof buffer, MSG_DONTWAIT)) > 0) {
  }
  return size < 0 && errno == EAGAIN;
}

// Sends invalid messages and returns their number.
uint64_t sendWrongMessages(const DaemonProcess& daemon, const Options& options,
                           const std::function<bool()>& goesOn) {
  std::mt19937 random(static_cast<uint32_t>(options.seed));
  const auto calls = validCalls();
  uint64_t sent = 0;
  while (sent < options.messages && goesOn()) {
    const auto& [service, messages] = *std::next(calls.begin(), random() % calls.size());
    const FileDescriptor socket = testsupport::connectTo(daemon.socketOf(service));
    if (socket.get() < 0 || !testsupport::authenticate(socket.get())) continue;
    for (int i = 0; i < kMessagesOfConnection && sent < options.messages; ++i) {
      ++sent;
      const std::string& message = messages[random() % messages.size()];
      if (!exchange(socket.get(), mutated(message, random))) break;
    }
  }
  return sent;
}

bool lives(const DaemonProcess& daemon) {
  return kill(daemon.pid(), 0) == 0;
}

// Shuts the daemon down and prints what was wrong. Returns the exit status of the driver.
int conclude(DaemonProcess& daemon, const GoodClient& good, const std::string& line) {
  const int status = daemon.stop();
  fmt::print("{} {} status={}\n", line, good.report(), status);
  if (status == 0 && good.wrong.empty()) return 0;
  fmt::print(stderr, "WRONG: {}\n{}\n", good.wrong, daemon.endOfLog());
  return 1;
}

int runMutations(const Options& options) {
  fmt::print("seed={}\n", options.seed);
  const testsupport::TemporaryDirectory scratch;
  DaemonProcess daemon(scratch.path());
  const rlimit limit{kDescriptors, kDescriptors};
  prlimit(daemon.pid(), RLIMIT_NOFILE, &limit, nullptr);
  GoodClient good(daemon.runtimeDirectory(), 20);
  uint64_t sent = 0;
  {
    const std::jthread working([&good](const std::stop_token& stop) { good.work(stop); });
    good.waitUntilBegun();  // its class is open before others take the descriptors
    sent = sendWrongMessages(daemon, options, [&] { return good.wrong.empty() && lives(daemon); });
  }
  return conclude(daemon, good, fmt::format("messages={}", sent));
}

// ---- floods ----

// Holds silent connections until `stop` and reports how many are still open after the time limit
// for authentication.
void holdSilentOnes(const std::string& path, int count, const std::stop_token& stop) {
  std::vector<FileDescriptor> held;
  for (int i = 0; i < count && !stop.stop_requested(); ++i) {
    held.push_back(testsupport::connectTo(path));
  }
  while (!stop.stop_requested()) std::this_thread::sleep_for(milliseconds(50));
}

// Each connection sends one byte per second of a message that claims to be large.
void drip(const std::string& path, int count, const std::stop_token& stop) {
  std::vector<FileDescriptor> sockets(static_cast<size_t>(count));
  const std::string header = std::string("l\1\0\1\0\0\0\2\1\0\0\0\x60\0\0\0", 16);  // 32 MiB
  while (!stop.stop_requested()) {
    for (FileDescriptor& socket : sockets) {
      if (socket.get() >= 0 && testsupport::sendAll(socket.get(), "x")) continue;
      socket = testsupport::connectTo(path);
      if (socket.get() >= 0 && testsupport::authenticate(socket.get())) {
        testsupport::sendAll(socket.get(), header);
      }
    }
    std::this_thread::sleep_for(milliseconds(1000));
  }
}

// Repeatedly searches for everything and never reads a reply.
void neverRead(const std::string& path, const std::string& message, const std::stop_token& stop) {
  while (!stop.stop_requested()) {
    const FileDescriptor socket = testsupport::connectTo(path);
    if (socket.get() < 0 || !testsupport::authenticate(socket.get())) continue;
    while (!stop.stop_requested()) {
      const ssize_t size =
          send(socket.get(), message.data(), message.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
      if (size < 0 && errno != EAGAIN) break;
      if (size != static_cast<ssize_t>(message.size())) {
        std::this_thread::sleep_for(milliseconds(10));
      }
    }
  }
}

int runFlood(const Options& options) {
  constexpr int kBatch = 500;
  const testsupport::TemporaryDirectory scratch;
  DaemonProcess daemon(scratch.path());
  const std::string path = daemon.socketOf(rpc::kSearchServiceName);
  GoodClient good(daemon.runtimeDirectory(), kBatch);
  const std::string message = validCalls().at(rpc::kSearchServiceName)[6];
  size_t most = 0;
  {
    std::vector<std::jthread> threads;
    const auto start = [&threads](auto body) { threads.emplace_back(body); };
    start([&](const std::stop_token& stop) { good.work(stop); });
    good.waitUntilBegun();
    start([&](const std::stop_token& stop) { holdSilentOnes(path, 2000, stop); });
    start([&](const std::stop_token& stop) { holdSilentOnes(path, 64, stop); });
    start([&](const std::stop_token& stop) { drip(path, 64, stop); });
    for (int i = 0; i < 15; ++i) {
      start([&](const std::stop_token& stop) { neverRead(path, message, stop); });
    }
    const auto end = Clock::now() + std::chrono::seconds(options.seconds);
    while (Clock::now() < end && good.wrong.empty() && lives(daemon)) {
      std::this_thread::sleep_for(milliseconds(20));
      most = std::max(most, daemon.anonymousKilobytes());
    }
  }
  const int status = conclude(
      daemon, good, fmt::format("rss_anon_peak_mb={:.0f}", static_cast<double>(most) / 1024));
  if (most / 1024 <= options.maxMegabytes) return status;
  fmt::print(stderr, "The daemon took more than {} MiB\n", options.maxMegabytes);
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  setenv("TALLOW_LOG", "fault", 1);
  rlimit descriptors;
  getrlimit(RLIMIT_NOFILE, &descriptors);
  descriptors.rlim_cur = descriptors.rlim_max;
  setrlimit(RLIMIT_NOFILE, &descriptors);
  Options options;
  testsupport::readOptions(argc, argv, kUsage,
                           {{"--mode", &options.mode},
                            {"--messages", &options.messages},
                            {"--seconds", &options.seconds},
                            {"--max-mb", &options.maxMegabytes},
                            {"--seed", &options.seed}});
  if (options.mode == "messages") return runMutations(options);
  if (options.mode == "flood") return runFlood(options);
  fmt::print(stderr, "{}", kUsage);
  return 2;
}
