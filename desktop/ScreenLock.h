#pragma once

#include <systemd/sd-bus.h>

#include <functional>
#include <memory>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/RunLoop.h"
#include "platform/TLError.h"

namespace desktop {

// The state of the screen of the user's graphical session.
enum class Screen {
  none,  // there is no such session
  open,
  locked  // also from the moment on when the device prepares to sleep
};

// Follows the lock of the screen through logind: the signals Lock and Unlock and the LockedHint of
// the user's session, and PrepareForSleep. The session is the one that logind calls "auto": for a
// user service, the session on the display. It is looked up again when sessions begin or end.
//
// Threads: that of the loop. The loop ends when the system bus goes away.
class ScreenLock {
 public:
  // Waits for logind's first answer, a few seconds at most for each question. Later changes call
  // `changed`, which may be null, in the loop. Null with an error if there is no system bus or no
  // logind.
  //
  // With `delaySleep`, the device goes to sleep only after `changed` has returned, or logind has
  // lost its patience (InhibitDelayMaxSec in logind.conf).
  [[nodiscard]] static std::unique_ptr<ScreenLock> follow(platform::RunLoop& loop, bool delaySleep,
                                                          std::function<void()> changed,
                                                          TLErrorOut error);
  ~ScreenLock();
  ScreenLock(const ScreenLock&) = delete;
  ScreenLock& operator=(const ScreenLock&) = delete;

  [[nodiscard]] Screen screen() const;

 private:
  using Handler = sd_bus_message_handler_t;

  ScreenLock() = default;
  int connect();
  int addMatches();
  int awaitFirstAnswer();

  void findSession();
  void askHint();
  void takeDelay();

  void takeSession(sd_bus_message* reply);
  void takeHint(sd_bus_message* reply);
  void takeDelayLock(sd_bus_message* reply);
  void onSessions(sd_bus_message* signal);
  void onSession(sd_bus_message* signal);
  void onProperties(sd_bus_message* signal);
  void onSleep(sd_bus_message* signal);

  [[nodiscard]] bool isFromLogind(sd_bus_message* signal) const;
  [[nodiscard]] bool isFromSession(sd_bus_message* signal) const;

  // A handler for sd-bus that calls a member function of the ScreenLock.
  template <void (ScreenLock::*member)(sd_bus_message*)>
  static int call(sd_bus_message* message, void* self, sd_bus_error*) {
    (static_cast<ScreenLock*>(self)->*member)(message);
    return 0;
  }
  // Carries out a change of the state, and tells of it.
  template <typename Change>
  void update(const Change& change) {
    const Screen before = screen();
    change();
    if (_changed && screen() != before) _changed();
  }

  sd_bus* _bus = nullptr;
  sd_bus_slot* _sessionCall = nullptr;  // not null while its reply is awaited
  sd_bus_slot* _hintCall = nullptr;
  std::function<void()> _changed;      // empty until the first answer
  std::string _failure = "no answer";  // to the last call; empty if there was one
  std::string _logind;                 // its unique name on the bus
  std::string _session;                // its object path; empty for none
  bool _locked = false;                // by signal or hint
  bool _sleeping = false;
  bool _delaysSleep = false;
  platform::FileDescriptor _delay;  // while it is open, the device does not go to sleep
};

}  // namespace desktop
