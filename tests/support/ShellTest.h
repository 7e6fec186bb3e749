#pragma once

#include <gtest/gtest.h>

#include <string>

#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// A test of programs that a shell runs in the test's directory, without input.
class ShellTest : public testing::Test {
 protected:
  // Runs the command and returns its exit status; afterwards `output` and `errors` are what it
  // wrote.
  int shell(const std::string& command);
  // The output of a command that must succeed.
  std::string outputOfShell(const std::string& command);

  // Runs `tallow ARGUMENTS`; `more` are environment variables, NAME=VALUE, besides `environment`.
  int run(const std::string& arguments, const std::string& more = "");
  // The same for a run that must succeed, and for one that must fail with the status 2.
  std::string outputOf(const std::string& arguments, const std::string& more = "");
  std::string errorsOf(const std::string& arguments, const std::string& more = "");

  // Files of the directory; one that is absent reads as empty.
  [[nodiscard]] std::string read(const std::string& name) const;
  void write(const std::string& name, const std::string& text) const;

  const TemporaryDirectory directory;
  std::string environment;  // options of env(1), and variables
  std::string tallow;       // the program under test, and what comes before the arguments
  std::string output;
  std::string errors;
};

}  // namespace testsupport
