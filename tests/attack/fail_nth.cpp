// Preloaded into the program by the fault campaign: lets the n-th call of one class of C library
// functions fail, counted over a whole tree of processes in a file that all of them share. What a
// library calls through the C library is reached as well, SQLite's file functions among it; what
// the C library calls within itself is not, except for memory. Programs that this one runs (a
// shell, bubblewrap) are left alone: what they do when the system fails is not this house's.
//
// The file (ARBORY_FAIL_NTH names it) is the struct below; faults.py writes and reads it. Nothing
// fails while `armed` is 0.

#undef _FILE_OFFSET_BITS  // both names of each function are wanted
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/stat.h>
#include <stdarg.h>
#include <stddef.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

namespace {

// faults.py has the same list in the same order.
enum Class : uint32_t {
  kOpen,
  kRead,
  kWrite,
  kRename,
  kLink,
  kUnlink,
  kMkdir,
  kSync,
  kTruncate,
  kFork,
  kThread,
  kKill,
  kMap,
  kAlloc,
  kPipe,
  kPoll,
  kLock,
  kDescriptor,
  kStat,
  kIdentity,
  kWait,
  kOwner,
  kSocket,
  kWatch,
  kClasses
};
constexpr int32_t kShortTransfer = -1;
constexpr size_t kWholeBytes = 8;
constexpr size_t kWhatBytes = 256;

struct Control {
  std::atomic<uint32_t> armed;
  uint32_t wanted;        // the class
  int32_t way;            // an errno, or kShortTransfer
  uint32_t from_then_on;  // all later calls of the class fail too
  std::atomic<uint64_t> nth;
  std::atomic<uint64_t> failed;
  std::atomic<uint64_t> in_sqlite;  // of the failed ones, those that SQLite made
  std::atomic<uint64_t> seen[kClasses];
  char what[kWhatBytes];  // the first call that failed
};

Control* control = nullptr;
int (*program_main)(int, char**, char**) = nullptr;

// What comes before is the loader's and the libraries' own, where a failure ends any program.
void Attach() {
  const char* path = getenv("ARBORY_FAIL_NTH");
  if (path == nullptr || strcmp(program_invocation_short_name, "arbory") != 0) return;
  const long fd = syscall(SYS_openat, AT_FDCWD, path, O_RDWR | O_CLOEXEC);
  if (fd < 0) return;
  const long at =
      syscall(SYS_mmap, nullptr, sizeof(Control), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0L);
  syscall(SYS_close, fd);
  if (at != -1) control = reinterpret_cast<Control*>(at);
}

// Counts the failure and tells of the first one. False when the caller is a PAM module or one of
// their libraries: those are the machine's.
bool Count(const char* function, const char* path, const void* caller) {
  Dl_info from = {};
  dladdr(caller, &from);
  const char* file = from.dli_fname == nullptr ? "?" : from.dli_fname;
  if (const char* slash = strrchr(file, '/')) file = slash + 1;
  const auto begins = [file](const char* name) { return strncmp(file, name, strlen(name)) == 0; };
  if (begins("pam_") || begins("libpam") || begins("libaudit")) return false;
  if (begins("libsqlite3")) ++control->in_sqlite;
  if (++control->failed > 1) return true;
  snprintf(control->what, kWhatBytes, "%s(%.80s) by %s+%#zx in process %d", function,
           path == nullptr ? "" : path, file,
           static_cast<size_t>(static_cast<const char*>(caller) -
                               static_cast<const char*>(from.dli_fbase)),
           static_cast<int>(syscall(SYS_getpid)));
  return true;
}

bool IsTurn(Class kind) {
  if (control == nullptr || control->armed == 0) return false;
  const uint64_t number = ++control->seen[kind];
  if (kind != control->wanted || control->nth == 0) return false;
  return number == control->nth || (control->from_then_on != 0 && number > control->nth);
}

// Whether this call is to fail; errno is then set.
bool Fails(Class kind, const char* function, const char* path, const void* caller) {
  if (!IsTurn(kind) || control->way == kShortTransfer) return false;
  if (!Count(function, path, caller)) return false;
  errno = control->way;
  return true;
}

// Whether the kernel could do that to a transfer: what is no file neither breaks nor fills up, and
// is interrupted only where it waits; and a number, or a part of one, is passed on at once.
bool CanHappen(int fd, size_t count) {
  if (control->way == kShortTransfer) return count > kWholeBytes;
  struct statx info;
  if (syscall(SYS_statx, fd, "", AT_EMPTY_PATH, STATX_TYPE, &info) != 0) return false;
  if ((info.stx_mode & S_IFMT) == S_IFREG) return control->way != EINTR;
  return control->way == EINTR && (syscall(SYS_fcntl, fd, F_GETFL) & O_NONBLOCK) == 0;
}

// The same for one that moves `count` bytes, which may be made fewer instead.
bool FailsTransfer(Class kind, const char* function, const void* caller, int fd, size_t* count) {
  if (!IsTurn(kind) || (kind != kSocket && !CanHappen(fd, *count))) return false;
  if (!Count(function, "", caller)) return false;
  errno = control->way;
  if (control->way == kShortTransfer) *count /= 2;
  return control->way != kShortTransfer;
}

template <typename Function>
Function* Real(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

}  // namespace

// The names that the program calls are given by label, so that the C library's own declarations,
// with their attributes, are not in the way.
#define HOOK(kind, result, name, parameters, arguments, path, failure)           \
  extern "C" __attribute__((used)) result Hook_##name parameters __asm__(#name); \
  result Hook_##name parameters {                                                \
    static auto* const real = Real<result parameters>(#name);                    \
    if (Fails(kind, #name, path, __builtin_return_address(0))) return failure;   \
    return real arguments;                                                       \
  }
#define HOOK_TRANSFER(kind, name, parameters, arguments)                                \
  extern "C" __attribute__((used)) ssize_t Hook_##name parameters __asm__(#name);       \
  ssize_t Hook_##name parameters {                                                      \
    static auto* const real = Real<ssize_t parameters>(#name);                          \
    if (FailsTransfer(kind, #name, __builtin_return_address(0), fd, &count)) return -1; \
    return real arguments;                                                              \
  }

// A mode that was not given is whatever stands in its register, and not looked at.
HOOK(kOpen, int, open, (const char* path, int flags, mode_t mode), (path, flags, mode), path, -1)
HOOK(kOpen, int, open64, (const char* path, int flags, mode_t mode), (path, flags, mode), path, -1)
HOOK(kOpen, int, openat, (int dir, const char* path, int flags, mode_t mode),
     (dir, path, flags, mode), path, -1)
HOOK(kOpen, int, openat64, (int dir, const char* path, int flags, mode_t mode),
     (dir, path, flags, mode), path, -1)
HOOK(kOpen, void*, opendir, (const char* path), (path), path, nullptr)
HOOK(kOpen, void*, fdopendir, (int fd), (fd), "", nullptr)
HOOK(kOpen, void*, fopen, (const char* path, const char* mode), (path, mode), path, nullptr)
HOOK(kOpen, void*, fopen64, (const char* path, const char* mode), (path, mode), path, nullptr)
HOOK(kOpen, int, mkostemp64, (char* path, int flags), (path, flags), path, -1)

HOOK_TRANSFER(kRead, read, (int fd, void* to, size_t count), (fd, to, count))
HOOK_TRANSFER(kRead, pread, (int fd, void* to, size_t count, off_t at), (fd, to, count, at))
HOOK_TRANSFER(kRead, pread64, (int fd, void* to, size_t count, off_t at), (fd, to, count, at))
HOOK(kRead, ssize_t, getdents64, (int fd, void* to, size_t count), (fd, to, count), "", -1)
HOOK(kRead, void*, readdir, (void* folder), (folder), "", nullptr)
HOOK(kRead, void*, readdir64, (void* folder), (folder), "", nullptr)
HOOK(kRead, ssize_t, readlink, (const char* path, char* to, size_t size), (path, to, size), path,
     -1)

HOOK_TRANSFER(kWrite, write, (int fd, const void* from, size_t count), (fd, from, count))
HOOK_TRANSFER(kWrite, pwrite, (int fd, const void* from, size_t count, off_t at),
              (fd, from, count, at))
HOOK_TRANSFER(kWrite, pwrite64, (int fd, const void* from, size_t count, off_t at),
              (fd, from, count, at))

HOOK(kRename, int, rename, (const char* from, const char* to), (from, to), to, -1)
HOOK(kRename, int, renameat, (int a, const char* from, int b, const char* to), (a, from, b, to), to,
     -1)
HOOK(kLink, int, linkat, (int a, const char* from, int b, const char* to, int flags),
     (a, from, b, to, flags), to, -1)
HOOK(kUnlink, int, unlink, (const char* path), (path), path, -1)
HOOK(kUnlink, int, unlinkat, (int dir, const char* path, int flags), (dir, path, flags), path, -1)
HOOK(kUnlink, int, rmdir, (const char* path), (path), path, -1)
HOOK(kMkdir, int, mkdir, (const char* path, mode_t mode), (path, mode), path, -1)
HOOK(kMkdir, int, mkdirat, (int dir, const char* path, mode_t mode), (dir, path, mode), path, -1)
HOOK(kSync, int, fsync, (int fd), (fd), "", -1)
HOOK(kSync, int, fdatasync, (int fd), (fd), "", -1)
HOOK(kTruncate, int, ftruncate, (int fd, off_t size), (fd, size), "", -1)
HOOK(kTruncate, int, ftruncate64, (int fd, off_t size), (fd, size), "", -1)
HOOK(kTruncate, int, fallocate, (int fd, int mode, off_t at, off_t size), (fd, mode, at, size), "",
     -1)
HOOK(kTruncate, int, fallocate64, (int fd, int mode, off_t at, off_t size), (fd, mode, at, size),
     "", -1)

HOOK(kFork, pid_t, fork, (), (), "", -1)
// Its failures are returned.
HOOK(kThread, int, pthread_create, (void* id, const void* how, void* (*body)(void*), void* with),
     (id, how, body, with), "", errno)
HOOK(kKill, int, kill, (pid_t process, int number), (process, number), "", -1)

HOOK(kMap, void*, mmap, (void* at, size_t size, int how, int flags, int fd, off_t from),
     (at, size, how, flags, fd, from), "", MAP_FAILED)
HOOK(kMap, void*, mmap64, (void* at, size_t size, int how, int flags, int fd, off_t from),
     (at, size, how, flags, fd, from), "", MAP_FAILED)
HOOK(kMap, void*, mremap, (void* at, size_t old_size, size_t size, int flags, void* to),
     (at, old_size, size, flags, to), "", MAP_FAILED)

HOOK(kPipe, int, pipe, (int* ends), (ends), "", -1)
HOOK(kPipe, int, pipe2, (int* ends, int flags), (ends, flags), "", -1)
HOOK(kPoll, int, poll, (void* watched, unsigned long count, int time), (watched, count, time), "",
     -1)
HOOK(kPoll, int, epoll_wait, (int fd, void* events, int most, int time), (fd, events, most, time),
     "", -1)
HOOK(kWatch, int, epoll_ctl, (int fd, int what, int of, void* event), (fd, what, of, event), "", -1)
HOOK(kPoll, int, nanosleep, (const void* length, void* left), (length, left), "", -1)

HOOK(kDescriptor, int, dup2, (int from, int to), (from, to), "", -1)
HOOK(kDescriptor, int, close_range, (unsigned from, unsigned to, int flags), (from, to, flags), "",
     -1)
HOOK(kStat, int, stat, (const char* path, void* to), (path, to), path, -1)
HOOK(kStat, int, stat64, (const char* path, void* to), (path, to), path, -1)
HOOK(kStat, int, lstat, (const char* path, void* to), (path, to), path, -1)
HOOK(kStat, int, lstat64, (const char* path, void* to), (path, to), path, -1)
HOOK(kStat, int, fstat, (int fd, void* to), (fd, to), "", -1)
HOOK(kStat, int, fstat64, (int fd, void* to), (fd, to), "", -1)
HOOK(kStat, int, fstatat, (int dir, const char* path, void* to, int how), (dir, path, to, how),
     path, -1)
HOOK(kStat, int, fstatat64, (int dir, const char* path, void* to, int how), (dir, path, to, how),
     path, -1)
HOOK(kStat, int, fstatfs64, (int fd, void* to), (fd, to), "", -1)
HOOK(kStat, int, statx, (int dir, const char* path, int flags, unsigned mask, void* to),
     (dir, path, flags, mask, to), path, -1)
HOOK(kStat, int, access, (const char* path, int mode), (path, mode), path, -1)
HOOK(kStat, int, faccessat, (int dir, const char* path, int mode, int flags),
     (dir, path, mode, flags), path, -1)
HOOK(kStat, char*, realpath, (const char* path, char* to), (path, to), path, nullptr)

HOOK(kIdentity, int, setresuid, (uid_t a, uid_t b, uid_t c), (a, b, c), "", -1)
HOOK(kIdentity, int, setresgid, (gid_t a, gid_t b, gid_t c), (a, b, c), "", -1)
HOOK(kIdentity, int, seteuid, (uid_t id), (id), "", -1)
HOOK(kIdentity, int, setegid, (gid_t id), (id), "", -1)
HOOK(kIdentity, int, setgroups, (size_t count, const gid_t* list), (count, list), "", -1)
HOOK(kIdentity, int, initgroups, (const char* user, gid_t group), (user, group), user, -1)
HOOK(kIdentity, int, setsid, (), (), "", -1)
HOOK(kIdentity, int, setpgid, (pid_t process, pid_t group), (process, group), "", -1)
HOOK(kOwner, int, fchmod, (int fd, mode_t mode), (fd, mode), "", -1)
HOOK(kOwner, int, fchown, (int fd, uid_t user, gid_t group), (fd, user, group), "", -1)
HOOK(kOwner, int, fchownat, (int dir, const char* path, uid_t user, gid_t group, int flags),
     (dir, path, user, group, flags), path, -1)

HOOK(kSocket, int, socket, (int domain, int type, int protocol), (domain, type, protocol), "", -1)
HOOK(kSocket, int, accept, (int fd, void* address, void* size), (fd, address, size), "", -1)
HOOK(kSocket, int, setsockopt, (int fd, int level, int name, const void* value, unsigned size),
     (fd, level, name, value, size), "", -1)
HOOK(kSocket, ssize_t, recvmsg, (int fd, void* message, int flags), (fd, message, flags), "", -1)
HOOK(kSocket, ssize_t, sendmsg, (int fd, const void* message, int flags), (fd, message, flags), "",
     -1)
HOOK_TRANSFER(kSocket, recv, (int fd, void* to, size_t count, int flags), (fd, to, count, flags))
HOOK_TRANSFER(kSocket, send, (int fd, const void* from, size_t count, int flags),
              (fd, from, count, flags))

namespace {

int MainOfAttacked(int argc, char** argv, char** environment) {
  Attach();
  return program_main(argc, argv, environment);
}

}  // namespace

using Main = int(int, char**, char**);
using StartMain = int(Main*, int, char**, void (*)(), void (*)(), void (*)(), void*);
extern "C" __attribute__((used)) StartMain Hook_start_main __asm__("__libc_start_main");
int Hook_start_main(Main* main, int argc, char** argv, void (*init)(), void (*fini)(),
                    void (*rtld_fini)(), void* stack_end) {
  program_main = main;
  return Real<StartMain>("__libc_start_main")(MainOfAttacked, argc, argv, init, fini, rtld_fini,
                                              stack_end);
}

// What looking a function up may itself need.
extern "C" void* __libc_malloc(size_t);
extern "C" void* __libc_calloc(size_t, size_t);
extern "C" void* __libc_realloc(void*, size_t);
#define HOOK_MEMORY(name, parameters, arguments)                                \
  extern "C" __attribute__((used)) void* Hook_##name parameters __asm__(#name); \
  void* Hook_##name parameters {                                                \
    if (Fails(kAlloc, #name, "", __builtin_return_address(0))) return nullptr;  \
    return __libc_##name arguments;                                             \
  }
HOOK_MEMORY(malloc, (size_t size), (size))
HOOK_MEMORY(calloc, (size_t count, size_t size), (count, size))
HOOK_MEMORY(realloc, (void* old, size_t size), (old, size))

namespace {

bool IsLockCommand(int command) {
  return command == F_SETLK || command == F_SETLKW || command == F_GETLK ||
         command == F_OFD_SETLK || command == F_OFD_GETLK;
}

int Control_(const char* name, int fd, int command, void* argument, const void* caller) {
  static auto* const real = Real<int(int, int, ...)>("fcntl64");
  const Class kind = IsLockCommand(command) ? kLock : kDescriptor;
  return Fails(kind, name, "", caller) ? -1 : real(fd, command, argument);
}

}  // namespace

extern "C" __attribute__((used)) pid_t Hook_waitpid(pid_t, int*, int) __asm__("waitpid");
pid_t Hook_waitpid(pid_t process, int* status, int how) {
  static auto* const real = Real<pid_t(pid_t, int*, int)>("waitpid");
  const bool waits = (how & WNOHANG) == 0;  // nothing else can be interrupted
  if (waits && Fails(kWait, "waitpid", "", __builtin_return_address(0))) return -1;
  return real(process, status, how);
}

extern "C" __attribute__((used)) int Hook_fcntl(int, int, void*) __asm__("fcntl");
int Hook_fcntl(int fd, int command, void* argument) {
  return Control_("fcntl", fd, command, argument, __builtin_return_address(0));
}
extern "C" __attribute__((used)) int Hook_fcntl64(int, int, void*) __asm__("fcntl64");
int Hook_fcntl64(int fd, int command, void* argument) {
  return Control_("fcntl64", fd, command, argument, __builtin_return_address(0));
}

extern "C" __attribute__((used)) long Hook_syscall(long, long, long, long, long, long,
                                                   long) __asm__("syscall");
long Hook_syscall(long number, long a, long b, long c, long d, long e, long f) {
  static auto* const real = Real<long(long, ...)>("syscall");
  const void* caller = __builtin_return_address(0);
  if (number == SYS_openat2) {
    if (Fails(kOpen, "openat2", reinterpret_cast<const char*>(b), caller)) return -1;
  } else if (number == SYS_pidfd_open) {
    if (Fails(kDescriptor, "pidfd_open", "", caller)) return -1;
  } else if (number == SYS_getdents64) {
    if (Fails(kRead, "getdents64", "", caller)) return -1;
  }
  return real(number, a, b, c, d, e, f);
}
