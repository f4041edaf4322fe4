// Standard output, so that nobody takes for printed what was not.
#pragma once

namespace Device {

// From now on std::cout writes when it is flushed, and the reason of its first failure is kept.
void WatchOutput();

// To be called at the end: flushes std::cout, and is true when all that was printed is written.
// When it is not, prints the reason; but when the reader has gone, ends the process by SIGPIPE.
bool FinishOutput();

}  // namespace Device
