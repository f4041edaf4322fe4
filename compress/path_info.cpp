// Worker step: resolves every source of the request.
#include <syslog.h>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/split_path.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

int ZantroCompressHandler::GeneratePathInfo(_tag_CompressInfo_& info) {
  int resolved = 1;
  PathInfo path_info;  // overwritten from source to source, not cleared
  info.path_infos.reserve(info.src_paths.size());
  info.src_names.reserve(info.src_paths.size());
  info.src_dirs.reserve(info.src_paths.size());
  for (const std::string& source : info.src_paths) {
    resolved = PathInfoFactory::create(login_user.c_str(), source, path_info);
    if (resolved == 0) {
      syslog(LOG_ERR, "%s:%d Failed to get path info:%s, reason=[%X]", kLogSource, __LINE__,
             source.c_str(), static_cast<unsigned int>(LumoLibGetErr()));
      SetErrItem(source, LumoLibGetErr());
      return 0;
    }
    const SplitPath split(path_info.real_path);
    info.src_names.emplace_back(split.Name());
    info.src_dirs.push_back(std::string(split.Directory()) + "/");
    info.path_infos.push_back(path_info);
  }
  return resolved;
}

}  // namespace Zantro
