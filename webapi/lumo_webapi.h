// The base of every web API handler of the file manager: one object serves one request. It takes on
// the signed-in user's identity, lets the derived handler do its work and hands exactly one
// outcome, an error code with a JSON value, to the host.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>

#include "platform/kavo/api_host.h"

namespace Zantro {

// Changes the process's file-creation mask for as long as it lives, and in Run the process's user
// and group identity for good, so one thread uses it in a process of its own.
class FileWebAPI {
 public:
  // Neither object is owned; both outlive the handler.
  FileWebAPI(KAVO::APIRequest* api_request, KAVO::APIResponse* api_response);
  FileWebAPI(const FileWebAPI&) = delete;
  FileWebAPI& operator=(const FileWebAPI&) = delete;

  // Serves the request: identity, Process, outcome to the host. An identity that cannot be taken on
  // is an outcome too, without Process. An exception out of Process passes through; the host then
  // gets no outcome.
  virtual void Run();

  int GetError() const { return error_code; }

 protected:
  // Not virtual, for the host's sake, which knows the two slots alone: a handler is destroyed under
  // its own type, never through its base.
  ~FileWebAPI();

  // Does the request's work and records its outcome with the operations below; what is recorded
  // last counts. Recording nothing means code 0 without data.
  virtual void Process() = 0;

  // Records success with its data.
  void SetResponse(const Json::Value& data);
  // Records a failure: a web API error code and its details.
  void SetError(int code, const Json::Value& details);
  void SetError(int code);
  // Records a failure whose details are an array of one item, the file at fault and its own code.
  void SetFileError(int code, const std::string& path, int item_code);
  // Fills `item` with "code" and "path".
  static void ParseFileError(const std::string& path, int code, Json::Value& item);
  // The web API error code for a system error number; the texts may be null.
  static int ParseErrnoToError(int error_number, const char* source, const char* destination);

  // Hands the recorded outcome to the host, success (code 0) by the same operation as failure.
  void OutputResponse();

  std::uint32_t saved_umask = 0;
  std::int32_t error_code = 0;
  Json::Value response_data;
  KAVO::APIRequest* request;
  KAVO::APIResponse* response;
};

}  // namespace Zantro
