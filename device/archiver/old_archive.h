#pragma once

#include "device/archiver/job.h"
#include "device/archiver/switches.h"

namespace Archiver {

// Lets the run begin with nothing, with the archive that stands there, or, where names in that have
// to be changed first, with a copy of it. Throws Failure for an archive that cannot be updated: new
// members would lie under another password than the old ones, or in clear beside protected ones.
void PrepareArchive(const Job& job, PackRun& run);

// Puts the new zip's names into the code page that the request names. Throws Failure.
void PutNamesIntoCodePage(const Job& job);

}  // namespace Archiver
