// The background worker: takes on the user's identity, runs the job's steps, writes the outcome
// into the task, notifies the desktop and leaves. It never returns into the host and never answers
// a request; all that it has to say goes into the task and the log.
#include <syslog.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <exception>
#include <optional>
#include <utility>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/list_file.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {

constexpr char kNotifyApp[] = "KAVO.Nolo.App.Zantro3.Instance";
constexpr char kNotifyTitle[] = "tree:leaf_filebrowser";
constexpr char kNotifyCompleted[] = "filebrowser:filebrowser_compress_completed";
constexpr char kNotifyFailed[] = "filebrowser:filebrowser_compress_failed";

// Holds SIGTERM back while the list file is made and has no owner yet, so that the handler meets no
// file that it cannot remove.
class TermHeldBack {
 public:
  TermHeldBack() {
    sigset_t term;
    sigemptyset(&term);
    sigaddset(&term, SIGTERM);
    sigprocmask(SIG_BLOCK, &term, &saved_);
  }
  ~TermHeldBack() { sigprocmask(SIG_SETMASK, &saved_, nullptr); }
  TermHeldBack(const TermHeldBack&) = delete;
  TermHeldBack& operator=(const TermHeldBack&) = delete;

 private:
  sigset_t saved_{};
};

// Takes the whole process group along, so that the archiver does not outlive a stopped task.
void EndProcessGroup(int signal_number) {
  if (signal_number == SIGTERM) {
    kill(0, SIGTERM);
    ListFile::RemovePresent();
    std::exit(1);  // NOLINT(bugprone-signal-handler): who stops a worker kills it if this hangs
  }
}

void TellSuccess(const std::string& name, Json::Value& data) {
  if (pTask->getBoolProperty(kPropNotify, false)) {
    pTask->sendNotifyMessageNoEncode(kNotifyApp, pTask->getTaskId(), kNotifyTitle, kNotifyCompleted,
                                     name.c_str(), nullptr);
    return;
  }
  data[kDataNotification1] = kNotifyCompleted;
  data[kDataNotification2] = name;
}

// Unlike the call above, this one has no null pointer at its end: its message has two arguments.
void TellFailure(const std::string& name, Json::Value& data) {
  const bool is_notified = pTask->getBoolProperty(kPropNotify, false);
  const char* const reason = LumoParseErrorToVeskString(LumoLibGetErr(), 0);
  if (is_notified) {
    pTask->sendNotifyMessageNoEncode(kNotifyApp, pTask->getTaskId(), kNotifyTitle, kNotifyFailed,
                                     name.c_str(), reason);
    return;
  }
  data[kDataNotification1] = kNotifyFailed;
  data[kDataNotification2] = name;
  data[kDataNotification3] = reason;
}

void StoreOutcome(bool succeeded, const std::string& dest, const Json::Value& error_items) {
  pTask->reload();
  Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, __LINE__);
    return;
  }
  pTask->beginUpdate();
  const std::string name = WebUtils::EncodeHtml(dest, false);
  if (succeeded) {
    TellSuccess(name, data);
  } else {
    data[kDataErrors] = error_items;
    TellFailure(name, data);
  }
  pTask->setProperty(kPropData, data);
  // finish closes the update.
  if (!pTask->finish(false)) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, __LINE__);
  }
}

// Gives the vectors' memory back.
template <typename... Vectors>
void Release(Vectors&... vectors) {
  (Vectors().swap(vectors), ...);
}

}  // namespace

void ZantroCompressHandler::RunWorker(StartParameters& start, _tag_CompressInfo_& info) noexcept {
  std::signal(SIGTERM, EndProcessGroup);
  bool succeeded = false;
  // An exception out of a step, such as a request value that is no text, fails the job; it must not
  // reach the host's frames.
  try {
    WaitForTaskDataReady(pTask, kPropData, kDataWaitSeconds);
    // An archive of itself is taken for done, as clients expect that ask for one.
    const bool is_itself =
        start.source_paths.size() == 1 && start.source_paths.front() == start.dest;
    succeeded = is_itself || RunPipeline(start, info);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s:%d Unexpected failure: %s", kLogSource, __LINE__, error.what());
    SetErrItem(start.dest, KAVO::kErrGeneral);
  } catch (...) {
    syslog(LOG_ERR, "%s:%d Unexpected failure", kLogSource, __LINE__);
    SetErrItem(start.dest, KAVO::kErrGeneral);
  }
  try {
    StoreOutcome(succeeded, start.dest, error_items);
  } catch (...) {
    syslog(LOG_ERR, "%s:%d Failed to store the outcome", kLogSource, __LINE__);
  }
  try {
    CleanTimeOutTasks(request->GetLoginUserName().c_str());
  } catch (...) {
    syslog(LOG_ERR, "%s:%d Failed to clean tasks", kLogSource, __LINE__);
  }
  _exit(0);
}

bool ZantroCompressHandler::RunPipeline(StartParameters& start, _tag_CompressInfo_& info) {
  const std::string session_id = request->GetSessionID();
  if (LumoLibUGIDSet(session_id.c_str(), login_user.c_str()) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to set UGID for user=%s, sid=%s", kLogSource, __LINE__,
           login_user.c_str(), session_id.c_str());
    SetErrItem(start.dest, LumoLibGetErr());
    return false;
  }
  info.src_paths = std::move(start.source_paths);
  if (GeneratePathInfo(info) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to generate path info", kLogSource, __LINE__);
    return false;
  }
  if (CheckDestPriv(start.dest.c_str(), login_user.c_str(), session_id.c_str()) == 0) {
    syslog(LOG_ERR, "%s:%d Extract destination privilege not enough", kLogSource, __LINE__);
    return false;
  }
  if (CheckSourcePrivilege(info) == 0) {
    syslog(LOG_ERR, "%s:%d Can't access source files", kLogSource, __LINE__);
    return false;
  }
  std::optional<TermHeldBack> held_back(std::in_place);
  if (!SaveZipFileListToTmp(info)) {
    syslog(LOG_ERR, "%s:%d Failed to get ziplist", kLogSource, __LINE__);
    return false;
  }
  ListFile list_file(info.list_file);
  held_back.reset();
  // Once they are listed nothing asks for the sources any more, and the archiver may run for hours.
  Release(info.path_infos, info.src_paths, info.src_names, info.src_dirs);
  info.dest_path = start.dest;
  info.codepage = start.codepage;
  LumoGetZipInfo(info);
  const bool succeeded = LumoCompressFiles(info, login_user.c_str());
  list_file.Remove();
  if (!succeeded) {
    syslog(LOG_ERR, "%s:%d Failed to compress file %s", kLogSource, __LINE__, start.dest.c_str());
  }
  return succeeded;
}

}  // namespace Zantro
