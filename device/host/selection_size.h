// How much there is to pack.
#pragma once

#include <json/json.h>

#include <string>

#include "device/host/user_file.h"

namespace Device {

// Counts what lies under the paths, as an archive of them would have it: {"files", "folders",
// "bytes", "complete"}. Links are not followed, and count as files without bytes. Not complete when
// patience ended before, or something could not be looked at. To be called with the user's
// identity.
Json::Value SizeOf(const std::string& user, const Json::Value& paths, const Patience& patience);

}  // namespace Device
