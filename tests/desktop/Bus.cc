#include "tests/desktop/Bus.h"

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include <fstream>

#include "platform/Assert.h"

namespace testsupport {

namespace {

constexpr const char* kConfiguration = R"(<busconfig>
  <type>session</type>
  <listen>unix:path={}</listen>
  <auth>EXTERNAL</auth>
  {}
  <policy context="default">
    <allow send_destination="*" eavesdrop="true"/>
    <allow eavesdrop="true"/>
    <allow own="*"/>
  </policy>
</busconfig>
)";

}  // namespace

Bus::Bus(const std::string& directory, const std::string& name,
         const Process::Variables& environment, const std::string& services) {
  const std::string file = directory + '/' + name + ".conf";
  const std::string serviceTag =
      services.empty() ? "" : fmt::format("<servicedir>{}</servicedir>", services);
  std::ofstream(file) << fmt::format(fmt::runtime(kConfiguration), directory + '/' + name,
                                     serviceTag);
  _process =
      std::make_unique<Process>(std::vector<std::string>{"dbus-daemon", "--config-file=" + file,
                                                         "--nofork", "--print-address"},
                                environment, directory + '/' + name + ".log");
  _address = _process->readLine();
  TL_ASSERT(!_address.empty());
}

sd_bus* connectTo(const std::string& address) {
  sd_bus* bus = nullptr;
  TL_ASSERT(sd_bus_new(&bus) >= 0);
  TL_ASSERT(sd_bus_set_address(bus, address.c_str()) >= 0);
  TL_ASSERT(sd_bus_set_bus_client(bus, 1) >= 0);
  TL_ASSERT(sd_bus_start(bus) >= 0);
  return bus;
}

}  // namespace testsupport
