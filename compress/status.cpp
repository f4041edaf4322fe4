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

}  // namespace

void ZantroCompressHandler::LumoProgressHandler() {
  std::optional<Vesk::TaskMgr> task_manager;  // outlives the removal
  // The removal is asked for on every path, deliberately: after an error there may be no task, and
  // the call takes null.
  Json::Value data;
  try {
    data = ReportProgress(task_manager);
  } catch (...) {
    LumoLibRemoveFinishedTask(pTask, kNoProcess, false);
    throw;
  }
  LumoLibRemoveFinishedTask(pTask, WorkerOf(data), false);
}

Json::Value ZantroCompressHandler::ReportProgress(std::optional<Vesk::TaskMgr>& task_manager) {
  if (!request->HasParam(kParamTaskId)) {
    SetError(KAVO::kErrBadParameter);
    return {};
  }
  task_manager.emplace(login_user.c_str());
  const std::string task_id = request->GetParam(kParamTaskId, "").asString();
  try {
    pTask = task_manager->getTaskWithThrow(task_id.c_str());
  } catch (...) {
    SetError(KAVO::kErrNoTask);
    return {};
  }
  Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    SetError(KAVO::kErrSystem);
    return data;
  }
  SetResponse(MakeAnswer(data));
  return data;
}

}  // namespace Zantro
