// Whether the tests run under an emulator of user programs, and what they make of it.
#pragma once

#include <filesystem>

// The emulator shows a program itself as /proc/self/exe; here the kernel answers for it.
inline const bool kIsEmulated = std::filesystem::read_symlink("/proc/thread-self/exe") !=
                                std::filesystem::read_symlink("/proc/self/exe");

// How many times longer than usual things may take.
inline const int kSlowness = kIsEmulated ? 5 : 1;
