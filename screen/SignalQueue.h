#pragma once

#include <signal.h>

#include <optional>

#include "platform/FileDescriptor.h"

namespace mailscreen {

// The signals that concern a screen, as events of a descriptor. While it lives they are blocked, in
// this thread and in those that it starts meanwhile.
class SignalQueue {
 public:
  SignalQueue();
  ~SignalQueue();
  SignalQueue(const SignalQueue&) = delete;
  SignalQueue& operator=(const SignalQueue&) = delete;

  // Readable where a signal has come.
  [[nodiscard]] int descriptor() const { return _descriptor.get(); }
  // The next that has come, if any.
  [[nodiscard]] std::optional<int> next() const;

  // Lets a signal do what it does by default, now.
  static void surrenderTo(int signal);

 private:
  sigset_t _before;
  platform::FileDescriptor _descriptor;
};

// Whether a signal asks a program to end.
[[nodiscard]] bool endsProgram(int signal);

}  // namespace mailscreen
