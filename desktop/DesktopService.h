#pragma once

#include <systemd/sd-bus.h>

#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "desktop/MailSearch.h"
#include "desktop/ScreenLock.h"
#include "platform/DeviceVault.h"
#include "platform/RunLoop.h"

namespace desktop {

// The name on the session bus and the object there, also in the files of packaging/desktop/.
inline constexpr const char* kBusName = "com.quill.tallow.Desktop";
inline constexpr const char* kObjectPath = "/com/quill/tallow/Desktop";

// Mail in the searches of the desktop: org.gnome.Shell.SearchProvider2 for GNOME's overview and
// org.kde.krunner1 for KDE's launcher, on one object of the session bus.
//
// Only the newest search is carried out. One that it overtakes is answered at once, with no
// results. While the screen is locked, by logind or by the daemon's lock status, all lists are
// empty and nothing is opened.
//
// Threads: that of the loop, and that of MailSearch. The loop ends when the bus goes away.
class DesktopService {
 public:
  // Takes the name on the bus. Null with an error if there is no bus, or the name is taken.
  [[nodiscard]] static std::unique_ptr<DesktopService> start(platform::RunLoop& loop,
                                                             TLErrorOut error);
  ~DesktopService();
  DesktopService(const DesktopService&) = delete;
  DesktopService& operator=(const DesktopService&) = delete;

 private:
  // Appends the results to a reply, in the form of one interface.
  using Form = int (*)(sd_bus_message* reply, const FoundMails& mails);

  explicit DesktopService(platform::RunLoop& loop);
  int connect();
  [[nodiscard]] bool isClosed() const;

  int search(sd_bus_message* call, Form form, const std::string& words);
  void answer(FoundMails mails);
  void keep(const FoundMails& mails);
  [[nodiscard]] const FoundMail* known(const std::string& identifier) const;

  // The operations of the interfaces. A negative errno value is an error reply.
  int getInitialResultSet(sd_bus_message* call);
  int getSubsearchResultSet(sd_bus_message* call);
  int getResultMetas(sd_bus_message* call);
  int activateResult(sd_bus_message* call);
  int launchSearch(sd_bus_message* call);
  int match(sd_bus_message* call);
  int run(sd_bus_message* call);
  int actions(sd_bus_message* call);
  int config(sd_bus_message* call);
  int teardown(sd_bus_message* call);

  struct Tables;  // of the interfaces, for sd-bus

  template <int (DesktopService::*member)(sd_bus_message*)>
  static int call(sd_bus_message* message, void* self, sd_bus_error*) {
    return (static_cast<DesktopService*>(self)->*member)(message);
  }

  platform::RunLoop& _loop;
  sd_bus* _bus = nullptr;
  std::unique_ptr<ScreenLock> _screen;  // null without logind
  const std::unique_ptr<DeviceVault> _lockStatus;
  sd_bus_message* _waiting = nullptr;  // the call of the newest search, until it is answered
  Form _form = nullptr;                // of its reply
  std::deque<FoundMails> _recent;      // results of the last searches, for their metas
  MailSearch _search;                  // last: its thread posts to this object
};

}  // namespace desktop
