#include "tests/desktop/SearchClient.h"

#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include "platform/Assert.h"
#include "tests/desktop/Bus.h"

namespace testsupport {

namespace {

void appendTexts(sd_bus_message* call, const Texts& texts) {
  TL_ASSERT(sd_bus_message_open_container(call, 'a', "s") >= 0);
  for (const std::string& text : texts) {
    TL_ASSERT(sd_bus_message_append(call, "s", text.c_str()) >= 0);
  }
  TL_ASSERT(sd_bus_message_close_container(call) >= 0);
}

Texts readTexts(sd_bus_message* reply) {
  Texts texts;
  const char* text = nullptr;
  TL_ASSERT(sd_bus_message_enter_container(reply, 'a', "s") >= 0);
  while (sd_bus_message_read(reply, "s", &text) > 0) texts.emplace_back(text);
  TL_ASSERT(sd_bus_message_exit_container(reply) >= 0);
  return texts;
}

std::map<std::string, std::string> readMeta(sd_bus_message* reply) {
  std::map<std::string, std::string> meta;
  const char* key = nullptr;
  const char* value = nullptr;
  while (sd_bus_message_enter_container(reply, 'e', "sv") > 0) {
    TL_ASSERT(sd_bus_message_read(reply, "s", &key) > 0);
    TL_ASSERT(sd_bus_message_read(reply, "v", "s", &value) > 0);
    meta[key] = value;
    TL_ASSERT(sd_bus_message_exit_container(reply) >= 0);
  }
  return meta;
}

}  // namespace

SearchClient::SearchClient(const std::string& busAddress) : _bus(connectTo(busAddress)) {}

SearchClient::~SearchClient() {
  sd_bus_flush_close_unref(_bus);
}

sd_bus_message* SearchClient::newCall(const char* member) {
  sd_bus_message* call = nullptr;
  TL_ASSERT(sd_bus_message_new_method_call(_bus, &call, "com.quill.tallow.Desktop",
                                           "/com/quill/tallow/Desktop",
                                           "org.gnome.Shell.SearchProvider2", member) >= 0);
  return call;
}

sd_bus_message* SearchClient::callAndWait(sd_bus_message* call) {
  sd_bus_message* reply = nullptr;
  sd_bus_error error = {};
  TL_ASSERT(sd_bus_call(_bus, call, 0, &error, &reply) >= 0);
  sd_bus_error_free(&error);
  sd_bus_message_unref(call);
  return reply;
}

Texts SearchClient::search(const Texts& words) {
  begin(words);
  return answerOf(_pending.size() - 1);
}

std::vector<std::map<std::string, std::string>> SearchClient::metas(const Texts& identifiers) {
  sd_bus_message* const call = newCall("GetResultMetas");
  appendTexts(call, identifiers);
  sd_bus_message* const reply = callAndWait(call);
  std::vector<std::map<std::string, std::string>> metas;
  TL_ASSERT(sd_bus_message_enter_container(reply, 'a', "a{sv}") >= 0);
  while (sd_bus_message_enter_container(reply, 'a', "{sv}") > 0) {
    metas.push_back(readMeta(reply));
    TL_ASSERT(sd_bus_message_exit_container(reply) >= 0);
  }
  sd_bus_message_unref(reply);
  return metas;
}

void SearchClient::activate(const std::string& identifier) {
  sd_bus_message* const call = newCall("ActivateResult");
  TL_ASSERT(sd_bus_message_append(call, "s", identifier.c_str()) >= 0);
  appendTexts(call, {"words"});
  TL_ASSERT(sd_bus_message_append(call, "u", 0) >= 0);
  sd_bus_message_unref(callAndWait(call));
}

void SearchClient::begin(const Texts& words) {
  sd_bus_message* const call = newCall("GetInitialResultSet");
  appendTexts(call, words);
  _pending.push_back(std::make_unique<Pending>());
  TL_ASSERT(sd_bus_call_async(_bus, nullptr, call, onAnswer, _pending.back().get(), 0) >= 0);
  sd_bus_message_unref(call);
  TL_ASSERT(sd_bus_flush(_bus) >= 0);
}

int SearchClient::onAnswer(sd_bus_message* reply, void* pending, sd_bus_error*) {
  auto* const search = static_cast<Pending*>(pending);
  search->answered = true;
  const sd_bus_error* const error = sd_bus_message_get_error(reply);
  EXPECT_EQ(error, nullptr) << error->message;
  if (error == nullptr) search->identifiers = readTexts(reply);
  return 0;
}

Texts SearchClient::answerOf(size_t number) {
  while (!_pending[number]->answered) {
    const int result = sd_bus_process(_bus, nullptr);
    TL_ASSERT(result >= 0);
    if (result == 0) TL_ASSERT(sd_bus_wait(_bus, UINT64_MAX) >= 0);
  }
  return _pending[number]->identifiers;
}

}  // namespace testsupport
