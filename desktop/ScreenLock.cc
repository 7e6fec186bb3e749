#include "desktop/ScreenLock.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <string_view>

namespace desktop {

namespace {

constexpr const char* kLogind = "org.freedesktop.login1";
constexpr const char* kManagerPath = "/org/freedesktop/login1";
constexpr const char* kManager = "org.freedesktop.login1.Manager";
constexpr const char* kSession = "org.freedesktop.login1.Session";
constexpr const char* kProperties = "org.freedesktop.DBus.Properties";
constexpr const char* kHint = "LockedHint";

constexpr uint64_t kTimeout = 5'000'000;  // of a question, in microseconds
constexpr int kNoAnswer = -EHOSTUNREACH;

// Reads changed properties up to the hint. Positive if the hint is there.
int readHint(sd_bus_message* signal, int& locked) {
  int result = sd_bus_message_skip(signal, "s");
  if (result >= 0) result = sd_bus_message_enter_container(signal, 'a', "{sv}");
  while (result >= 0 && (result = sd_bus_message_enter_container(signal, 'e', "sv")) > 0) {
    const char* name = nullptr;
    result = sd_bus_message_read(signal, "s", &name);
    if (result > 0 && std::string_view(name) == kHint) {
      return sd_bus_message_read(signal, "v", "b", &locked);
    }
    if (result >= 0) result = sd_bus_message_skip(signal, "v");
    if (result >= 0) result = sd_bus_message_exit_container(signal);
  }
  return result;
}

}  // namespace

std::unique_ptr<ScreenLock> ScreenLock::follow(platform::RunLoop& loop, bool delaySleep,
                                               std::function<void()> changed, TLErrorOut error) {
  std::unique_ptr<ScreenLock> lock(new ScreenLock);
  lock->_delaysSleep = delaySleep;
  int result = lock->connect();
  if (result >= 0) result = lock->awaitFirstAnswer();
  if (result >= 0) result = sd_bus_attach_event(lock->_bus, loop.event(), 0);
  if (result >= 0) result = sd_bus_set_exit_on_disconnect(lock->_bus, 1);
  if (result < 0) {
    const std::string reason = result == kNoAnswer ? lock->_failure : std::strerror(-result);
    platform::setError(error,
                       {kPOSIXErrorDomain, -result,
                        fmt::format("logind does not answer on the system bus: {}", reason)});
    return nullptr;
  }
  lock->_changed = std::move(changed);
  return lock;
}

ScreenLock::~ScreenLock() {
  sd_bus_slot_unref(_sessionCall);
  sd_bus_slot_unref(_hintCall);
  sd_bus_close_unref(_bus);
}

Screen ScreenLock::screen() const {
  if (_session.empty()) return Screen::none;
  return _locked || _sleeping ? Screen::locked : Screen::open;
}

int ScreenLock::connect() {
  int result = sd_bus_open_system(&_bus);
  if (result >= 0) result = sd_bus_set_method_call_timeout(_bus, kTimeout);
  return result < 0 ? result : addMatches();
}

int ScreenLock::addMatches() {
  struct Match {
    const char* rule;
    Handler handler;
  };
  // Signals of all sessions arrive; `isFromSession` picks those of this one.
  constexpr std::array<Match, 5> kMatches{{
      {"interface='org.freedesktop.login1.Session'", call<&ScreenLock::onSession>},
      {"interface='org.freedesktop.DBus.Properties',arg0='org.freedesktop.login1.Session'",
       call<&ScreenLock::onProperties>},
      {"interface='org.freedesktop.login1.Manager',member='PrepareForSleep'",
       call<&ScreenLock::onSleep>},
      {"interface='org.freedesktop.login1.Manager',member='SessionNew'",
       call<&ScreenLock::onSessions>},
      {"interface='org.freedesktop.login1.Manager',member='SessionRemoved'",
       call<&ScreenLock::onSessions>},
  }};
  int result = 0;
  for (const Match& match : kMatches) {
    const std::string rule = fmt::format("type='signal',sender='{}',{}", kLogind, match.rule);
    if (result >= 0) result = sd_bus_add_match(_bus, nullptr, rule.c_str(), match.handler, this);
  }
  // A logind that was restarted.
  const std::string owner = fmt::format(
      "type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',arg0='{}'", kLogind);
  if (result < 0) return result;
  return sd_bus_add_match(_bus, nullptr, owner.c_str(), call<&ScreenLock::onSessions>, this);
}

int ScreenLock::awaitFirstAnswer() {
  findSession();
  if (_delaysSleep) takeDelay();
  int result = 0;
  while ((_sessionCall != nullptr || _hintCall != nullptr) && result >= 0) {
    result = sd_bus_process(_bus, nullptr);
    if (result == 0) result = sd_bus_wait(_bus, UINT64_MAX);
    if (result == -EINTR) result = 0;
  }
  return result >= 0 && !_failure.empty() ? kNoAnswer : result;
}

void ScreenLock::findSession() {
  _sessionCall = sd_bus_slot_unref(_sessionCall);
  sd_bus_call_method_async(_bus, &_sessionCall, kLogind, kManagerPath, kManager, "GetSession",
                           call<&ScreenLock::takeSession>, this, "s", "auto");
}

void ScreenLock::takeSession(sd_bus_message* reply) {
  _sessionCall = sd_bus_slot_unref(_sessionCall);
  const sd_bus_error* const error = sd_bus_message_get_error(reply);
  // Errors of logind itself say that there is no session.
  const bool answered = error == nullptr || std::string_view(error->name).starts_with(kLogind);
  _failure = answered ? "" : error->message != nullptr ? error->message : error->name;
  if (!answered) return;
  _logind = sd_bus_message_get_sender(reply);
  const char* path = nullptr;
  if (error == nullptr && sd_bus_message_read(reply, "o", &path) < 0) return;
  const std::string session = path == nullptr ? "" : path;
  if (session == _session) return;
  update([&] {
    _session = session;
    _locked = true;  // until the hint is known
  });
  if (!_session.empty()) askHint();
}

void ScreenLock::askHint() {
  _hintCall = sd_bus_slot_unref(_hintCall);
  sd_bus_call_method_async(_bus, &_hintCall, kLogind, _session.c_str(), kProperties, "Get",
                           call<&ScreenLock::takeHint>, this, "ss", kSession, kHint);
}

void ScreenLock::takeHint(sd_bus_message* reply) {
  _hintCall = sd_bus_slot_unref(_hintCall);
  int locked = 1;
  const sd_bus_error* const error = sd_bus_message_get_error(reply);
  if (error != nullptr || sd_bus_message_read(reply, "v", "b", &locked) < 0) {
    _failure = error != nullptr && error->message != nullptr ? error->message : "no LockedHint";
    return;
  }
  update([&] { _locked = locked != 0; });
}

void ScreenLock::onSessions(sd_bus_message*) {
  findSession();
}

// The bus lets every process send such a signal to this one, so that the sender must be compared.
bool ScreenLock::isFromLogind(sd_bus_message* signal) const {
  return _logind == sd_bus_message_get_sender(signal);
}

bool ScreenLock::isFromSession(sd_bus_message* signal) const {
  return isFromLogind(signal) && _session == sd_bus_message_get_path(signal);
}

void ScreenLock::onSession(sd_bus_message* signal) {
  if (!isFromSession(signal)) return;
  const std::string_view member = sd_bus_message_get_member(signal);
  if (member == "Lock") update([this] { _locked = true; });
  if (member == "Unlock") update([this] { _locked = false; });
}

void ScreenLock::onProperties(sd_bus_message* signal) {
  int locked = 0;
  if (!isFromSession(signal) || readHint(signal, locked) <= 0) return;
  update([&] { _locked = locked != 0; });
}

void ScreenLock::onSleep(sd_bus_message* signal) {
  int sleeping = 0;
  if (!isFromLogind(signal) || sd_bus_message_read(signal, "b", &sleeping) < 0) return;
  update([&] { _sleeping = sleeping != 0; });
  _delay.reset();
  if (_delaysSleep && !_sleeping) takeDelay();
}

void ScreenLock::takeDelay() {
  sd_bus_call_method_async(_bus, nullptr, kLogind, kManagerPath, kManager, "Inhibit",
                           call<&ScreenLock::takeDelayLock>, this, "ssss", "sleep", "tallow",
                           "Close mail that is open only while the screen is", "delay");
}

// Without the delay, sleep may come a moment too early; nothing else depends on it.
void ScreenLock::takeDelayLock(sd_bus_message* reply) {
  int descriptor = -1;
  if (sd_bus_message_get_error(reply) != nullptr) return;
  if (sd_bus_message_read(reply, "h", &descriptor) < 0 || _sleeping) return;
  _delay = platform::FileDescriptor(fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
}

}  // namespace desktop
