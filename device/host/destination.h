// What can be known about an archive's destination before there is a job.
#pragma once

#include <json/json.h>

#include <string>

namespace Device {

// Asks what "start" and the worker would ask: {"exists", "error", "field"}, of an archive that
// stands there "size" and "modified", and where nothing is wrong "free_name", a name that no file
// of the folder has. To be called with the user's identity.
Json::Value CheckDestination(const std::string& user, const std::string& session_id,
                             const std::string& path);

}  // namespace Device
