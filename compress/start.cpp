// Method "start": checks the request, creates the task, forks the worker, stores the request in the
// task and answers with the task's id. A failed fork removes the task; nothing else is undone.
#include <libgen.h>
#include <sys/types.h>
#include <syslog.h>

#include <cstring>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"
#include "platform/kavo/settings.h"
#include "platform/klib/system.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {

constexpr char kPersonalSettings[] = "KAVO.Nolo.App.PersonalSettings.Instance";
constexpr char kSettingCodepage[] = "codepage";
constexpr char kListSeparator[] = ",";
constexpr std::size_t kArchiveNameMax = 255;  // bytes
constexpr const char* kParamsStoredRaw[] = {kParamLevel, kParamMode, kParamFormat, kParamPassword,
                                            kParamCodepage};

}  // namespace

void ZantroCompressHandler::LumoCompressHandler() {
  Vesk::TaskMgr task_manager(login_user.c_str());
  StartParameters start;
  _tag_CompressInfo_ info;
  KavoSettings settings(login_user.c_str());

  if (!ReadStartParameters(settings, start)) {
    return;
  }
  if (!CreateTask(task_manager)) {
    return;
  }
  const pid_t worker = KLIBCProcFork();
  if (worker < 0) {
    pTask->remove();
    syslog(LOG_ERR, "%s:%d Failed to fork().", kLogSource, __LINE__);
    SetError(KAVO::kErrGeneral);
    return;
  }
  if (worker == 0) {
    RunWorker(start, info);
  }
  StoreNewTask(worker);
}

bool ZantroCompressHandler::ReadStartParameters(KavoSettings& settings, StartParameters& start) {
  if (!request->HasParam(kParamPath) || !request->HasParam(kParamDest)) {
    syslog(LOG_ERR, "%s:%d Bad parameter", kLogSource, __LINE__);
    SetError(KAVO::kErrBadParameter);
    return false;
  }
  start.codepage = SettleCodepage(settings);
  const Json::Value source_list = ExplodeParam(kParamPath, "");
  if (source_list.empty()) {
    syslog(LOG_ERR, "%s:%d Bad parameter: no input source file", kLogSource, __LINE__);
    SetError(KAVO::kErrBadParameter);
    return false;
  }
  if (!ReadDestination(start)) {
    return false;
  }
  start.source_paths.reserve(source_list.size());
  for (const Json::Value& source : source_list) {
    start.source_paths.push_back(source.asString());
  }
  return true;
}

std::string ZantroCompressHandler::SettleCodepage(KavoSettings& settings) const {
  std::string codepage = request->GetParam(kParamCodepage, "").asString();
  if (codepage.empty()) {
    Json::Value user_settings(Json::objectValue);
    settings.loadUserJsonSettings(user_settings);
    codepage = user_settings.get(kPersonalSettings, Json::Value(Json::objectValue))
                   .get(kSettingCodepage, "")
                   .asString();
  }
  return codepage;
}

bool ZantroCompressHandler::ReadDestination(StartParameters& start) {
  const Json::Value destinations = ExplodeParam(kParamDest, "");
  if (destinations.size() != 1) {
    syslog(LOG_ERR, "%s:%d Bad parameter: Should not specify more than one detination path",
           kLogSource, __LINE__);
    SetError(KAVO::kErrBadParameter);
    return false;
  }
  start.dest = destinations[0].asString();
  // basename cuts slashes at the end in place; deliberate, the worker is to see the text without
  // them too.
  char* name = basename(start.dest.data());
  if (name == nullptr) {
    syslog(LOG_ERR, "%s:%d Bad parameter: no archive name", kLogSource, __LINE__);
    SetError(KAVO::kErrBadParameter);
    return false;
  }
  if (std::strlen(basename(name)) > kArchiveNameMax) {
    syslog(LOG_ERR, "%s:%d Bad parameter: Compress zipname too long", kLogSource, __LINE__);
    SetError(KAVO::kErrArchiveNameTooLong);
    return false;
  }
  start.dest.resize(std::strlen(start.dest.c_str()));
  return true;
}

// A list parameter as an array of texts.
Json::Value ZantroCompressHandler::ExplodeParam(const char* name,
                                                const Json::Value& fallback) const {
  const Json::Value value = request->GetParam(name, fallback);
  return StringExplodeEx(value, kListSeparator, request->GetAPIVersion(), false);
}

bool ZantroCompressHandler::CreateTask(Vesk::TaskMgr& task_manager) {
  try {
    const std::string task_id = task_manager.getUniqueTaskId(kTaskIdPrefix);
    pTask = new Vesk::Task(login_user.c_str(), task_id.c_str());
    return true;
  } catch (...) {
    SetError(KAVO::kErrSystem);
    return false;
  }
}

Json::Value ZantroCompressHandler::MakeTaskData(pid_t worker) const {
  Json::Value data(Json::objectValue);
  data[kDataApi] = request->GetAPIClass();
  data[kDataMethod] = request->GetAPIMethod();
  data[kDataVersion] = request->GetAPIVersion();
  data[kDataTaskId] = pTask->getTaskId();
  data[kDataPid] = worker;
  Json::Value& params = data[kDataParams] = Json::Value(Json::objectValue);
  if (request->HasParam(kParamPath)) {
    params[kParamPath] = ExplodeParam(kParamPath, Json::Value());
  }
  if (request->HasParam(kParamDest)) {
    params[kParamDest] = ExplodeParam(kParamDest, Json::Value())[0];
  }
  for (const char* name : kParamsStoredRaw) {
    if (request->HasParam(name)) {
      // The password as well: deliberately as it was given.
      params[name] = request->GetParam(name, Json::Value());
    }
  }
  // The member comes first, so that the data handed over already holds it, as null.
  Json::Value& info = data[pTask->getTaskId()];
  info = LumoLibBkgTaskInfoCreate(data, kTaskKind);
  return data;
}

void ZantroCompressHandler::StoreNewTask(pid_t worker) {
  const Json::Value data = MakeTaskData(worker);
  pTask->beginUpdate();
  pTask->setProperty(kPropProgress, 0);
  if (!pTask->setProperty(kPropData, data)) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, __LINE__);
  }
  if (!pTask->endUpdate()) {
    // The worker runs on, deliberately; it makes the archive but has no data to report in.
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, __LINE__);
    SetError(KAVO::kErrGeneral);
    return;
  }
  Json::Value answer(Json::objectValue);
  answer[kParamTaskId] = pTask->getTaskId();
  SetResponse(answer);
}

}  // namespace Zantro
