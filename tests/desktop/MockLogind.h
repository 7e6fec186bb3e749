#pragma once

#include <systemd/sd-bus.h>

#include <functional>
#include <string>
#include <thread>

#include "platform/FileDescriptor.h"
#include "platform/RunLoop.h"

namespace testsupport {

// logind as the programs of desktop/ see it: one session of the user or none, its lock, and sleep.
// It serves on its own thread; every function returns when it has sent its signal.
class MockLogind {
 public:
  struct State {
    bool session = true;
    bool locked = false;
  };

  MockLogind(const std::string& busAddress, State state);
  ~MockLogind();
  MockLogind(const MockLogind&) = delete;
  MockLogind& operator=(const MockLogind&) = delete;

  // Sends Lock or Unlock, for this session or one of another user.
  void signalSession(const char* member, bool ofOtherUser = false);
  void setHint(bool locked);
  void prepareForSleep(bool begin);
  // A new session with its own name takes the place of the one before.
  void beginSession(bool locked);
  void endSession();

  // Waits until the program that has delayed sleep no longer does.
  void awaitDelayReleased();
  // Waits until a program delays sleep.
  void awaitDelayTaken();
  // The unique name of that program on the bus.
  [[nodiscard]] std::string delayer();
  [[nodiscard]] std::string sessionPath();

 private:
  void serve(const std::string& busAddress);
  void onLoop(const std::function<void()>& work);

  static int getSession(sd_bus_message* call, void* self, sd_bus_error* error);
  static int inhibit(sd_bus_message* call, void* self, sd_bus_error* error);
  static int getHint(sd_bus* bus, const char* path, const char* interface, const char* property,
                     sd_bus_message* reply, void* self, sd_bus_error* error);
  struct Tables;

  State _state;
  int _number = 1;  // of the session
  platform::FileDescriptor _delay;
  platform::FileDescriptor _taken;  // an eventfd that counts the delays
  std::string _delayer;
  sd_bus* _bus = nullptr;
  platform::RunLoop _loop;
  std::thread _thread;
};

}  // namespace testsupport
