#include "client/DebugServiceProxy.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <limits>

namespace client {

namespace {

rpc::Channel::Body readText(std::optional<std::string>& text) {
  return [&text](sd_bus_message* reply) {
    const char* value = nullptr;
    const int result = sd_bus_message_read(reply, "s", &value);
    if (result > 0) text = value;
    return result > 0 ? result : -EBADMSG;
  };
}

rpc::Channel::Body appendTexts(const std::string& first, const std::string& second) {
  return [&](sd_bus_message* call) {
    return sd_bus_message_append(call, "ss", first.c_str(), second.c_str());
  };
}

// Reads a value of any D-Bus number type; refuses other types.
int readNumber(sd_bus_message* reply, char type, Statistic& value) {
  union {
    uint8_t y;
    int16_t n;
    uint16_t q;
    int32_t i;
    uint32_t u;
    int64_t x;
    uint64_t t;
    double d;
    int b;
  } raw{};
  const int result = sd_bus_message_read_basic(reply, type, &raw);
  if (result < 0) return result;
  switch (type) {
    case 'y':
      value = int64_t{raw.y};
      break;
    case 'n':
      value = int64_t{raw.n};
      break;
    case 'q':
      value = int64_t{raw.q};
      break;
    case 'i':
      value = int64_t{raw.i};
      break;
    case 'u':
      value = int64_t{raw.u};
      break;
    case 'x':
      value = raw.x;
      break;
    case 't':
      if (raw.t <= static_cast<uint64_t>(std::numeric_limits<int64_t>::max())) {
        value = static_cast<int64_t>(raw.t);
      } else {
        value = raw.t;
      }
      break;
    case 'd':
      value = raw.d;
      break;
    default:
      return -EBADMSG;
  }
  return result;
}

int readEntry(sd_bus_message* reply, Statistics& statistics) {
  const char* key = nullptr;
  const char* contents = nullptr;
  Statistic value;
  int result = sd_bus_message_read(reply, "s", &key);
  if (result >= 0) result = sd_bus_message_peek_type(reply, nullptr, &contents);
  const std::string type(result >= 0 ? contents : "");
  if (result >= 0) result = sd_bus_message_enter_container(reply, 'v', type.c_str());
  if (result >= 0) result = readNumber(reply, type[0], value);
  if (result >= 0) result = sd_bus_message_exit_container(reply);
  if (result >= 0) result = sd_bus_message_exit_container(reply);
  if (result >= 0) statistics.emplace_back(key, value);
  return result;
}

}  // namespace

std::optional<std::string> DebugServiceProxy::ping(const std::string& input, TLErrorOut error) {
  std::optional<std::string> text;
  _channel.call(
      "Ping", rpc::kShortTimeout,
      [&](sd_bus_message* call) { return sd_bus_message_append(call, "s", input.c_str()); },
      readText(text), error);
  return text;
}

std::optional<Statistics> DebugServiceProxy::fetchStatsForIndexer(
    const std::string& name, const std::string& protectionClass, TLErrorOut error) {
  Statistics statistics;
  const auto read = [&](sd_bus_message* reply) {
    int result = sd_bus_message_enter_container(reply, 'a', "{sv}");
    while (result >= 0 && (result = sd_bus_message_enter_container(reply, 'e', "sv")) > 0) {
      result = readEntry(reply, statistics);
    }
    return result;
  };
  if (!_channel.call("FetchStatsForIndexer", rpc::kShortTimeout, appendTexts(name, protectionClass),
                     read, error)) {
    return std::nullopt;
  }
  return statistics;
}

std::optional<std::string> DebugServiceProxy::fetchStatsForSalt(const std::string& name,
                                                                const std::string& protectionClass,
                                                                TLErrorOut error) {
  std::optional<std::string> text;
  _channel.call("FetchStatsForSalt", rpc::kShortTimeout, appendTexts(name, protectionClass),
                readText(text), error);
  return text;
}

bool DebugServiceProxy::forceVacuumAndCompact(const std::string& protectionClass,
                                              TLErrorOut error) {
  return _channel.call(
      "ForceVacuumAndCompact", rpc::kLongTimeout,
      [&](sd_bus_message* call) {
        return sd_bus_message_append(call, "s", protectionClass.c_str());
      },
      [](sd_bus_message*) { return 0; }, error);
}

}  // namespace client
