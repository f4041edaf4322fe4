#pragma once

#include <string>

#include "device/archiver/command_line.h"
#include "device/archiver/report.h"
#include "device/archiver/target.h"
#include "device/base/archiver_call.h"
#include "device/base/child_process.h"
#include "device/base/fence.h"
#include "device/base/file_descriptor.h"
#include "device/base/work_folder.h"

namespace Archiver {

// A job while it runs: what it holds, and what the programs that it starts may reach.
struct Job {
  // Opens the target and makes the work folder, and allows these. The references must outlive the
  // job. Throws Failure.
  Job(const Request& asked, const Device::ArchiverCall& call, Report& lines);

  // The new archive and the old one, as the programs know them.
  std::string Result() const;
  std::string Old() const;

  const Request& request;
  Report& report;
  const Target target;
  const Device::WorkFolder work;
  const int zip_program;
  const int link_free;
  Device::Fence fence;
};

// A program of the job's, as far as all are alike: in the work folder, with both archives open, and
// fenced.
Device::ProgramStart ProgramOf(const Job& job);

// An unnamed file that holds the text, positioned at its start. Throws Failure.
Device::FileDescriptor UnnamedFile(const std::string& text);

// A standard input for 7z that answers its questions for the password; invalid when there is none.
// A pipe: a file could be packed, by a link to /proc/self/fd/0 that somebody puts among the
// sources. Throws Failure.
Device::FileDescriptor PasswordInput(const Request& request);

}  // namespace Archiver
