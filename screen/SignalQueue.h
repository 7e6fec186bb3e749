#pragma once

#include <signal.h>

#include <optional>

#include "platform/FileDescriptor.h"

namespace mailscreen {

// Delivers the signals that concern a screen through a descriptor. During its lifetime they are
// blocked in this thread and in threads started from it.
class SignalQueue {
 public:
  SignalQueue();
  ~SignalQueue();
  SignalQueue(const SignalQueue&) = delete;
  SignalQueue& operator=(const SignalQueue&) = delete;

  // Readable when a signal has arrived.
  [[nodiscard]] int descriptor() const { return _descriptor.get(); }
  // The next signal, if one has arrived.
  [[nodiscard]] std::optional<int> next() const;

  // Performs the default action of a signal now.
  static void surrenderTo(int signal);

 private:
  sigset_t _before;
  platform::FileDescriptor _descriptor;
};

// Whether a signal asks a program to end.
[[nodiscard]] bool endsProgram(int signal);

}  // namespace mailscreen
