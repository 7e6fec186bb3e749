#include "platform/SpawnPlan.h"

#include <fcntl.h>
#include <unistd.h>

#include <csignal>

namespace platform {

namespace {

sigset_t setOf(std::initializer_list<int> signals) {
  sigset_t set;
  sigemptyset(&set);
  for (const int signal : signals) sigaddset(&set, signal);
  return set;
}

}  // namespace

SpawnPlan::SpawnPlan() {
  keepError(posix_spawn_file_actions_init(&_actions));
  keepError(posix_spawnattr_init(&_attributes));
}

SpawnPlan::~SpawnPlan() {
  posix_spawnattr_destroy(&_attributes);
  posix_spawn_file_actions_destroy(&_actions);
}

SpawnPlan& SpawnPlan::pass(int ours, int theirs) {
  keepError(posix_spawn_file_actions_adddup2(&_actions, ours, theirs));
  return *this;
}

SpawnPlan& SpawnPlan::silence(int theirs) {
  keepError(posix_spawn_file_actions_addopen(&_actions, theirs, "/dev/null", O_RDWR, 0));
  return *this;
}

SpawnPlan& SpawnPlan::resetSignals(std::initializer_list<int> signals) {
  const sigset_t set = setOf(signals);
  posix_spawnattr_setsigdefault(&_attributes, &set);
  addFlag(POSIX_SPAWN_SETSIGDEF);
  return *this;
}

SpawnPlan& SpawnPlan::blockSignals(std::initializer_list<int> signals) {
  const sigset_t set = setOf(signals);
  posix_spawnattr_setsigmask(&_attributes, &set);
  addFlag(POSIX_SPAWN_SETSIGMASK);
  return *this;
}

SpawnPlan& SpawnPlan::inOwnGroup() {
  addFlag(POSIX_SPAWN_SETPGROUP);
  return *this;
}

int SpawnPlan::run(const std::vector<std::string>& words, pid_t& process) const {
  if (_error != 0) return _error;
  std::vector<char*> arguments;
  for (const std::string& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  return posix_spawnp(&process, arguments.front(), &_actions, &_attributes, arguments.data(),
                      environ);
}

void SpawnPlan::keepError(int result) {
  if (_error == 0) _error = result;
}

void SpawnPlan::addFlag(short flag) {
  _flags = static_cast<short>(_flags | flag);
  posix_spawnattr_setflags(&_attributes, _flags);
}

}  // namespace platform
