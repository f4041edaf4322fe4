// What is behind a Vesk::Task: the row as this process last read or wrote it, and the writes that
// are gathered. The task manager's own operations work on this, so that a trace shows the module's
// calls alone.
#pragma once

#include <map>
#include <string>

#include "device/tasks/task_store.h"
#include "platform/vesk/task_manager.h"

struct Vesk::Task::State {
  // What is gathered or, else, stored; null when the task has none of that name.
  const Device::StoredValue& Find(const std::string& name) const;
  // Stores at once, or gathers when an update is open. False when it is not stored.
  bool Set(const std::string& name, Device::StoredValue value);
  // Stores what is gathered and closes the update. False, and a line logged, when it is not stored.
  bool Store(bool is_finished);
  // Stores these, and nothing that is gathered.
  bool StoreNow(std::map<std::string, Device::StoredValue> properties, bool is_finished);
  // False when the task was removed meanwhile; it has no properties then. A store that cannot be
  // read is logged and leaves the task as it was known.
  bool Reload();
  void Remove();

  // Makes the row what is stored again.
  void Forget();

  std::string user;
  Device::TaskRow row;
  bool is_updating = false;
  std::map<std::string, Device::StoredValue> pending;
};
