#pragma once

#include <functional>
#include <string>
#include <vector>

#include "tests/support/Programs.h"
#include "tests/support/ShellTest.h"

namespace testsupport {

// A test of programs in a real terminal, which tmux provides. The home directory is `directory`.
class TmuxTest : public ShellTest {
 protected:
  void TearDown() override { tmux("kill-server"); }

  // Starts `command` in a terminal of this size.
  void start(const std::string& command, int columns, int rows) const;
  // Starts bash in it.
  void startShell(int columns, int rows) const;
  // The output of a tmux command; the terminal is called t.
  std::string tmux(const std::string& arguments) const;

  // Type a text (without single quotes), press keys, or type a line and press Enter. What is shown
  // after that, if given, is waited for.
  void type(const std::string& text, const std::string& shown = "") const;
  void press(const std::string& keys, const std::string& shown = "") const;
  void enter(const std::string& line, const std::string& shown = "") const;
  [[nodiscard]] std::string screen() const;
  [[nodiscard]] std::vector<std::string> lines() const;

  // Poll the screen until the condition holds; a failure of the test after a minute.
  void awaitThat(const std::function<bool(const std::string&)>& holds,
                 const std::string& what) const;
  void await(const std::string& text) const;
  void awaitGone(const std::string& text) const;

  std::string variables;  // environment variables of the programs in the terminal, NAME=VALUE
};

}  // namespace testsupport
