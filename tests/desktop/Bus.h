#pragma once

#include <memory>
#include <string>

#include "tests/support/Process.h"

struct sd_bus;

namespace testsupport {

// A bus of the test's own, by dbus-daemon. `services` is a directory of .service files, which it
// starts on demand.
class Bus {
 public:
  Bus(const std::string& directory, const std::string& name,
      const Process::Variables& environment = {}, const std::string& services = "");

  [[nodiscard]] const std::string& address() const { return _address; }
  // The bus ends, and with it the connections to it.
  void end() { _process.reset(); }

 private:
  std::string _address;
  std::unique_ptr<Process> _process;
};

// A new connection to a bus, which the caller owns.
[[nodiscard]] sd_bus* connectTo(const std::string& address);

}  // namespace testsupport
