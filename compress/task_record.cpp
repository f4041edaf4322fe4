#include "compress/task_record.h"

#include <json/json.h>
#include <syslog.h>

#include "compress/KAVO.Zantro.Compress.h"

namespace Zantro {

void WriteTaskProgress(const std::string& file, float progress, std::uint64_t total_size) {
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

}  // namespace Zantro
