#pragma once
// System services of the NAS: users, groups, homes, ACLs, the file index, child processes, and the
// last platform error.

#include <sys/types.h>

#include <cstddef>

// Users and groups by name. Get returns 0 and a record that the matching Free releases, or a
// negative value with the last error set (errors.h: kNoSuchUser, kNoSuchGroup).
struct NUVAUSER {
  char* szName;
  uid_t nUid;
  gid_t nGid;
  char* szHome;
};
struct NUVAGROUP {
  char* szName;
  gid_t nGid;
};
int NUVAUserGet(const char* name, NUVAUSER** out);
void NUVAUserFree(NUVAUSER* user);
int NUVAGroupGet(const char* name, NUVAGROUP** out);
void NUVAGroupFree(NUVAGROUP* group);

// Writes the absolute path of the user's home below the share "homes" into `buffer`. Returns 0, or
// -1 with errno and the last error set: homes are off, the user's folder does not exist, or the
// path does not fit.
int NUVAServiceHomePathGet(const char* user, char* buffer, size_t size);
// Non-zero if user homes are on for this user: there is a share "homes".
int NUVAServiceUserHomeIsEnabled(const char* user, uid_t uid);

// Non-zero if the file at `path` is governed by an ACL beyond its mode bits. `fd` and `flags` are
// reserved (-1 and 2). 0 for a path that does not exist or is empty.
int NUVAACLIsSupport(const char* path, int fd, int flags);

// Non-zero if the share is covered by the file index service.
int FILEIDXIsShareIndexed(const char* share);

// Forks with the platform's bookkeeping: the child is the leader of a session of its own, so that
// a terminal's interrupt does not reach it. Negative on failure, 0 in the child, its id in the
// parent.
pid_t NLIBCProcFork();

// Runs `program` with up to three arguments (null ends them early) under the effective identity
// alone and waits for it. Result folders of the user that it has left empty are then removed, which
// the user cannot do where root made them. The program sees the system's folders read-only; of
// every volume it may write the temporary folder @tmp and nothing else. `flags` is reserved (0).
// Returns its exit status, or -1 when it could not be run confined. Not undone: the calling
// process has only its effective identity from then on.
int NLIBCExec(const char* program, const char* arg1, const char* arg2, const char* arg3, int flags);

// Writes `text` as one shell word into `buffer` (NUL-terminated, `size` bytes in all). Returns 0,
// or -1 if it does not fit.
int NLIBCEncShParam(const char* text, char* buffer, size_t size);

// The last platform error number of this process (errors.h). Set only by failures.
int NLIBCErrGet();
