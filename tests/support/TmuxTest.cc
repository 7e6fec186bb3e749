#include "tests/support/TmuxTest.h"

#include <fmt/format.h>

#include <chrono>
#include <sstream>

namespace testsupport {

namespace {

constexpr std::chrono::seconds kPatience(60);

}  // namespace

void TmuxTest::start(const std::string& command, int columns, int rows) const {
  tmux(fmt::format("new-session -d -s t -x {} -y {} \"{}\" \\; set -g set-clipboard on", columns,
                   rows, command));
}

void TmuxTest::startShell(int columns, int rows) const {
  start("PS1='ready> ' exec bash --norc --noprofile -i", columns, rows);
  await("ready>");
}

std::string TmuxTest::tmux(const std::string& arguments) const {
  return testsupport::outputOf(fmt::format(
      "env -u TMUX -u STATE_DIRECTORY LC_ALL=C.UTF-8 HOME={0} XDG_STATE_HOME={0}/client "
      "XDG_CONFIG_HOME={0}/config TZ=UTC SHELL=/bin/bash {1} tmux -u -f /dev/null -S {0}/tmux {2}",
      directory.path(), variables, arguments));
}

void TmuxTest::type(const std::string& text, const std::string& shown) const {
  tmux("send-keys -t t -l -- '" + text + "'");
  await(shown);
}

void TmuxTest::press(const std::string& keys, const std::string& shown) const {
  tmux("send-keys -t t " + keys);
  await(shown);
}

void TmuxTest::enter(const std::string& line, const std::string& shown) const {
  type(line);
  press("Enter", shown);
}

std::string TmuxTest::screen() const {
  return tmux("capture-pane -p -t t");
}

std::vector<std::string> TmuxTest::lines() const {
  std::istringstream text(screen());
  std::vector<std::string> all;
  for (std::string line; std::getline(text, line);) all.push_back(line);
  return all;
}

void TmuxTest::awaitThat(const std::function<bool(const std::string&)>& holds,
                         const std::string& what) const {
  const auto end = std::chrono::steady_clock::now() + kPatience;
  std::string seen;
  while (std::chrono::steady_clock::now() < end) {
    seen = screen();
    if (holds(seen)) return;
  }
  FAIL() << what << " is not so:\n" << seen;
}

void TmuxTest::await(const std::string& text) const {
  if (text.empty()) return;
  awaitThat([&](const std::string& seen) { return seen.find(text) != std::string::npos; },
            "\"" + text + "\" on the screen");
}

void TmuxTest::awaitGone(const std::string& text) const {
  awaitThat([&](const std::string& seen) { return seen.find(text) == std::string::npos; },
            "\"" + text + "\" not on the screen");
}

}  // namespace testsupport
