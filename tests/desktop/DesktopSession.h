#pragma once

#include <string>

#include "tests/desktop/Bus.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

// A desktop of the test's own: a session bus that starts tallow-desktop on demand, as the installed
// service file says, and a system bus where logind may be. The user's programs are scripts that
// write their arguments where `nextProgram` reads them.
class DesktopSession {
 public:
  DesktopSession(const std::string& runtimeDirectory, bool withOpener);

  // The user's config.toml.
  void configure(const std::string& settings) const;
  // Waits for the next program that the desktop search starts, and returns its name and arguments,
  // separated by "|".
  [[nodiscard]] std::string nextProgram() const;

  [[nodiscard]] const std::string& address() const { return _session.address(); }
  [[nodiscard]] const std::string& systemAddress() const { return _system.address(); }
  // What tallow-desktop started directly needs of the environment.
  [[nodiscard]] const Process::Variables& environment() const { return _environment; }
  [[nodiscard]] std::string operator/(const std::string& name) const { return _directory / name; }

 private:
  void writeScript(const std::string& name) const;
  [[nodiscard]] std::string writeServiceFile() const;

  const TemporaryDirectory _directory;
  const Bus _system;
  Process::Variables _environment;
  const Bus _session;
};

}  // namespace testsupport
