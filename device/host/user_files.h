// What is asked about a user's files. To be called with the user's identity, by which the kernel
// decides; no link is followed. What cannot be answered is thrown as Refused.
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

// Answers on the stream about a regular file with its HTTP headers alone, then with a message, the
// user's name with the file's descriptor. The front end sends the content, so that a long download
// needs no process of the user's.
void HandOverFile(int stream, const std::string& user, const std::string& path);

// Lists a zip or 7z as 7z does, which runs fenced and under the limit of memory that the request
// has: {"format", "entries", as above, "count", "size", "complete", "encrypted"}. Not complete
// beyond 10,000 entries, when patience ended before, or where the archive is damaged.
std::string ListArchive(const std::string& user, const std::string& path, const Patience& patience);

// Counts what lies under the paths, as an archive of them would have it: {"files", "folders",
// "bytes", "complete"}. Links count as files without bytes. Not complete when patience ended
// before, or something could not be looked at.
Json::Value SizeOf(const std::string& user, const Json::Value& paths, const Patience& patience);

// Asks about an archive's destination what "start" and the worker would ask: {"exists", "error",
// "field"}, of an archive that stands there "size" and "modified", and where nothing is wrong
// "free_name": the name itself or a numbered one, which nothing in the folder has, if it is short
// enough.
Json::Value CheckDestination(const std::string& user, const std::string& path);

}  // namespace Device
