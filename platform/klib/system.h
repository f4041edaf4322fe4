// The system library of the platform: processes, groups, file attributes, the file index.
//
// Its error channel: an operation that fails says so in its result and leaves an error number with
// the place where it arose for KLIBCErrGet, KLIBCErrorGetFile and KLIBCErrorGetLine.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdio>

extern "C" {

// The library's last error number in this process and the source file and line that set it. The
// text has static storage and is never null.
int KLIBCErrGet();
const char* KLIBCErrorGetFile();
int KLIBCErrorGetLine();

// Like fork: negative on failure, 0 in the child, the child's process id in the parent. The child
// is the leader of a process group of its own: a worker that is told to end signals its whole
// group.
pid_t KLIBCProcFork();

// Starts a program with the null-terminated argument vector, no shell between, and returns a stream
// that reads its standard output (mode "r"). The flag is 0. Null when it cannot be started. The
// stream is closed with KLIBCPclose alone, which waits for the program and returns its wait status,
// or -1.
FILE* KLIBCPopenv(const char* program, const char* mode, char* const argv[], int flag);
int KLIBCPclose(FILE* stream);

// Runs a program with the arguments that follow (const char*, ended by a null pointer; the
// program's own name is put before them) as the flag word says; 187 means run it and wait for its
// end. Its exit status, or -1.
int KLIBCExecl(const char* program, unsigned int flags, ...);

// Quotes a text for a shell into the buffer, terminating zero included. The length of the quoted
// text, negative when it does not fit or there is none.
int KLIBCEncShParam(const char* text, char* buffer, size_t size);

// 1 when the user is in the administrators' group, 0 when not, -1 on failure. The second argument
// is 0.
int KLIBGroupIsAdminGroupMem(const char* user, int reserved);

// Enters a file (full path) in the device's file index. The second argument, 1, means a single
// file. Negative on failure.
int KLIBKavoIndexAdd(const char* path, int scope);

// Sets the mode bits of a file (full path), keeping its access list; -1 as the second argument
// means by path, not by descriptor. Negative on failure, the reason then in errno.
int KAVOFSAclChmod(const char* path, int descriptor, mode_t mode);

}  // extern "C"
