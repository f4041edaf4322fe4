#include "webapi/lumo_webapi.h"

#include <syslog.h>

#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {
constexpr char kLogSource[] = "lumo_webapi";
}  // namespace

FileWebAPI::FileWebAPI(KAVO::APIRequest* api_request, KAVO::APIResponse* api_response)
    : request(api_request), response(api_response) {
  saved_umask = LumoLibUmask();
}

FileWebAPI::~FileWebAPI() { LumoLibRestoreUmask(saved_umask); }

void FileWebAPI::Run() {
  const std::string user = request->GetLoginUserName();
  if (LumoLibUGIDSet(nullptr, user.c_str()) < 0) {
    SetError(LumoLibGetErr());
    syslog(LOG_ERR, "%s:%d Failed to set UGID, %m", kLogSource, __LINE__);
    OutputResponse();
    return;
  }
  Process();
  OutputResponse();
}

void FileWebAPI::SetResponse(const Json::Value& data) {
  response_data = data;
  error_code = 0;
}

void FileWebAPI::SetError(int code, const Json::Value& details) {
  response_data = details;
  error_code = code;
}

void FileWebAPI::SetError(int code) { SetError(code, Json::Value()); }

void FileWebAPI::SetFileError(int code, const std::string& path, int item_code) {
  Json::Value items(Json::arrayValue);
  Json::Value item;
  ParseFileError(path, item_code, item);
  items.append(item);
  SetError(code, items);
}

void FileWebAPI::ParseFileError(const std::string& path, int code, Json::Value& item) {
  item["code"] = code;
  item["path"] = path;
}

int FileWebAPI::ParseErrnoToError(int error_number, const char* source, const char* destination) {
  return LumoParseErrnoToError(error_number, source, destination);
}

void FileWebAPI::OutputResponse() { response->SetError(error_code, response_data); }

}  // namespace Zantro
