// Worker step: turns the request's options into the archiver's command letter and switches. Values
// are mapped, never refused; one that is no text throws out of its conversion.
#include <map>
#include <string>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"

namespace Zantro {

namespace {

constexpr char kFormat7z[] = "7z";

// The update switches use the archiver's own syntax: a state letter (q: only in the archive, r:
// only on disk, y: older in the archive, z: unchanged, ...) and what becomes of it (0 ignore, 1
// keep the archive's copy, 2 compress from disk).
struct Mode {
  const char* command;
  const char* update_switch;
};
const std::map<std::string, Mode> kModes = {
    {"update", {"u", ""}},
    {"freshen", {"u", "-up1q1r0x1y2z1w2"}},
    {"synchroize", {"u", "-up1q0r2x1y2z1w2"}},  // clients spell it so
};
constexpr Mode kOtherMode = {"a", ""};

const std::map<std::string, const char*> kLevelSwitches = {
    {"store", "-mx0"}, {"fastest", "-mx3"}, {"best", "-mx9"}};
constexpr char kOtherLevelSwitch[] = "-mx6";

}  // namespace

void ZantroCompressHandler::LumoGetZipInfo(_tag_CompressInfo_& info) {
  info.is7z = request->GetParam(kParamFormat, "").asString() == kFormat7z;
  info.dest_file_path = request->GetParam(kParamDest, Json::Value()).asString();
  info.password.clear();
  info.level_switch.clear();
  info.command.clear();
  if (request->HasParam(kParamMode)) {
    const auto found = kModes.find(request->GetParam(kParamMode, "").asString());
    const Mode& mode = found == kModes.end() ? kOtherMode : found->second;
    info.command = mode.command;
    info.update_switch = mode.update_switch;
  }
  if (request->HasParam(kParamLevel)) {
    const auto found = kLevelSwitches.find(request->GetParam(kParamLevel, "").asString());
    info.level_switch = found == kLevelSwitches.end() ? kOtherLevelSwitch : found->second;
  }
  if (request->HasParam(kParamPassword)) {
    info.password = request->GetParam(kParamPassword, "").asString();
  }
}

}  // namespace Zantro
