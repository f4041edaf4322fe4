// The HTTP statuses that the device answers with.
#ifndef DEVICE_HOST_HTTP_STATUS_H_
#define DEVICE_HOST_HTTP_STATUS_H_

namespace Device {

enum HttpStatus : int {
  kHttpOk = 200,
  kHttpNoContent = 204,
  kHttpBadRequest = 400,
  kHttpUnauthorized = 401,
  kHttpForbidden = 403,
  kHttpNotFound = 404,
  kHttpTooLarge = 413,
  kHttpNotDecoded = 415,
  kHttpTooMany = 429,
  kHttpInternal = 500,
  kHttpUnavailable = 503
};

}  // namespace Device

#endif  // DEVICE_HOST_HTTP_STATUS_H_
