// Method "stop": kills a task's worker, and with it the archiver, and removes the task. A part of
// an archive that the archiver leaves is not cleaned up here.
#include <syslog.h>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"

namespace Zantro {

void ZantroCompressHandler::LumoCancelHandler() {
  if (!request->HasParam(kParamTaskId)) {
    SetError(KAVO::kErrBadParameter);
    return;
  }
  Vesk::TaskMgr task_manager(login_user.c_str());
  const std::string task_id = request->GetParam(kParamTaskId, "").asString();
  try {
    pTask = task_manager.getTaskWithThrow(task_id.c_str());
  } catch (...) {
    return;  // no such task: nothing to stop, deliberately no error
  }
  try {
    KillWorker();
  } catch (...) {
    pTask->remove();
    throw;
  }
  pTask->remove();
}

void ZantroCompressHandler::KillWorker() {
  // "start" may still be storing the worker's process id.
  if (WaitForTaskDataKeyReady(pTask, kPropData, kDataPid, kDataWaitSeconds) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    SetError(KAVO::kErrSystem);
    return;
  }
  if (pTask->isFinished()) {
    return;
  }
  const Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    SetError(KAVO::kErrSystem);
    return;
  }
  if (DoKill(data[kDataPid].asInt()) == 0) {
    SetError(KAVO::kErrSystem);
  }
}

}  // namespace Zantro
