// The task record: what "start", the worker, "status" and "stop" share through the task manager.
#pragma once

#include <cstdint>
#include <string>

namespace Zantro {

inline constexpr char kTaskIdPrefix[] = "Zantro_";
inline constexpr char kTaskKind[] = "compress";

// Properties of the task. "progress" is the integer 0 at first, then a fraction up to 1. "blMsg",
// set by the platform, asks for a desktop notification at the end.
inline constexpr char kPropProgress[] = "progress";
inline constexpr char kPropData[] = "data";
inline constexpr char kPropNotify[] = "blMsg";

// Keys of "data". One more key is the task's own id: the file manager's background-task info.
inline constexpr char kDataApi[] = "api";
inline constexpr char kDataMethod[] = "method";
inline constexpr char kDataVersion[] = "version";
inline constexpr char kDataTaskId[] = "taskid";
inline constexpr char kDataPid[] = "pid";
inline constexpr char kDataParams[] = "params";
inline constexpr char kDataFile[] = "file";
inline constexpr char kDataTotalSize[] = "total_size";  // bytes, unsigned 64 bits
inline constexpr char kDataErrors[] = "errors";         // array of {"path", "code"}
inline constexpr char kDataNotification1[] = "notification_arg1";
inline constexpr char kDataNotification2[] = "notification_arg2";
inline constexpr char kDataNotification3[] = "notification_arg3";

// Request parameters; those of "start" are stored under "params" by the same names.
inline constexpr char kParamPath[] = "path";
inline constexpr char kParamDest[] = "dest_file_path";
inline constexpr char kParamLevel[] = "level";
inline constexpr char kParamMode[] = "mode";
inline constexpr char kParamFormat[] = "format";
inline constexpr char kParamPassword[] = "password";
inline constexpr char kParamCodepage[] = "codepage";
inline constexpr char kParamTaskId[] = "taskid";

// How long the worker waits for "data", and "stop" for the worker's process id in it.
inline constexpr int kDataWaitSeconds = 60;

// Stores the file (as ParseArchiverLine has it, which is no name), the progress (0 to 1) and the
// total size in bytes in the present task. A task that cannot be read or stored is logged and
// nothing more: the archiver goes on.
void WriteTaskProgress(const std::string& file, float progress, std::uint64_t total_size);

}  // namespace Zantro
