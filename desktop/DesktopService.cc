#include "desktop/DesktopService.h"

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <utility>

#include "desktop/Opener.h"
#include "desktop/Replies.h"
#include "platform/Log.h"
#include "platform/Paths.h"
#include "rpc/Channel.h"

namespace desktop {

namespace {

constexpr const char* kSearchProvider = "org.gnome.Shell.SearchProvider2";
constexpr const char* kRunner = "org.kde.krunner1";

// Desktops ask for the metas of the results that they were given last.
constexpr size_t kMaxRecent = 16;

const platform::Log& log() {
  static const platform::Log handle(platform::kSubsystem, "Desktop");
  return handle;
}

std::string joined(const std::vector<std::string>& words) {
  return fmt::format("{}", fmt::join(words, " "));
}

bool isBlank(const std::string& text) {
  return text.find_first_not_of(' ') == std::string::npos;
}

// Replies to a call with what `append` adds.
int reply(sd_bus_message* call, const std::function<int(sd_bus_message*)>& append) {
  sd_bus_message* message = nullptr;
  int result = sd_bus_message_new_method_return(call, &message);
  if (result >= 0) result = append(message);
  if (result >= 0) result = sd_bus_send(nullptr, message, nullptr);
  sd_bus_message_unref(message);
  return result;
}

int replyNothing(sd_bus_message* call) {
  return sd_bus_reply_method_return(call, nullptr);
}

}  // namespace

struct DesktopService::Tables {
  static const sd_bus_vtable searchProvider[];
  static const sd_bus_vtable runner[];
};

const sd_bus_vtable DesktopService::Tables::searchProvider[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("GetInitialResultSet", "as", "as", call<&DesktopService::getInitialResultSet>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("GetSubsearchResultSet", "asas", "as",
                  call<&DesktopService::getSubsearchResultSet>, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("GetResultMetas", "as", "aa{sv}", call<&DesktopService::getResultMetas>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("ActivateResult", "sasu", "", call<&DesktopService::activateResult>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("LaunchSearch", "asu", "", call<&DesktopService::launchSearch>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END};

const sd_bus_vtable DesktopService::Tables::runner[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("Match", "s", "a(sssida{sv})", call<&DesktopService::match>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Run", "ss", "", call<&DesktopService::run>, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Actions", "", "a(sss)", call<&DesktopService::actions>,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Config", "", "a{sv}", call<&DesktopService::config>, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Teardown", "", "", call<&DesktopService::teardown>, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END};

std::unique_ptr<DesktopService> DesktopService::start(platform::RunLoop& loop, TLErrorOut error) {
  std::unique_ptr<DesktopService> service(new DesktopService(loop));
  std::optional<TLError> failure;
  service->_screen = ScreenLock::follow(loop, false, nullptr, &failure);
  if (failure) log().standard("Only the lock status is followed: {}", failure->message);
  const int result = service->connect();
  if (result >= 0) return service;
  const char* const reason =
      result == -EEXIST ? "another tallow-desktop runs" : std::strerror(-result);
  platform::setError(error,
                     {kPOSIXErrorDomain, -result, fmt::format("no session bus: {}", reason)});
  return nullptr;
}

DesktopService::DesktopService(platform::RunLoop& loop)
    : _loop(loop),
      _lockStatus(platform::makeFileDeviceVault(platform::lockStatusPath())),
      _search(rpc::defaultRuntimeDirectory(), [this] {
        _loop.post([this] {
          if (auto mails = _search.take()) answer(std::move(*mails));
        });
      }) {}

DesktopService::~DesktopService() {
  sd_bus_message_unref(_waiting);
  sd_bus_close_unref(_bus);
}

int DesktopService::connect() {
  int result = sd_bus_open_user(&_bus);
  if (result >= 0) {
    result = sd_bus_add_object_vtable(_bus, nullptr, kObjectPath, kSearchProvider,
                                      Tables::searchProvider, this);
  }
  if (result >= 0) {
    result = sd_bus_add_object_vtable(_bus, nullptr, kObjectPath, kRunner, Tables::runner, this);
  }
  if (result >= 0) result = sd_bus_attach_event(_bus, _loop.event(), 0);
  if (result >= 0) result = sd_bus_request_name(_bus, kBusName, 0);
  return result < 0 ? result : sd_bus_set_exit_on_disconnect(_bus, 1);
}

bool DesktopService::isClosed() const {
  const uint32_t state = _lockStatus->DVLGetDeviceLockState(0);
  const bool unlocked = state == 0 || state == 3;
  return !unlocked || (_screen != nullptr && _screen->screen() == Screen::locked);
}

int DesktopService::search(sd_bus_message* call, Form form, const std::string& words) {
  answer({});  // to the search that this one overtakes
  _waiting = sd_bus_message_ref(call);
  _form = form;
  if (isClosed() || isBlank(words)) {
    answer({});
  } else {
    _search.submit(words);
  }
  return 1;
}

void DesktopService::answer(FoundMails mails) {
  if (_waiting == nullptr) return;
  if (isClosed()) mails.clear();
  keep(mails);
  const int result =
      reply(_waiting, [&](sd_bus_message* message) { return _form(message, mails); });
  if (result < 0) log().error("A search has no answer: {}", std::strerror(-result));
  _waiting = sd_bus_message_unref(_waiting);
}

void DesktopService::keep(const FoundMails& mails) {
  if (mails.empty()) return;
  _recent.push_front(mails);
  if (_recent.size() > kMaxRecent) _recent.pop_back();
}

const FoundMail* DesktopService::known(const std::string& identifier) const {
  for (const FoundMails& mails : _recent) {
    for (const FoundMail& mail : mails) {
      if (mail.identifier == identifier) return &mail;
    }
  }
  return nullptr;
}

int DesktopService::getInitialResultSet(sd_bus_message* call) {
  std::vector<std::string> words;
  const int result = readTexts(call, words);
  return result < 0 ? result : search(call, appendIdentifiers, joined(words));
}

// The results before were only the best ones, so that the new ones need not be among them.
int DesktopService::getSubsearchResultSet(sd_bus_message* call) {
  const int result = sd_bus_message_skip(call, "as");
  return result < 0 ? result : getInitialResultSet(call);
}

int DesktopService::getResultMetas(sd_bus_message* call) {
  std::vector<std::string> identifiers;
  const int result = readTexts(call, identifiers);
  if (result < 0) return result;
  if (isClosed()) identifiers.clear();
  return reply(call, [&](sd_bus_message* message) {
    int done = sd_bus_message_open_container(message, 'a', "a{sv}");
    for (const std::string& identifier : identifiers) {
      const FoundMail* const mail = known(identifier);
      if (done >= 0 && mail != nullptr) done = appendMeta(message, *mail);
    }
    return done < 0 ? done : sd_bus_message_close_container(message);
  });
}

int DesktopService::activateResult(sd_bus_message* call) {
  const char* identifier = nullptr;
  const int result = sd_bus_message_read(call, "s", &identifier);
  if (result < 0) return result;
  if (!isClosed()) openMail(identifier);
  return replyNothing(call);
}

int DesktopService::launchSearch(sd_bus_message* call) {
  std::vector<std::string> words;
  const int result = readTexts(call, words);
  if (result < 0) return result;
  if (!isClosed()) searchOnScreen(joined(words));
  return replyNothing(call);
}

int DesktopService::match(sd_bus_message* call) {
  const char* words = nullptr;
  const int result = sd_bus_message_read(call, "s", &words);
  return result < 0 ? result : search(call, appendMatches, words);
}

int DesktopService::run(sd_bus_message* call) {
  const char* identifier = nullptr;
  const char* action = nullptr;
  const int result = sd_bus_message_read(call, "ss", &identifier, &action);
  if (result < 0) return result;
  if (!isClosed())
    std::strcmp(action, kShowAction) == 0 ? showMail(identifier) : openMail(identifier);
  return replyNothing(call);
}

int DesktopService::actions(sd_bus_message* call) {
  return reply(call, appendActions);
}

int DesktopService::config(sd_bus_message* call) {
  return reply(call, appendConfig);
}

int DesktopService::teardown(sd_bus_message* call) {
  _recent.clear();
  return replyNothing(call);
}

}  // namespace desktop
