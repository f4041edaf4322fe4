#pragma once

#include <string>

#include "device/archiver/cancel.h"
#include "device/archiver/code_page.h"

namespace Archiver {

// In a zip, a name is UTF-8 when its entry is flagged so, and in some code page otherwise. These
// change names and flags only, keep everything else of an entry, and rewrite the archive only when
// there is something to change. A name that cannot be converted, or whose converted form another
// entry bears, stays as it is.

// Whether the archive has names which NamesToUtf8 would change.
bool HasNamesIn(const CodePage& page, const std::string& archive);
void NamesToUtf8(const CodePage& page, const std::string& archive, const Cancel& cancel);
void NamesToCodePage(const CodePage& page, const std::string& archive, const Cancel& cancel);

}  // namespace Archiver
