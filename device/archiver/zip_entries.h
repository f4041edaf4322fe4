#pragma once

#include <string>

#include "device/base/code_page.h"

namespace Archiver {

// What kavo-zip does. Everything here throws Failure with the reason alone.

// Throws when a member is protected by another password, or by one where none is given: new members
// would lie under another password than the old ones, or in clear beside them.
void CheckMembers(const std::string& archive, const std::string& password);

// In a zip, a name is UTF-8 when its entry is flagged so, and in some code page otherwise. These
// change names and flags only, keep everything else of an entry, and rewrite the archive only when
// there is something to change. A name that cannot be converted, or whose converted form another
// entry bears, stays as it is.

// Whether the archive has names which NamesToUtf8 would change.
bool HasNamesIn(const Device::CodePage& page, const std::string& archive);
void NamesToUtf8(const Device::CodePage& page, const std::string& archive);
void NamesToCodePage(const Device::CodePage& page, const std::string& archive);

}  // namespace Archiver
