// "serve": the device over HTTP.
#include "device/cli/commands.h"
#include "device/host/web_host.h"
#include "device/model/device.h"

namespace Device {

int ServeCommand(const std::string& folder, const std::string& listen) {
  const FrontEndFiles files;
  Open(folder);
  WebHost host(files, listen);
  return host.Run() ? kExitDone : kExitUsage;
}

}  // namespace Device
