#include "tests/support/ShellTest.h"

#include <fmt/format.h>
#include <sys/wait.h>

#include <cstdlib>

#include "platform/Files.h"

namespace testsupport {

int ShellTest::shell(const std::string& command) {
  const std::string whole =
      fmt::format("cd {0} && ( {1} ) >{0}/out 2>{0}/err </dev/null", directory.path(), command);
  const int status = WEXITSTATUS(std::system(whole.c_str()));
  output = read("out");
  errors = read("err");
  return status;
}

std::string ShellTest::outputOfShell(const std::string& command) {
  EXPECT_EQ(shell(command), 0) << command << '\n' << output << errors;
  return output;
}

int ShellTest::run(const std::string& arguments, const std::string& more) {
  return shell(fmt::format("env {} {} {} {}", environment, more, tallow, arguments));
}

std::string ShellTest::outputOf(const std::string& arguments, const std::string& more) {
  EXPECT_EQ(run(arguments, more), 0) << arguments << '\n' << errors;
  return output;
}

std::string ShellTest::errorsOf(const std::string& arguments, const std::string& more) {
  EXPECT_EQ(run(arguments, more), 2) << arguments;
  return errors;
}

std::string ShellTest::read(const std::string& name) const {
  return platform::readFile(directory / name, size_t{1} << 30, nullptr).value_or("");
}

void ShellTest::write(const std::string& name, const std::string& text) const {
  directory.write(name, text);
}

}  // namespace testsupport
