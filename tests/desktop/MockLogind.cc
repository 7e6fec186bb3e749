#include "tests/desktop/MockLogind.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <future>

#include "platform/Assert.h"
#include "tests/desktop/Bus.h"

namespace testsupport {

namespace {

constexpr const char* kManagerPath = "/org/freedesktop/login1";
constexpr const char* kManager = "org.freedesktop.login1.Manager";
constexpr const char* kSession = "org.freedesktop.login1.Session";
constexpr const char* kSessions = "/org/freedesktop/login1/session";

std::string pathOf(int number) {
  return fmt::format("{}/_{}", kSessions, number);
}

}  // namespace

struct MockLogind::Tables {
  static const sd_bus_vtable manager[];
  static const sd_bus_vtable session[];
};

const sd_bus_vtable MockLogind::Tables::manager[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("GetSession", "s", "o", getSession, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Inhibit", "ssss", "h", inhibit, SD_BUS_VTABLE_UNPRIVILEGED), SD_BUS_VTABLE_END};

const sd_bus_vtable MockLogind::Tables::session[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("LockedHint", "b", getHint, 0, SD_BUS_VTABLE_PROPERTY_EMITS_CHANGE),
    SD_BUS_VTABLE_END};

MockLogind::MockLogind(const std::string& busAddress, State state)
    : _state(state), _taken(eventfd(0, EFD_CLOEXEC | EFD_SEMAPHORE)) {
  _bus = connectTo(busAddress);
  TL_ASSERT(
      sd_bus_add_object_vtable(_bus, nullptr, kManagerPath, kManager, Tables::manager, this) >= 0);
  TL_ASSERT(sd_bus_add_fallback_vtable(_bus, nullptr, kSessions, kSession, Tables::session, nullptr,
                                       this) >= 0);
  TL_ASSERT(sd_bus_request_name(_bus, "org.freedesktop.login1", 0) >= 0);
  TL_ASSERT(sd_bus_attach_event(_bus, _loop.event(), 0) >= 0);
  _thread = std::thread([this] { _loop.run(); });
}

MockLogind::~MockLogind() {
  _loop.stop();
  _thread.join();
  sd_bus_flush_close_unref(_bus);
}

void MockLogind::onLoop(const std::function<void()>& work) {
  std::promise<void> done;
  _loop.post([&] {
    work();
    sd_bus_flush(_bus);
    done.set_value();
  });
  done.get_future().wait();
}

int MockLogind::getSession(sd_bus_message* call, void* self, sd_bus_error* error) {
  const auto* const mock = static_cast<MockLogind*>(self);
  const char* name = nullptr;
  TL_ASSERT(sd_bus_message_read(call, "s", &name) > 0 && std::string(name) == "auto");
  if (!mock->_state.session) {
    return sd_bus_error_set(error, "org.freedesktop.login1.NoSessionForPID", "no session");
  }
  return sd_bus_reply_method_return(call, "o", pathOf(mock->_number).c_str());
}

int MockLogind::inhibit(sd_bus_message* call, void* self, sd_bus_error*) {
  auto* const mock = static_cast<MockLogind*>(self);
  std::array<const char*, 4> words{};
  TL_ASSERT(sd_bus_message_read(call, "ssss", &words[0], &words[1], &words[2], &words[3]) > 0);
  TL_ASSERT(std::string(words[0]) == "sleep" && std::string(words[3]) == "delay");
  std::array<int, 2> ends;
  TL_ASSERT(pipe2(ends.data(), O_CLOEXEC) == 0);
  mock->_delay = platform::FileDescriptor(ends[0]);
  mock->_delayer = sd_bus_message_get_sender(call);
  eventfd_write(mock->_taken.get(), 1);
  const platform::FileDescriptor theirs(ends[1]);
  return sd_bus_reply_method_return(call, "h", theirs.get());
}

int MockLogind::getHint(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply,
                        void* self, sd_bus_error*) {
  return sd_bus_message_append(reply, "b", static_cast<MockLogind*>(self)->_state.locked ? 1 : 0);
}

void MockLogind::signalSession(const char* member, bool ofOtherUser) {
  onLoop([&] {
    const std::string path = pathOf(_number + (ofOtherUser ? 50 : 0));
    sd_bus_emit_signal(_bus, path.c_str(), kSession, member, nullptr);
  });
}

void MockLogind::setHint(bool locked) {
  onLoop([&] {
    _state.locked = locked;
    sd_bus_emit_properties_changed(_bus, pathOf(_number).c_str(), kSession, "LockedHint", nullptr);
  });
}

void MockLogind::prepareForSleep(bool begin) {
  onLoop([&] {
    sd_bus_emit_signal(_bus, kManagerPath, kManager, "PrepareForSleep", "b", begin ? 1 : 0);
  });
}

void MockLogind::beginSession(bool locked) {
  onLoop([&] {
    _state = {true, locked};
    const std::string path = pathOf(++_number);
    sd_bus_emit_signal(_bus, kManagerPath, kManager, "SessionNew", "so", "new", path.c_str());
  });
}

void MockLogind::endSession() {
  onLoop([&] {
    _state.session = false;
    sd_bus_emit_signal(_bus, kManagerPath, kManager, "SessionRemoved", "so", "old",
                       pathOf(_number).c_str());
  });
}

void MockLogind::awaitDelayReleased() {
  int delay = -1;
  onLoop([&] { delay = _delay.get(); });
  pollfd end{delay, 0, 0};
  poll(&end, 1, -1);
}

void MockLogind::awaitDelayTaken() {
  eventfd_t count = 0;
  eventfd_read(_taken.get(), &count);
}

std::string MockLogind::delayer() {
  std::string name;
  onLoop([&] { name = _delayer; });
  return name;
}

std::string MockLogind::sessionPath() {
  std::string path;
  onLoop([&] { path = pathOf(_number); });
  return path;
}

}  // namespace testsupport
