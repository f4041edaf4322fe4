// Whether the tests run under an emulator of user programs.
#ifndef TESTS_EMULATION_H_
#define TESTS_EMULATION_H_

#include <filesystem>

// The emulator shows a program itself as /proc/self/exe; here the kernel answers for it.
inline const bool kIsEmulated = std::filesystem::read_symlink("/proc/thread-self/exe") !=
                                std::filesystem::read_symlink("/proc/self/exe");

#endif  // TESTS_EMULATION_H_
