#include "tests/desktop/DesktopSession.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <cstdlib>
#include <fstream>
#include <sstream>

#include "platform/Assert.h"

namespace testsupport {

namespace {

std::string contentOf(const std::string& path) {
  std::ostringstream content;
  content << std::ifstream(path).rdbuf();
  return content.str();
}

}  // namespace

DesktopSession::DesktopSession(const std::string& runtimeDirectory, bool withOpener)
    : _system(_directory.path(), "system"),
      _environment{{"RUNTIME_DIRECTORY", runtimeDirectory},
                   {"XDG_CONFIG_HOME", _directory / "config"},
                   {"XDG_STATE_HOME", _directory / "client"},
                   {"STATE_DIRECTORY", _directory / "state"},
                   {"DBUS_SYSTEM_BUS_ADDRESS", _system.address()},
                   {"TALLOW_OPEN", withOpener ? "open-mail --now" : ""},
                   {"PATH", _directory / "bin" + ":" + std::getenv("PATH")}},
      _session(_directory.path(), "session", _environment, writeServiceFile()) {
  TL_ASSERT(mkfifo((_directory / "programs").c_str(), 0600) == 0);
  for (const char* name : {"open-mail", "xdg-terminal-exec"}) writeScript(name);
  configure("desktop_search = true");
}

std::string DesktopSession::writeServiceFile() const {
  std::string text = contentOf(TALLOW_DESKTOP_FILES "/com.quill.tallow.Desktop.service");
  const std::string installed = "/usr/bin/tallow-desktop";
  TL_ASSERT(text.find(installed) != std::string::npos);
  text.replace(text.find(installed), installed.size(), TALLOW_DESKTOP_PROGRAM);
  _directory.write("services/com.quill.tallow.Desktop.service", text);
  return _directory / "services";
}

void DesktopSession::writeScript(const std::string& name) const {
  const std::string path = _directory.write(
      "bin/" + name, fmt::format("#!/bin/sh\n(printf '%s' {}; printf '|%s' \"$@\") >'{}'\n", name,
                                 _directory / "programs"));
  chmod(path.c_str(), 0700);
}

void DesktopSession::configure(const std::string& settings) const {
  _directory.write("config/tallow/config.toml", settings + '\n');
}

std::string DesktopSession::nextProgram() const {
  return contentOf(_directory / "programs");
}

}  // namespace testsupport
