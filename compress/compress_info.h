// The record of one compress job: what the worker's steps learn about the request, passed by
// reference from step to step. Each step fills the fields it owns and reads those of earlier steps.
#pragma once

#include <string>
#include <vector>

#include "platform/lumo/file_manager.h"

namespace Zantro {

// What "start" has made of the request before it forks; the worker inherits it.
struct StartParameters {
  std::string dest;                       // user path of the archive, without slashes at its end
  std::string codepage;                   // may be empty
  std::vector<std::string> source_paths;  // at least one
};

struct _tag_CompressInfo_ {    // NOLINT: the device's name
  bool is7z;                   // format "7z", otherwise zip; set by archive_options, not before
  std::string dest_file_path;  // the request's "dest_file_path" as text, unchanged
  std::string command;         // the archiver's command letter, "a" or "u"; empty without "mode"
  std::string update_switch;   // the archiver's update switch for "mode"; may be empty
  std::string level_switch;    // "-mx0" to "-mx9"; empty without "level"
  std::string password;        // empty: none
  std::string dest_path;       // user path of the archive; empty until staging is done
  std::string list_file;       // the file that lists the entries; empty until staging made one
  std::string work_dir;        // the directory that the archiver runs in
  std::vector<PathInfo> path_infos;    // one per resolved source, in the order of src_paths
  std::vector<std::string> src_paths;  // the request's sources as given
  std::vector<std::string> src_names;  // base name of the full path, one per path_infos
  std::vector<std::string> src_dirs;   // its parent, ending in "/", one per path_infos
  std::string codepage;                // for names in a zip; may be empty
};

}  // namespace Zantro
