// The handler of the web API "KAVO.Zantro.Compress": packs files and folders of shared folders into
// one archive, in a background worker. One file for each method and for each step of the worker.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <cstdio>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "compress/archiver_output.h"
#include "compress/compress_info.h"
#include "platform/kavo/settings.h"
#include "platform/vesk/task_manager.h"
#include "webapi/lumo_webapi.h"

// The background task that the present call works on; null until a method sets it. Owned by the
// handler from then on. The host can see it, so it stands outside the namespace.
extern "C" Vesk::Task* pTask;

namespace Zantro {

// Names this module in its log lines, whichever of its files writes them: find a line by its text,
// the number alone may stand in several files.
inline constexpr char kLogSource[] = "KAVO.Zantro.Compress";

// What "start" has made of the request before it forks; the worker inherits it.
struct StartParameters {
  std::string dest;                       // user path of the archive, without slashes at its end
  std::string codepage;                   // may be empty
  std::vector<std::string> source_paths;  // at least one
};

class ZantroCompressHandler final : public FileWebAPI {
 public:
  ZantroCompressHandler(KAVO::APIRequest* api_request, KAVO::APIResponse* api_response);
  // Frees the task object behind pTask and leaves the pointer as it is, deliberately: the next
  // request sets it anew.
  ~ZantroCompressHandler();

  // The text quoted for a shell; empty, and a line logged, when that fails. The archiver is started
  // without a shell and needs no quoting: kept for whoever does.
  static std::string LumoEscape(const char* text);

 protected:
  void Process() override;

 private:
  // The methods. Each records its outcome.
  void LumoCompressHandler();  // "start", start.cpp
  void LumoProgressHandler();  // "status", status.cpp
  void LumoCancelHandler();    // "stop", stop.cpp

  // Parts of "start". Those that return bool record the error before they return false.
  bool ReadStartParameters(KavoSettings& settings, StartParameters& start);
  std::string SettleCodepage(KavoSettings& settings) const;
  bool ReadDestination(StartParameters& start);
  Json::Value ExplodeParam(const char* name, const Json::Value& fallback) const;
  bool CreateTask(Vesk::TaskMgr& task_manager);
  Json::Value MakeTaskData(pid_t worker) const;
  void StoreNewTask(pid_t worker);

  // Part of "status": records the answer and returns the task's data, null when there is none. The
  // manager is the caller's, as it has to outlive the removal of the task.
  Json::Value ReportProgress(std::optional<Vesk::TaskMgr>& task_manager);
  // Part of "stop": ends the worker of the present task, or records why it could not.
  void KillWorker();

  // The worker, worker.cpp. Lets no exception out and ends the process.
  [[noreturn]] void RunWorker(StartParameters& start, _tag_CompressInfo_& info) noexcept;
  bool RunJob(StartParameters& start, _tag_CompressInfo_& info) noexcept;
  bool RunPipeline(StartParameters& start, _tag_CompressInfo_& info);
  void StoreOutcome(bool succeeded, const std::string& dest);

  // The worker's steps. Zero or false means failed: the step has recorded its error items and
  // logged its lines, as far as it has any.
  int GeneratePathInfo(_tag_CompressInfo_& info);                                 // path_info.cpp
  int CheckDestPriv(const char* dest, const char* user, const char* session_id);  // privileges.cpp
  int CheckSourcePrivilege(const _tag_CompressInfo_& info);                       // privileges.cpp
  bool SaveZipFileListToTmp(_tag_CompressInfo_& info);                            // staging.cpp
  void LumoGetZipInfo(_tag_CompressInfo_& info);                             // archive_options.cpp
  bool LumoCompressFiles(const _tag_CompressInfo_& info, const char* user);  // archiver.cpp

  // Parts of the destination check: the shared folder's privilege, then the directory and the name.
  bool CheckDestShare(const char* dest, const char* user, const char* session_id);
  bool CheckDestDirectory(const char* dest, const std::string& full_path);
  // Part of the source check: false when the source counts as failed.
  bool CheckSource(const PathInfo& source, std::map<std::string, bool>& checked_shares);
  // Records the item, unless the code is 0.
  void SetSourceErrItem(const PathInfo& source, int code);

  // The two ways to stage the list: relative to a common parent, which ends in "/", or through a
  // directory of links when there are several shared folders.
  bool GenerateZipList(_tag_CompressInfo_& info, const std::string& parent);
  bool GenerateZipListWithShare(_tag_CompressInfo_& info);
  // Parts of the two. `list_file` is a template of mkstemp's and is filled in.
  bool WriteList(const _tag_CompressInfo_& info, const std::string& parent, char* list_file);
  bool FillStagingDirectory(const _tag_CompressInfo_& info, const char* directory, char* list_file);
  bool LinkShare(const PathInfo& source);
  void RefuseSource(const PathInfo& source);

  // Parts of the archiver run. False when the run failed.
  bool PrepareArchiver(const _tag_CompressInfo_& info, const char* user, char* archive_path);
  bool FollowArchiver(const _tag_CompressInfo_& info, FILE* output);
  void RecordArchiverError(ArchiverError error, const char* line, const std::string& dest_path);
  void SetArchiveMode(const char* archive_path) const;
  void SetArchiveOwner(const char* archive_path, const char* user, const std::string& dest_path);

  // Appends {"path", "code"} to the job's error items. Decides nothing.
  void SetErrItem(const std::string& path, int code);

  std::string login_user;
  Json::Value error_items;
};

}  // namespace Zantro
