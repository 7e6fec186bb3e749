#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "bench/ChildProcess.h"
#include "bench/DaemonRun.h"
#include "bench/RunningProgram.h"
#include "bench/peers/Tools.h"

namespace peers {

// What brings an index in step with a mailbox, each with an index of its own. Throws when something
// fails. One thread.
class SyncSystem {
 public:
  SyncSystem() = default;
  virtual ~SyncSystem() = default;
  SyncSystem(const SyncSystem&) = delete;
  SyncSystem& operator=(const SyncSystem&) = delete;

  [[nodiscard]] virtual std::string name() const = 0;
  // Brings it in step; `residentPeak` is not set. The processor time is that of all processes.
  virtual bench::Run update() = 0;
  // How many mails the latest update has added; none where the program does not tell.
  [[nodiscard]] virtual std::optional<uint64_t> added() const { return std::nullopt; }
};

// `tallow sync` and the daemon.
class TallowSync : public SyncSystem {
 public:
  explicit TallowSync(std::string root);

  [[nodiscard]] std::string name() const override { return "tallow"; }
  bench::Run update() override;
  [[nodiscard]] std::optional<uint64_t> added() const override { return _added; }

  [[nodiscard]] const bench::DaemonRun& daemon() const { return _daemon; }
  // `tallow watch` of the same mailbox.
  [[nodiscard]] std::unique_ptr<bench::RunningProgram> startWatch() const;

 private:
  [[nodiscard]] bench::Command command(const char* name, const std::string& output) const;

  const std::string _root;
  const bench::ScratchDirectory _scratch;
  bench::DaemonRun _daemon;
  uint64_t _added = 0;
};

// `tallow index` and the daemon: everything is sent at each update.
class TallowIndex : public SyncSystem {
 public:
  explicit TallowIndex(std::string root);

  [[nodiscard]] std::string name() const override { return "tallow_index"; }
  bench::Run update() override;

 private:
  const std::string _root;
  const bench::ScratchDirectory _scratch;
  bench::DaemonRun _daemon;
};

class ToolSync : public SyncSystem {
 public:
  using Maker = Tool (*)(const std::string& mail, const bench::ScratchDirectory& scratch);

  ToolSync(std::string name, Maker make, const std::string& root);

  [[nodiscard]] std::string name() const override { return _name; }
  bench::Run update() override;

 private:
  const std::string _name;
  const bench::ScratchDirectory _scratch;
  const Tool _tool;
};

}  // namespace peers
