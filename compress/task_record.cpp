#include "compress/task_record.h"

#include <json/json.h>
#include <malloc.h>
#include <syslog.h>

#include "compress/KAVO.Zantro.Compress.h"

namespace Zantro {

namespace {

void StoreProgress(const std::string& file, float progress, std::uint64_t total_size) {
  pTask->reload();
  Json::Value data = pTask->getProperty(kPropData);
  if (data.isNull() || !data.isObject()) {
    syslog(LOG_ERR, "%s:%d Failed to get task data", kLogSource, __LINE__);
    return;
  }
  data[kDataFile] = file;
  data[kDataTotalSize] = Json::UInt64{total_size};
  if (SaveTaskData(pTask, data, progress) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to save task data", kLogSource, __LINE__);
  }
}

}  // namespace

void WriteTaskProgress(const std::string& file, float progress, std::uint64_t total_size) {
  StoreProgress(file, progress, total_size);
  // The data of a job of many sources is large, and it may be long until the next progress.
  malloc_trim(0);
}

}  // namespace Zantro
