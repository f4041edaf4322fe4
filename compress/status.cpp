// Method "status": how far a task has got. The answer that reports a task finished removes it, so
// it is reported once.
#include <syslog.h>

#include <optional>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"

namespace Zantro {

namespace {

constexpr char kAnswerFinished[] = "finished";
constexpr int kNoProcess = -1;

int WorkerOf(const Json::Value& data) {
  const Json::Value worker = data.isObject() ? data[kDataPid] : Json::Value();
  return worker.isInt() ? worker.asInt() : kNoProcess;
}

Json::Value MakeAnswer(const Json::Value& data) {
  Json::Value answer(Json::objectValue);
  if (data.isMember(kDataParams)) {
    const Json::Value& params = data[kDataParams];  // may be large
    answer[kParamDest] = params.get(kParamDest, "").asString();
  }
  if (data.isMember(kDataErrors)) {
    // Errors alone decide: the worker may have failed to mark the task finished.
    answer[kAnswerFinished] = true;
    answer[kDataErrors] = data[kDataErrors];
  } else {
    answer[kPropProgress] = pTask->getDoubleProperty(kPropProgress, 0);
    answer[kAnswerFinished] = pTask->isFinished();
  }
  return answer;
}

struct Status {
  int error = 0;
  Json::Value answer;  // when there is no error
  Json::Value data;    // of the task; null when there is none
};

// Leaves the task, if there is one, in pTask.
Status ReadStatus(const KAVO::APIRequest& request, const std::string& user,
                  std::optional<Vesk::TaskMgr>& task_manager) {
  if (!request.HasParam(kParamTaskId)) {
    return {KAVO::kErrBadParameter, {}, {}};
  }
  task_manager.emplace(user.c_str());
  const std::string task_id = request.GetParam(kParamTaskId, "").asString();
  try {
    pTask = task_manager->getTaskWithThrow(task_id.c_str());
  } catch (...) {
    return {KAVO::kErrNoTask, {}, {}};
  }
  const Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    return {KAVO::kErrSystem, {}, {}};
  }
  return {0, MakeAnswer(data), data};
}

}  // namespace

void ZantroCompressHandler::LumoProgressHandler() {
  std::optional<Vesk::TaskMgr> task_manager;  // outlives the removal
  // The removal is asked for on every path, also where there is no task: the call takes null.
  Status status;
  try {
    status = ReadStatus(*request, login_user, task_manager);
  } catch (...) {
    LumoLibRemoveFinishedTask(pTask, kNoProcess, false);
    throw;
  }
  if (status.error != 0) {
    SetError(status.error);
  } else {
    SetResponse(status.answer);
  }
  LumoLibRemoveFinishedTask(pTask, WorkerOf(status.data), false);
}

}  // namespace Zantro
