#pragma once

#include "device/archiver/cancel.h"
#include "device/archiver/command_line.h"
#include "device/archiver/report.h"
#include "device/base/archiver_call.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

// Packs what the request names and puts the archive in its place; returns it, opened as a path.
// What others do to names meanwhile can fail the job, and lead it nowhere else: everything is held
// by descriptor, and 7z reaches only the sources and its work folder. Throws Failure or Cancelled,
// with the old archive, if any, as it was.
Device::FileDescriptor PackArchive(const Request& request, const Device::ArchiverCall& call,
                                   const Cancel& cancel, Report& report);

}  // namespace Archiver
