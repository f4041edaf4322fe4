// The HTTP statuses that the device answers with.
#pragma once

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
