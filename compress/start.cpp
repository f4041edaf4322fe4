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

// A list parameter as an array of texts.
Json::Value ExplodeParam(const KAVO::APIRequest& request, const char* name,
                         const Json::Value& fallback) {
  const Json::Value value = request.GetParam(name, fallback);
  return StringExplodeEx(value, kListSeparator, request.GetAPIVersion(), false);
}

std::string SettleCodepage(const KAVO::APIRequest& request, KavoSettings& settings) {
  std::string codepage = request.GetParam(kParamCodepage, "").asString();
  if (codepage.empty()) {
    Json::Value user_settings(Json::objectValue);
    settings.loadUserJsonSettings(user_settings);
    codepage = user_settings.get(kPersonalSettings, Json::Value(Json::objectValue))
                   .get(kSettingCodepage, "")
                   .asString();
  }
  return codepage;
}

// 0, or the error code.
int ReadDestination(const KAVO::APIRequest& request, std::string& dest) {
  const Json::Value destinations = ExplodeParam(request, kParamDest, "");
  if (destinations.size() != 1) {
    syslog(LOG_ERR, "%s:%d Bad parameter: Should not specify more than one detination path",
           kLogSource, __LINE__);
    return KAVO::kErrBadParameter;
  }
  dest = destinations[0].asString();
  // basename cuts slashes at the end in place, so that the worker sees the text without them too.
  char* const name = basename(dest.data());
  if (name == nullptr) {
    syslog(LOG_ERR, "%s:%d Bad parameter: no archive name", kLogSource, __LINE__);
    return KAVO::kErrBadParameter;
  }
  if (std::strlen(basename(name)) > kArchiveNameMax) {
    syslog(LOG_ERR, "%s:%d Bad parameter: Compress zipname too long", kLogSource, __LINE__);
    return KAVO::kErrArchiveNameTooLong;
  }
  dest.resize(std::strlen(dest.c_str()));
  return 0;
}

// 0, or the error code.
int ReadStartParameters(const KAVO::APIRequest& request, KavoSettings& settings,
                        StartParameters& start) {
  if (!request.HasParam(kParamPath) || !request.HasParam(kParamDest)) {
    syslog(LOG_ERR, "%s:%d Bad parameter", kLogSource, __LINE__);
    return KAVO::kErrBadParameter;
  }
  start.codepage = SettleCodepage(request, settings);
  const Json::Value source_list = ExplodeParam(request, kParamPath, "");
  if (source_list.empty()) {
    syslog(LOG_ERR, "%s:%d Bad parameter: no input source file", kLogSource, __LINE__);
    return KAVO::kErrBadParameter;
  }
  if (const int error = ReadDestination(request, start.dest)) {
    return error;
  }
  start.source_paths.reserve(source_list.size());
  for (const Json::Value& source : source_list) {
    start.source_paths.push_back(source.asString());
  }
  return 0;
}

// Null when the task cannot be made.
Vesk::Task* MakeTask(Vesk::TaskMgr& task_manager, const std::string& user) {
  try {
    const std::string task_id = task_manager.getUniqueTaskId(kTaskIdPrefix);
    return new Vesk::Task(user.c_str(), task_id.c_str());
  } catch (...) {
    return nullptr;
  }
}

Json::Value MakeTaskData(const KAVO::APIRequest& request, pid_t worker) {
  Json::Value data(Json::objectValue);
  data[kDataApi] = request.GetAPIClass();
  data[kDataMethod] = request.GetAPIMethod();
  data[kDataVersion] = request.GetAPIVersion();
  data[kDataTaskId] = pTask->getTaskId();
  data[kDataPid] = worker;
  Json::Value& params = data[kDataParams] = Json::Value(Json::objectValue);
  if (request.HasParam(kParamPath)) {
    params[kParamPath] = ExplodeParam(request, kParamPath, Json::Value());
  }
  if (request.HasParam(kParamDest)) {
    params[kParamDest] = ExplodeParam(request, kParamDest, Json::Value())[0];
  }
  for (const char* name : kParamsStoredRaw) {
    if (request.HasParam(name)) {
      // The password as well, as it was given: the task's readers expect the request unmasked.
      params[name] = request.GetParam(name, Json::Value());
    }
  }
  // The member comes first, so that the data handed over already holds it, as null.
  Json::Value& info = data[pTask->getTaskId()];
  info = LumoLibBkgTaskInfoCreate(data, kTaskKind);
  return data;
}

// False when the task is not stored.
bool StoreNewTask(const Json::Value& data) {
  pTask->beginUpdate();
  pTask->setProperty(kPropProgress, 0);
  if (!pTask->setProperty(kPropData, data)) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, __LINE__);
  }
  if (!pTask->endUpdate()) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, __LINE__);
    return false;
  }
  return true;
}

}  // namespace

void ZantroCompressHandler::LumoCompressHandler() {
  Vesk::TaskMgr task_manager(login_user.c_str());
  StartParameters start;
  _tag_CompressInfo_ info;
  KavoSettings settings(login_user.c_str());

  if (const int error = ReadStartParameters(*request, settings, start)) {
    return SetError(error);
  }
  Vesk::Task* const task = MakeTask(task_manager, login_user);
  if (task == nullptr) {
    return SetError(KAVO::kErrSystem);
  }
  pTask = task;
  const pid_t worker = KLIBCProcFork();
  if (worker < 0) {
    pTask->remove();
    syslog(LOG_ERR, "%s:%d Failed to fork().", kLogSource, __LINE__);
    return SetError(KAVO::kErrGeneral);
  }
  if (worker == 0) {
    RunWorker(start, info);
  }
  if (!StoreNewTask(MakeTaskData(*request, worker))) {
    // The worker runs on, as whoever signals it would stop an archive that may become whole; it has
    // no data to report in.
    return SetError(KAVO::kErrGeneral);
  }
  Json::Value answer(Json::objectValue);
  answer[kParamTaskId] = pTask->getTaskId();
  SetResponse(answer);
}

}  // namespace Zantro
