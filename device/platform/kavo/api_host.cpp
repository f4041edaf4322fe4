// The request and response objects that a module sees.
#include "device/platform/kavo/request.h"
#include "device/platform/operations.h"

using Device::Operation;

namespace KAVO {

bool APIRequest::HasParam(const std::string& name) const {
  return Operation("KAVO::APIRequest::HasParam", name).Run([&] {
    return state->request.params.isMember(name);
  });
}

Json::Value APIRequest::GetParam(const std::string& name, const Json::Value& fallback) const {
  return Operation("KAVO::APIRequest::GetParam", name, fallback).Run([&] {
    return state->request.params.get(name, fallback);
  });
}

int APIRequest::GetAPIVersion() const {
  return Operation("KAVO::APIRequest::GetAPIVersion").Run([&] { return state->request.version; });
}

std::string APIRequest::GetAPIClass() const {
  return Operation("KAVO::APIRequest::GetAPIClass").Run([&] { return state->request.api; });
}

std::string APIRequest::GetAPIMethod() const {
  return Operation("KAVO::APIRequest::GetAPIMethod").Run([&] { return state->request.method; });
}

std::string APIRequest::GetLoginUserName() const {
  return Operation("KAVO::APIRequest::GetLoginUserName").Run([&] { return state->request.user; });
}

std::string APIRequest::GetSessionID() const {
  return Operation("KAVO::APIRequest::GetSessionID").Run([&] { return state->request.session_id; });
}

void APIResponse::SetError(int code, const Json::Value& data) {
  Operation("KAVO::APIResponse::SetError", code, data).Run([&] { state->outcome = {code, data}; });
}

}  // namespace KAVO
