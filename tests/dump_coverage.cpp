// In the coverage build only: whoever ends a process of the module by _exit calls this first.
extern "C" {
void __gcov_dump();  // NOLINT: the compiler's name
void KavoDumpCoverage() { __gcov_dump(); }
}
