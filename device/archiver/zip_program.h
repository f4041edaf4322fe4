// kavo-zip, the program that looks at the entries of a zip and changes their names.
//
//     kavo-zip COMMAND ARCHIVE CODE-PAGE      the archive's password, if any, on standard input
//
// It is a program of its own as few jobs need its libraries, which cost time to load, and as it
// reads archives that anybody may have made: it is confined like 7z.
#pragma once

namespace Archiver {

// Whether an archive can be updated: ends with kZipNo when names in it must go to UTF-8 before, and
// fails when members are protected by another password than the one given, or when none is.
inline constexpr char kZipCheck[] = "check";
// Names in the code page become UTF-8, and the other way round.
inline constexpr char kZipToUtf8[] = "to-utf8";
inline constexpr char kZipToCodePage[] = "to-code-page";

inline constexpr int kZipYes = 0;
inline constexpr int kZipFailed = 1;  // the reason stands on standard error
inline constexpr int kZipNo = 2;

}  // namespace Archiver
