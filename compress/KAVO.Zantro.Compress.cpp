#include "compress/KAVO.Zantro.Compress.h"

#include "platform/kavo/error_codes.h"

Vesk::Task* pTask = nullptr;

namespace Zantro {

ZantroCompressHandler::ZantroCompressHandler(KAVO::APIRequest* api_request,
                                             KAVO::APIResponse* api_response)
    : FileWebAPI(api_request, api_response), error_items(Json::arrayValue) {}

ZantroCompressHandler::~ZantroCompressHandler() { delete pTask; }

void ZantroCompressHandler::Process() {
  const std::string method = request->GetAPIMethod();
  login_user = request->GetLoginUserName();
  if (method == "start") {
    LumoCompressHandler();
  } else if (method == "status") {
    LumoProgressHandler();
  } else if (method == "stop") {
    LumoCancelHandler();
  } else {
    SetError(KAVO::kErrBadParameter);
  }
}

void ZantroCompressHandler::SetErrItem(const std::string& path, int code) {
  Json::Value item(Json::objectValue);
  item["path"] = path;
  item["code"] = code;
  error_items.append(item);
}

}  // namespace Zantro
