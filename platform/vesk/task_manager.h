// The task manager: background tasks that outlive the request that made them. Each task belongs to
// one user and is kept in a store which all processes of the device share.
#pragma once

#include <json/json.h>

#include <string>

namespace Vesk {

// One task, as this process last read it: constructing or reload() reads the store, the getters
// answer from what was read, the setters write through.
class Task {
 public:
  struct State;

  // Makes a new task of that id in the user's store. Throws std::exception when it cannot.
  Task(const char* user, const char* task_id);
  // Frees the object; the task itself stays in the store. An open update is dropped.
  ~Task();
  Task(const Task&) = delete;
  Task& operator=(const Task&) = delete;

  // The id, valid as long as the object.
  const char* getTaskId() const;

  // Between the two, property writes are gathered and stored all together or not at all.
  // endUpdate is false when they could not be stored.
  void beginUpdate();
  bool endUpdate();

  // Sets a property to any JSON value. False when it is not stored.
  bool setProperty(const char* name, const Json::Value& value);
  // The property's value, null when the task has none of that name.
  Json::Value getProperty(const char* name) const;
  // The property's value when it is of that type, else `fallback`.
  bool getBoolProperty(const char* name, bool fallback) const;
  double getDoubleProperty(const char* name, double fallback) const;

  // Reads the task again, as other processes may have written it.
  void reload();

  // Marks the task finished and closes an open update, storing what was gathered in it. The
  // argument is false. False when the task could not be stored as finished.
  bool finish(bool reserved);
  bool isFinished() const;

  // Deletes the task from the store. Deleting what is no longer there is no failure.
  void remove();

  // Sends a desktop notification to the task's user: application instance, task id, title key and
  // message key, then the message's arguments as const char*. How many arguments there are follows
  // from the message key alone. The texts are shown as they are, so what came from a user must be
  // encoded by the caller.
  void sendNotifyMessageNoEncode(const char* app, const char* task_id, const char* title,
                                 const char* message, ...);

  State* state;  // the task manager's own; no module looks inside

 private:
  friend class TaskMgr;
  explicit Task(State* task_state);
};

// The tasks of one user.
class TaskMgr {
 public:
  struct State;

  // The text is copied. Does not fail: a store that cannot be opened shows in the calls below.
  explicit TaskMgr(const char* user);
  ~TaskMgr();
  TaskMgr(const TaskMgr&) = delete;
  TaskMgr& operator=(const TaskMgr&) = delete;

  // An id, beginning with `prefix`, that no task of the user has. Throws std::exception when the
  // store cannot be asked.
  std::string getUniqueTaskId(const char* prefix);
  // The user's task of that id, made with new; the caller owns the object, which may outlive the
  // manager. Throws std::exception when there is none.
  Task* getTaskWithThrow(const char* task_id);

 private:
  State* state_;
};

}  // namespace Vesk

// Stores "data" and "progress" (0 to 1) of the task together. Zero when they are not stored.
int SaveTaskData(Vesk::Task* task, Json::Value& data, float progress);

// Wait until the task has the property, or until the property is an object that has the key, but
// no longer than the seconds given. The task is reloaded meanwhile. Zero after the time-out.
int WaitForTaskDataReady(Vesk::Task* task, const char* property, int seconds);
int WaitForTaskDataKeyReady(Vesk::Task* task, const char* property, const char* key, int seconds);

// What the file manager's task list shows of a background task of that kind, made from its "data".
Json::Value LumoLibBkgTaskInfoCreate(const Json::Value& data, const std::string& kind);

// Removes the task from the store if, as this process last read it, it has finished or holds
// "errors". `task` may be null: nothing happens then. `pid` is the worker's, -1 when unknown; the
// library may look whether that process has ended. The last argument is false.
void LumoLibRemoveFinishedTask(Vesk::Task* task, int pid, bool reserved);

// Removes the user's stale tasks.
void CleanTimeOutTasks(const char* user);

// Ends a worker process of the calling user, and with it all that runs in its process group.
// Non-zero when it no longer runs, zero when it could not be ended or `pid` is not one of the
// user's workers.
int DoKill(int pid);
