#include "bench/peers/SyncSystems.h"

#include <fstream>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <utility>

#include "bench/Corpus.h"

namespace peers {

namespace {

// Makes the index, which is no part of a first update.
void openIndex(const bench::DaemonRun& daemon) {
  client::SearchServiceProxy service(daemon.runtimeDirectory());
  std::optional<TLError> error;
  const auto none =
      service.fetchLastClientState(bench::kClientName, bench::kProtectionClass, &error);
  if (error) throw std::runtime_error("opening: " + platform::printable(error));
}

// Some mail may be none, which is told by the status 2.
constexpr int kSomeFailed = 2;

bench::Run runWithDaemon(const bench::Command& command, const bench::DaemonRun& daemon) {
  const double start = daemon.cpuSeconds();
  bench::Run run = bench::runProgram(command, false);
  run.cpuSeconds += daemon.cpuSeconds() - start;
  return run;
}

}  // namespace

TallowSync::TallowSync(std::string root)
    : _root(std::move(root)), _daemon(_scratch, _scratch / "state") {
  openIndex(_daemon);
}

bench::Command TallowSync::command(const char* name, const std::string& output) const {
  return {{bench::programBeside("tallow"), "--runtime-dir", _daemon.runtimeDirectory(), name, _root,
           "--format=json"},
          {{"XDG_STATE_HOME", _scratch / "client"}, {"XDG_CONFIG_HOME", _scratch / "settings"}},
          _scratch / output,
          {0, kSomeFailed}};
}

bench::Run TallowSync::update() {
  const bench::Command sync = command("sync", "output");
  const bench::Run run = runWithDaemon(sync, _daemon);
  std::ifstream file(sync.output);
  const auto report = nlohmann::json::parse(file, nullptr, false);
  if (!report.is_object()) throw std::runtime_error("tallow sync tells nothing");
  _added = report.value("added", uint64_t{0});
  return run;
}

std::unique_ptr<bench::RunningProgram> TallowSync::startWatch() const {
  return std::make_unique<bench::RunningProgram>(command("watch", "watch"));
}

TallowIndex::TallowIndex(std::string root)
    : _root(std::move(root)), _daemon(_scratch, _scratch / "state") {
  openIndex(_daemon);
}

bench::Run TallowIndex::update() {
  return runWithDaemon({{bench::programBeside("tallow"), "--runtime-dir",
                         _daemon.runtimeDirectory(), "index", _root},
                        {},
                        _scratch / "output",
                        {0, kSomeFailed}},
                       _daemon);
}

ToolSync::ToolSync(std::string name, Maker make, const std::string& root)
    : _name(std::move(name)), _tool(make(root, _scratch)) {
  if (!_tool.prepare.empty()) (void)_tool.run(_tool.prepare, _scratch / "output");
}

bench::Run ToolSync::update() {
  return _tool.run(_tool.index, _scratch / "output");
}

}  // namespace peers
