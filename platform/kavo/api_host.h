// The web API host: the decoded request it hands to a module and the response it takes back.
// All texts are UTF-8 unless the client sent other bytes; the host passes those on unchanged.
#pragma once

#include <json/json.h>

#include <string>

namespace KAVO {

// One decoded request. Owned by the host and valid for one call of a table row's handler; a
// process forked during the call has its own copy. Nothing here fails.
class APIRequest {
 public:
  struct State;

  // True if the request carries the parameter, whatever its value.
  bool HasParam(const std::string& name) const;
  // The parameter's value as it was sent, or `fallback` when the request does not carry it.
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const;
  // 1, 2 or 3: the row of the API table that was chosen.
  int GetAPIVersion() const;
  // The API's name, such as "KAVO.Zantro.Compress".
  std::string GetAPIClass() const;
  // The method's name, such as "start".
  std::string GetAPIMethod() const;
  // Name of the signed-in user.
  std::string GetLoginUserName() const;
  // The session id under which that user signed in; empty when there is none.
  std::string GetSessionID() const;

  State* state;  // the host's own; no module looks inside
};

// Takes the outcome of the call. Owned by the host, valid like the request.
class APIResponse {
 public:
  struct State;

  // Records the outcome: code 0 with the response data, or an error code with its details. The
  // last call before the handler returns counts.
  void SetError(int code, const Json::Value& data);

  State* state;  // the host's own; no module looks inside
};

}  // namespace KAVO
