// The page's files, read once.
#pragma once

#include <httplib.h>

namespace Web {

// Serves every file of the folder. index.html is "/"; the others lie below a version that changes
// with any of them, under which index.html names them, so that who has them need never ask for them
// again. Throws std::runtime_error that names the file and the reason.
void AddPage(httplib::Server& server, int folder);

}  // namespace Web
