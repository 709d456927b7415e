// The calls of the platform's core library that this library uses, declared exactly as it uses
// them. On the NAS libkelocore provides them; elsewhere kelocore.cpp stands in.

#ifndef KELODRCORE_PLATFORM_KELOCORE_H_
#define KELODRCORE_PLATFORM_KELOCORE_H_

#include <cstdio>

extern "C" {

// Programs are run without a shell, with a fixed environment of PATH and LC_ALL only.

// Runs `program` with up to four arguments (a null one ends the list), its standard streams on
// /dev/null, and waits for it, restarting after signals. 0 only when it exited with status 0. Works
// when the caller ignores SIGCHLD, and leaks no descriptor into the child.
int KLIBCExec(const char* program, const char* a1, const char* a2, const char* a3, const char* a4);

// Starts `program` with the given arguments (a null pointer ends the list), its standard output
// ("r") or input ("w") on the stream. Null when the program cannot be started.
FILE* KLIBCPopen(const char* program, const char* mode, ... /* NULL */);

// Closes a stream of KLIBCPopen and waits for its program; the wait status, or -1.
int KLIBCPclose(FILE* stream);

// Trims `text` in place, at both ends, of the characters in `set` (null: blank, tab, newline,
// carriage return, vertical tab, form feed). Returns `text`.
char* KLIBCStrTrim(char* text, const char* set, ... /* NULL */);

// 1 when `path` exists, else 0.
int KLIBCFileExist(const char* path);

// 1 when `path` is a directory, else 0.
int KLIBCFileCheckDir(const char* path);

// The pid in the pid file; 0 when the file is absent, unreadable or not a pid, or when the process
// that wrote it is gone and its pid is another's now.
int KLIBCReadPidFile(const char* path);

// 1 while the process runs, whoever owns it; a zombie is dead.
int KLIBCProcAlive(int pid);

// Writes the caller's pid, and on a second line the start time of its process, to `path`; 0 on
// success.
int KLIBCProcPidFileCreate(const char* path);

// Like fork. Flag 1: the child is nobody's zombie (re-parented at once, nothing to wait for).
// Flag 64: new session, standard streams on /dev/null. Negative with errno on failure, also when
// the second fork of a detached child fails.
int KLIBCProcForkEx(int flags);

}  // extern "C"

#endif  // KELODRCORE_PLATFORM_KELOCORE_H_
