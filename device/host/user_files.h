// What is asked about a user's files. To be called with the user's identity, by which the kernel
// decides; no link is followed. All throw Refused.
#pragma once

#include <json/json.h>
#include <sys/stat.h>

#include <string>

#include "device/host/user_path.h"

namespace Device {

// Lists a folder, "/" for the shared folders, in JSON: {"entries": [{"kind", "modified", "name",
// "size"}], "path", "writable"}.
std::string ListFolder(const std::string& user, const std::string& path);
// Appends such an entry.
void AddEntry(std::string& entries, const std::string& name, const struct stat& status);

// Answers on the stream with what HTTP says of a regular file, then with a message, the file's
// descriptor and the user's name: it is the front end that sends it, and takes its time.
void SendFile(int stream, const std::string& user, const std::string& path);

// Lists a zip or 7z as 7z does, which is fenced and has the request's memory at the most:
// {"format", "entries", as above, "count", "size", "complete", "encrypted"}. Not complete beyond
// 10,000 entries, when patience ended before, or where the archive is damaged.
std::string ListArchive(const std::string& user, const std::string& path, const Patience& patience);

// Counts what lies under the paths, as an archive of them would have it: {"files", "folders",
// "bytes", "complete"}. Links count as files without bytes. Not complete when patience ended
// before, or something could not be looked at.
Json::Value SizeOf(const std::string& user, const Json::Value& paths, const Patience& patience);

// Asks about an archive's destination what "start" and the worker would ask: {"exists", "error",
// "field"}, of an archive that stands there "size" and "modified", and where nothing is wrong
// "free_name", a name that no file of the folder has.
Json::Value CheckDestination(const std::string& user, const std::string& session_id,
                             const std::string& path);

}  // namespace Device
