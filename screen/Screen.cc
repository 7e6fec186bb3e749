#include "screen/Screen.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <chrono>

#include "cli/Commands.h"
#include "cli/Identifier.h"
#include "cli/ShellCommand.h"
#include "platform/FileDescriptor.h"
#include "screen/Keyboard.h"
#include "screen/MailLoader.h"
#include "screen/Model.h"
#include "screen/Painter.h"
#include "screen/Searcher.h"
#include "screen/SignalQueue.h"
#include "screen/TerminalSession.h"

namespace mailscreen {

namespace {

using Clock = std::chrono::steady_clock;

// Pause before a failed search is retried.
constexpr std::chrono::milliseconds kRetryAfter(1000);

// The event loop: waits for keys, signals and the worker threads, and draws the model.
class Loop {
 public:
  Loop(const cli::Options& options, const SignalQueue& signals, TerminalSession& terminal)
      : _signals(signals),
        _terminal(terminal),
        _wake(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
        _painter(cli::colorAllowed(options.color, STDOUT_FILENO)),
        _searcher(options, [this] { wake(); }),
        _loader(options, [this] { wake(); }) {
    _model.type(options.arguments);
  }

  // Runs until the end. Returns the signal that ended it, or 0.
  int run() {
    _model.resize(_terminal.rows(), _terminal.columns());
    while (!_model.done() && _endedBy == 0 && !_hungUp) {
      handOut();
      _painter.paint(_model);
      wait();
    }
    return _endedBy;
  }

 private:
  void wake() {
    const uint64_t one = 1;
    [[maybe_unused]] const ssize_t ignored = write(_wake.get(), &one, sizeof one);
  }

  void handOut() {
    if (auto search = _model.nextSearch()) _searcher.submit(std::move(*search));
    if (auto request = _model.nextMail()) _loader.submit(std::move(*request));
  }

  void wait() {
    std::array<pollfd, 3> events{
        {{STDIN_FILENO, POLLIN, 0}, {_signals.descriptor(), POLLIN, 0}, {_wake.get(), POLLIN, 0}}};
    if (poll(events.data(), events.size(), millisecondsToRetry()) < 0) return;
    if (_retryAt && Clock::now() >= *_retryAt) {
      _retryAt.reset();
      _model.retry();
    }
    if ((events[1].revents & POLLIN) != 0) takeSignals();
    if ((events[2].revents & POLLIN) != 0) takeResults();
    if ((events[0].revents & POLLIN) != 0) {
      for (const Event& event : _keyboard.read()) {
        _model.press(event);
        if (const auto command = _model.nextCommand()) carryOut(*command);
      }
    }
    _hungUp = (events[0].revents & (POLLHUP | POLLERR | POLLNVAL)) != 0;
  }

  // A timeout for poll; -1 if there is nothing to retry.
  int millisecondsToRetry() {
    if (!_model.wantsRetry()) _retryAt.reset();
    if (_model.wantsRetry() && !_retryAt) _retryAt = Clock::now() + kRetryAfter;
    if (!_retryAt) return -1;
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(*_retryAt - Clock::now());
    return static_cast<int>(std::max<int64_t>(left.count() + 1, 0));
  }

  void takeResults() {
    uint64_t count = 0;
    [[maybe_unused]] const ssize_t ignored = read(_wake.get(), &count, sizeof count);
    if (auto found = _searcher.take()) _model.take(std::move(*found));
    if (auto mail = _loader.take()) _model.take(std::move(*mail));
  }

  void takeSignals() {
    while (const auto signal = _signals.next()) {
      if (endsProgram(*signal)) _endedBy = *signal;
      if (*signal == SIGTSTP) suspend();
      if (*signal == SIGCONT) comeBack();
      if (*signal == SIGWINCH) measure();
    }
  }

  void measure() {
    _terminal.measure();
    _model.resize(_terminal.rows(), _terminal.columns());
  }

  void comeBack() {
    _terminal.comeBack();
    _model.resize(_terminal.rows(), _terminal.columns());
  }

  void suspend() {
    _terminal.leave();
    SignalQueue::surrenderTo(SIGTSTP);
    comeBack();
  }

  void carryOut(const Command& command) {
    switch (command.kind) {
      case Command::Kind::copy: {
        const std::string place = cli::findMaildirFile(command.place);
        _terminal.copy(place);
        return _model.tell("copied " + place);
      }
      case Command::Kind::open:
        return open(cli::findMaildirFile(command.place));
      case Command::Kind::suspend:
        return suspend();
      case Command::Kind::redraw:
        return comeBack();
    }
  }

  void open(const std::string& path) {
    const auto command = cli::openingCommand();
    if (!command) return _model.tell("$TALLOW_OPEN names no program to open mail with");
    _terminal.leave();
    pid_t process = -1;
    const int failure = cli::startShell(*command, {path}, STDIN_FILENO, process);
    if (failure == 0) waitFor(process);
    comeBack();
    if (failure != 0) _model.tell("$TALLOW_OPEN: " + platform::posixError(failure, "sh").message);
  }

  // The program owns the terminal. It may run as long as it likes, but not longer than this
  // process.
  void waitFor(pid_t process) {
    const platform::FileDescriptor ended(static_cast<int>(syscall(SYS_pidfd_open, process, 0)));
    int status = 0;
    while (_endedBy == 0 && waitpid(process, &status, WNOHANG) == 0) {
      std::array<pollfd, 2> events{{{ended.get(), POLLIN, 0}, {_signals.descriptor(), POLLIN, 0}}};
      poll(events.data(), events.size(), static_cast<int>(kRetryAfter.count()));
      while (const auto signal = _signals.next()) {
        // Ctrl-C and Ctrl-\ are for the program.
        if (*signal == SIGTERM || *signal == SIGHUP) _endedBy = *signal;
        if (*signal == SIGTSTP) SignalQueue::surrenderTo(SIGTSTP);
      }
    }
    if (WIFEXITED(status) && WEXITSTATUS(status) != 0) {
      _model.tell(fmt::format("$TALLOW_OPEN ended with status {}", WEXITSTATUS(status)));
    }
  }

  const SignalQueue& _signals;
  TerminalSession& _terminal;
  const platform::FileDescriptor _wake;
  int _endedBy = 0;
  bool _hungUp = false;
  std::optional<Clock::time_point> _retryAt;
  Model _model;
  Keyboard _keyboard;
  Painter _painter;
  Searcher _searcher;
  MailLoader _loader;
};

}  // namespace

cli::ExitStatus runScreen(const cli::Options& options) {
  int endedBy = 0;
  {
    const SignalQueue signals;
    const auto terminal = TerminalSession::open();
    if (terminal == nullptr) {
      cli::complain(std::string("nothing is known of this kind of terminal ($TERM)"));
      return cli::ExitStatus::failure;
    }
    endedBy = Loop(options, signals, *terminal).run();
  }
  // SIGINT ends the screen normally, as Ctrl-C does.
  if (endedBy != 0 && endedBy != SIGINT) SignalQueue::surrenderTo(endedBy);
  return cli::ExitStatus::done;
}

}  // namespace mailscreen
