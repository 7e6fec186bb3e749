#pragma once

#include <spawn.h>
#include <sys/types.h>

#include <initializer_list>
#include <string>
#include <vector>

namespace platform {

// How a program is started: its descriptors, signals and process group. What a plan does not say
// the program has as this process has it. One thread.
class SpawnPlan {
 public:
  SpawnPlan();
  ~SpawnPlan();
  SpawnPlan(const SpawnPlan&) = delete;
  SpawnPlan& operator=(const SpawnPlan&) = delete;

  // The program gets our descriptor `ours` as `theirs`.
  SpawnPlan& pass(int ours, int theirs);
  // Reading gives nothing, and what is written is dropped.
  SpawnPlan& silence(int theirs);
  // These signals are not ignored.
  SpawnPlan& resetSignals(std::initializer_list<int> signals);
  // These signals are blocked, and no others.
  SpawnPlan& blockSignals(std::initializer_list<int> signals);
  // A terminal sends it no signals.
  SpawnPlan& inOwnGroup();

  // Starts words[0], which is looked up in $PATH if it has no slash, with all words as arguments.
  // Returns 0 or an errno value, which may be that of an earlier step of the plan.
  [[nodiscard]] int run(const std::vector<std::string>& words, pid_t& process) const;

 private:
  void keepError(int result);
  void addFlag(short flag);

  posix_spawn_file_actions_t _actions;
  posix_spawnattr_t _attributes;
  short _flags = 0;
  int _error = 0;  // of the first step that failed
};

}  // namespace platform
