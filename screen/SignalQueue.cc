#include "screen/SignalQueue.h"

#include <pthread.h>
#include <sys/signalfd.h>
#include <unistd.h>

namespace mailscreen {

namespace {

constexpr int kSignals[] = {SIGINT, SIGQUIT, SIGTERM, SIGHUP, SIGTSTP, SIGCONT, SIGWINCH};

}  // namespace

SignalQueue::SignalQueue() {
  sigset_t signals;
  sigemptyset(&signals);
  for (const int signal : kSignals) sigaddset(&signals, signal);
  pthread_sigmask(SIG_BLOCK, &signals, &_before);
  _descriptor = platform::FileDescriptor(signalfd(-1, &signals, SFD_NONBLOCK | SFD_CLOEXEC));
}

SignalQueue::~SignalQueue() {
  pthread_sigmask(SIG_SETMASK, &_before, nullptr);
}

std::optional<int> SignalQueue::next() const {
  signalfd_siginfo info;
  const bool there = read(_descriptor.get(), &info, sizeof info) == sizeof info;
  return there ? std::optional(static_cast<int>(info.ssi_signo)) : std::nullopt;
}

void SignalQueue::surrenderTo(int signal) {
  sigset_t one;
  sigset_t before;
  sigemptyset(&one);
  sigaddset(&one, signal);
  struct sigaction usual {};
  struct sigaction own {};
  usual.sa_handler = SIG_DFL;
  sigaction(signal, &usual, &own);
  raise(signal);
  pthread_sigmask(SIG_UNBLOCK, &one, &before);
  // If the default action only stopped the process, it continues here.
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  sigaction(signal, &own, nullptr);
}

bool endsProgram(int signal) {
  return signal == SIGINT || signal == SIGQUIT || signal == SIGTERM || signal == SIGHUP;
}

}  // namespace mailscreen
