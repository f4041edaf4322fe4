// Method "stop": kills a task's worker, and with it the archiver, and removes the task. A part of
// an archive that the archiver leaves is not cleaned up here.
#include <syslog.h>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"

namespace Zantro {

namespace {

// 0, or the error code.
int KillWorker() {
  // "start" may still be storing the worker's process id.
  if (WaitForTaskDataKeyReady(pTask, kPropData, kDataPid, kDataWaitSeconds) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    return KAVO::kErrSystem;
  }
  if (pTask->isFinished()) {
    return 0;
  }
  const Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    return KAVO::kErrSystem;
  }
  return DoKill(data[kDataPid].asInt()) == 0 ? KAVO::kErrSystem : 0;
}

}  // namespace

void ZantroCompressHandler::LumoCancelHandler() {
  if (!request->HasParam(kParamTaskId)) {
    return SetError(KAVO::kErrBadParameter);
  }
  Vesk::TaskMgr task_manager(login_user.c_str());
  const std::string task_id = request->GetParam(kParamTaskId, "").asString();
  try {
    pTask = task_manager.getTaskWithThrow(task_id.c_str());
  } catch (...) {
    return;  // nothing to stop: no error, for clients that ask twice
  }
  int error = 0;
  try {
    error = KillWorker();
  } catch (...) {
    pTask->remove();
    throw;
  }
  if (error != 0) {
    SetError(error);
  }
  pTask->remove();
}

}  // namespace Zantro
