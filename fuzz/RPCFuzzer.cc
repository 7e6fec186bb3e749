// Any bytes from a peer after the handshake: they go through the framer and the bus library into
// handlers that read every kind of argument, on a connection as in the daemon.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/Assert.h"
#include "records/TLIndexableItem.h"
#include "records/TLQuery.h"
#include "rpc/ServerConnection.h"
#include "tests/support/RawMessages.h"

namespace {

using rpc::Arguments;
using rpc::Reply;

constexpr const char* kService = "f.f";  // short, so that random input can match it

// Reads all arguments and decodes records, like the handlers of the daemon.
void handle(const char* signature, rpc::Arguments& arguments,
            const std::shared_ptr<rpc::Reply>& reply) {
  size_t sum = 0;
  for (const char* type = signature; *type != 0; ++type) {
    const std::string_view rest = type;
    if (rest.starts_with("aay")) {
      for (const std::string_view bytes : arguments.readBytesArray()) {
        TLIndexableItem item;
        sum += item.initWithData(bytes) ? 1 : 0;
      }
      type += 2;
    } else if (rest.starts_with("as")) {
      sum += arguments.readStringArray().size();
      ++type;
    } else if (rest.starts_with("ay")) {
      TLQuery query;
      sum += query.initWithData(arguments.readBytes()) ? 1 : 0;
      ++type;
    } else if (*type == 'b') {
      sum += arguments.readBoolean() ? 1 : 0;
    } else if (*type == 'x') {
      sum += static_cast<size_t>(arguments.readInt64());
    } else if (*type == 't') {
      sum += arguments.readUInt64();
    } else {
      sum += arguments.readString().size();
    }
  }
  reply->send({std::to_string(sum)});
}

const rpc::Interface& interface() {
  static const rpc::Interface made = [] {
    rpc::Interface methods;
    int number = 0;
    static const char* const names[] = {"A", "B", "C", "D", "E", "F"};
    for (const char* signature : {"aayss", "asss", "aayasbayss", "ss", "aytsx", "s"}) {
      methods.methods.push_back(
          {names[number++],
           signature,
           "s",
           {},
           [signature](rpc::Arguments& arguments, const std::shared_ptr<rpc::Reply>& reply) {
             handle(signature, arguments, reply);
           }});
    }
    return methods;
  }();
  return made;
}

}  // namespace

// The input waits in the socket when the connection, which runs on this thread, begins to serve;
// its replies are not read.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  setenv("TALLOW_LOG", "fault", 0);
  static const std::string begin = testsupport::authenticationLines() + "BEGIN\r\n";
  constexpr size_t kFitsSocket = size_t{64} << 10;
  int ends[2];
  if (size > kFitsSocket || socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return 0;
  fcntl(ends[1], F_SETFL, O_NONBLOCK);
  {
    rpc::ServerConnection connection(ends[1], kService, "fuzzer");
    connection.addExportedInterface(interface());
    bool ended = false;
    if (connection.open([&ended] { ended = true; })) {
      testsupport::sendAll(ends[0], begin);
      testsupport::sendAll(ends[0], {reinterpret_cast<const char*>(data), size});
      shutdown(ends[0], SHUT_WR);
      connection.serve();
      TL_ASSERT(ended);
    }
  }
  close(ends[0]);
  return 0;
}
