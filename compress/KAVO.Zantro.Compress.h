// The handler of the web API "KAVO.Zantro.Compress": packs files and folders of shared folders into
// one archive, in a background worker. One file for each method and for each step of the worker.
#pragma once

#include <json/json.h>

#include <string>

#include "compress/compress_info.h"
#include "platform/vesk/task_manager.h"
#include "webapi/lumo_webapi.h"

// The background task that the present call works on; null until a method sets it. Owned by the
// handler from then on. The host can see it, so it stands outside the namespace.
extern "C" Vesk::Task* pTask;

namespace Zantro {

// Names this module in its log lines, whichever of its files writes them: find a line by its text,
// the number alone may stand in several files.
inline constexpr char kLogSource[] = "KAVO.Zantro.Compress";

class ZantroCompressHandler final : public FileWebAPI {
 public:
  ZantroCompressHandler(KAVO::APIRequest* api_request, KAVO::APIResponse* api_response);
  // Frees the task object behind pTask and leaves the pointer as it is, for the host to see: the
  // next request sets it anew.
  ~ZantroCompressHandler();

  // Appends {"path", "code"} to the job's error items. Decides nothing.
  void SetErrItem(const std::string& path, int code);

  // The text quoted for a shell; empty, and a line logged, when that fails. Part of the handler's
  // interface; nothing here needs it, as the archiver runs without a shell.
  static std::string LumoEscape(const char* text);

 protected:
  void Process() override;

 private:
  // The methods. Each records its outcome.
  void LumoCompressHandler();  // "start", start.cpp
  void LumoProgressHandler();  // "status", status.cpp
  void LumoCancelHandler();    // "stop", stop.cpp

  // The worker, worker.cpp. Lets no exception out and ends the process.
  [[noreturn]] void RunWorker(StartParameters& start, _tag_CompressInfo_& info) noexcept;
  bool RunPipeline(StartParameters& start, _tag_CompressInfo_& info);

  // The worker's steps. Zero or false means failed: the step has recorded its error items and
  // logged its lines, as far as it has any.
  int GeneratePathInfo(_tag_CompressInfo_& info);                                 // path_info.cpp
  int CheckDestPriv(const char* dest, const char* user, const char* session_id);  // privileges.cpp
  int CheckSourcePrivilege(const _tag_CompressInfo_& info);                       // privileges.cpp
  bool SaveZipFileListToTmp(_tag_CompressInfo_& info);                            // staging.cpp
  // Its two ways: relative to a common parent, which ends in "/", or through a directory of links
  // when there are several shared folders.
  bool GenerateZipList(_tag_CompressInfo_& info, const std::string& parent);
  bool GenerateZipListWithShare(_tag_CompressInfo_& info);
  void LumoGetZipInfo(_tag_CompressInfo_& info);                             // archive_options.cpp
  bool LumoCompressFiles(const _tag_CompressInfo_& info, const char* user);  // archiver.cpp

  std::string login_user;
  Json::Value error_items;
};

}  // namespace Zantro
