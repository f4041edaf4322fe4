#pragma once

#include "device/archiver/cancel.h"
#include "device/archiver/command_line.h"
#include "device/archiver/report.h"

namespace Archiver {

// Packs what the request names and puts the archive in its place. Throws Failure or Cancelled, with
// the old archive, if any, as it was.
void PackArchive(const Request& request, const Cancel& cancel, Report& report);

}  // namespace Archiver
