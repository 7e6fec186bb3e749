#include "daemon/RPCInterfaces.h"

#include <utility>

using rpc::Values;
using Reply = std::shared_ptr<rpc::Reply>;

namespace {

// Decodes the items of a call; if one is invalid, refuses the call and returns nullopt.
std::optional<TALSearchService::Items> readItems(rpc::Arguments& arguments, const Reply& reply) {
  const auto encoded = arguments.readBytesArray();
  TALSearchService::Items items;
  items.reserve(encoded.size());
  for (size_t i = 0; i < encoded.size(); ++i) {
    auto item = std::make_shared<TLIndexableItem>();
    if (!item->initWithData(encoded[i])) {
      reply->sendFailure(
          rpc::kInvalidArgs,
          fmt::format("argument 0 (items), index {}: the bytes are no TLIndexableItem", i));
      return std::nullopt;
    }
    items.push_back(std::move(item));
  }
  return items;
}

TALSearchService::Strings readStrings(rpc::Arguments& arguments) {
  TALSearchService::Strings strings;
  for (const std::string_view text : arguments.readStringArray()) {
    strings.push_back(platform::fromUTF8(text));
  }
  return strings;
}

TLErrorReply replyWithError(const Reply& reply) {
  return [reply](const std::optional<TLError>& error) {
    if (error) {
      reply->sendError(*error);
    } else {
      reply->send({});
    }
  };
}

void indexItems(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  auto items = readItems(arguments, reply);
  if (!items) return;
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.indexItems(std::move(*items), name, protectionClass, replyWithError(reply));
}

void deleteItems(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  auto identifiers = readStrings(arguments);
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.deleteItemsWithIdentifiers(std::move(identifiers), name, protectionClass,
                                     replyWithError(reply));
}

void indexAndDeleteItems(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  auto items = readItems(arguments, reply);
  if (!items) return;
  auto identifiers = readStrings(arguments);
  const bool stateGiven = arguments.readBoolean();
  const std::string_view bytes = arguments.readBytes();
  std::optional<std::string> state;
  if (stateGiven) state = std::string(bytes);
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.indexItems(std::move(*items), std::move(identifiers), std::move(state), name,
                     protectionClass, replyWithError(reply));
}

void fetchState(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.fetchLastClientStateFromIndexerNamed(
      name, protectionClass,
      [reply](const std::optional<std::string>& state, const std::optional<TLError>& error) {
        if (error) return reply->sendError(*error);
        reply->send({state.has_value(), rpc::Bytes{state.value_or("")}});
      });
}

void deleteDomains(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  auto domains = readStrings(arguments);
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.deleteItemsWithDomainIdentifiers(std::move(domains), name, protectionClass,
                                           replyWithError(reply));
}

void deleteAll(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.deleteAllItemsFromIndexerNamed(name, protectionClass, replyWithError(reply));
}

void searchItems(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply,
                 WordReplacements& replaced) {
  replaced.clear();
  TLQuery query;
  if (!query.initWithData(arguments.readBytes())) {
    reply->sendFailure(rpc::kInvalidArgs, "argument 0 (query): the bytes are no TLQuery");
    return;
  }
  const uint64_t options = arguments.readUInt64();
  const std::string protectionClass(arguments.readString());
  const int64_t maxResults = arguments.readInt64();
  service.searchItemsForQuery(
      query, options, protectionClass, maxResults,
      [&reply](const std::optional<TALSearchService::Items>& items,
               const std::optional<TLError>& error) {
        if (error) return reply->sendError(*error);
        rpc::BytesArray encoded;
        encoded.reserve(items->size());
        for (const auto& item : *items) encoded.push_back(item->data());
        reply->send({std::move(encoded)});
      },
      &replaced);
}

const char* nameOf(WordReplacement::Reason reason) {
  switch (reason) {
    case WordReplacement::Reason::spelling:
      return "spelling";
    case WordReplacement::Reason::synonym:
      return "synonym";
    case WordReplacement::Reason::stem:
      break;
  }
  return "stem";
}

void ping(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  service.ping(std::string(arguments.readString()),
               [&reply](const std::string& text) { reply->send({text}); });
}

rpc::Dictionary toDictionary(const nlohmann::json& stats) {
  rpc::Dictionary dictionary;
  if (!stats.is_object()) return dictionary;
  for (const auto& [key, value] : stats.items()) {
    if (value.is_number_float()) {
      dictionary.emplace_back(key, value.get<double>());
    } else if (value.is_number_unsigned()) {
      dictionary.emplace_back(key, value.get<uint64_t>());
    } else {
      dictionary.emplace_back(key, value.get<int64_t>());
    }
  }
  return dictionary;
}

void fetchIndexerStats(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.fetchStatsForIndexerNamed(
      name, protectionClass,
      [&reply](const nlohmann::json& stats, const std::optional<TLError>& error) {
        if (error) return reply->sendError(*error);
        reply->send({toDictionary(stats)});
      });
}

void fetchSaltStats(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  const std::string name(arguments.readString());
  const std::string protectionClass(arguments.readString());
  service.fetchStatsForSaltNamed(
      name, protectionClass,
      [&reply](const std::optional<std::string>& text, const std::optional<TLError>& error) {
        if (error) return reply->sendError(*error);
        reply->send({text.value_or("")});
      });
}

void forceVacuum(TALSearchService& service, rpc::Arguments& arguments, const Reply& reply) {
  service.forceVacuumAndCompactForProtectionClass(std::string(arguments.readString()),
                                                  replyWithError(reply));
}

using Operation = void (*)(TALSearchService&, rpc::Arguments&, const Reply&);

rpc::Method method(TALSearchService& service, const char* member, const char* input,
                   const char* output, std::vector<const char*> names, Operation operation) {
  return {member, input, output, std::move(names),
          [&service, operation](rpc::Arguments& arguments, Reply reply) {
            operation(service, arguments, reply);
          }};
}

}  // namespace

rpc::Interface makeSearchServiceProtocol(TALSearchService& service,
                                         std::shared_ptr<WordReplacements> lastReplaced) {
  return {{
      method(service, "IndexItems", "aayss", "", {"items", "toIndexerNamed", "protectionClass"},
             indexItems),
      method(service, "DeleteItemsWithIdentifiers", "asss", "",
             {"identifiers", "fromIndexerNamed", "protectionClass"}, deleteItems),
      method(service, "IndexItemsDeleteItemsWithIdentifiers", "aayasbayss", "",
             {"items", "deleteItemsWithIdentifiers", "clientStateGiven", "clientState",
              "toIndexerNamed", "protectionClass"},
             indexAndDeleteItems),
      method(service, "FetchLastClientState", "ss", "bay",
             {"fromIndexerNamed", "protectionClass", "present", "clientState"}, fetchState),
      method(service, "DeleteItemsWithDomainIdentifiers", "asss", "",
             {"domainIdentifiers", "fromIndexerNamed", "protectionClass"}, deleteDomains),
      method(service, "DeleteAllItems", "ss", "", {"fromIndexerNamed", "protectionClass"},
             deleteAll),
      {"SearchItemsForQuery",
       "aytsx",
       "aay",
       {"query", "options", "protectionClass", "maxResults", "items"},
       [&service, lastReplaced](rpc::Arguments& arguments, Reply reply) {
         searchItems(service, arguments, reply, *lastReplaced);
       }},
  }};
}

rpc::Interface makeSearchExplanationProtocol(std::shared_ptr<const WordReplacements> lastReplaced) {
  const auto fetch = [lastReplaced](rpc::Arguments&, Reply reply) {
    rpc::TextRows rows;
    for (const WordReplacement& word : *lastReplaced) {
      rows.push_back({word.typed, word.replacement, nameOf(word.reason)});
    }
    reply->send({std::move(rows)});
  };
  return {{{"FetchReplacedWords", "", "a(sss)", {"replaced"}, fetch}}, rpc::kSearchExplanationName};
}

rpc::Interface makeDebugServiceProtocol(TALSearchService& service) {
  return {{
      method(service, "Ping", "s", "s", {"input", "reply"}, ping),
      method(service, "FetchStatsForIndexer", "ss", "a{sv}",
             {"indexerNamed", "protectionClass", "statistics"}, fetchIndexerStats),
      method(service, "FetchStatsForSalt", "ss", "s", {"saltNamed", "protectionClass", "metrics"},
             fetchSaltStats),
      method(service, "ForceVacuumAndCompact", "s", "", {"protectionClass"}, forceVacuum),
  }};
}
