// Worker step: turns the request's options into the archiver's command letter and switches. Values
// are mapped, never refused; one that is no text throws out of its conversion.
#include "compress/KAVO.Zantro.Compress.h"
#include "compress/task_record.h"

namespace Zantro {

namespace {

constexpr char kFormat7z[] = "7z";

// The update switches use the archiver's own syntax: a state letter (q: only in the archive, r:
// only on disk, y: older in the archive, z: unchanged, ...) and what becomes of it (0 ignore, 1
// keep the archive's copy, 2 compress from disk).
struct ModeRow {
  const char* mode;
  const char* command;
  const char* update_switch;
};
constexpr ModeRow kModes[] = {
    {"update", "u", ""},
    {"freshen", "u", "-up1q1r0x1y2z1w2"},
    {"synchroize", "u", "-up1q0r2x1y2z1w2"},  // clients spell it so
};
constexpr ModeRow kOtherMode = {"", "a", ""};

struct LevelRow {
  const char* level;
  const char* level_switch;
};
constexpr LevelRow kLevels[] = {{"store", "-mx0"}, {"fastest", "-mx3"}, {"best", "-mx9"}};
constexpr char kOtherLevelSwitch[] = "-mx6";

const ModeRow& FindMode(const std::string& mode) {
  for (const ModeRow& row : kModes) {
    if (mode == row.mode) {
      return row;
    }
  }
  return kOtherMode;
}

const char* FindLevelSwitch(const std::string& level) {
  for (const LevelRow& row : kLevels) {
    if (level == row.level) {
      return row.level_switch;
    }
  }
  return kOtherLevelSwitch;
}

}  // namespace

void ZantroCompressHandler::LumoGetZipInfo(_tag_CompressInfo_& info) {
  info.is7z = request->GetParam(kParamFormat, "").asString() == kFormat7z;
  info.dest_file_path = request->GetParam(kParamDest, Json::Value()).asString();
  info.password.clear();
  info.level_switch.clear();
  info.command.clear();
  if (request->HasParam(kParamMode)) {
    const ModeRow& row = FindMode(request->GetParam(kParamMode, "").asString());
    info.command = row.command;
    info.update_switch = row.update_switch;
  }
  if (request->HasParam(kParamLevel)) {
    info.level_switch = FindLevelSwitch(request->GetParam(kParamLevel, "").asString());
  }
  if (request->HasParam(kParamPassword)) {
    info.password = request->GetParam(kParamPassword, "").asString();
  }
}

}  // namespace Zantro
