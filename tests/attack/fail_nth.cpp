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
constexpr long kNoPath = 0;

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
// A call is passed on as six whole registers, of which the function takes as many as it has
// parameters, and its answer likewise; `path` is the register that holds one.
#define HOOK(kind, name, path, failure)                                                          \
  extern "C"                                                                                     \
      __attribute__((used)) long Hook_##name(long, long, long, long, long, long) __asm__(#name); \
  long Hook_##name([[maybe_unused]] long a, [[maybe_unused]] long b, long c, long d, long e,     \
                   long f) {                                                                     \
    static auto* const real = Real<long(long, long, long, long, long, long)>(#name);             \
    const void* caller = __builtin_return_address(0);                                            \
    if (Fails(kind, #name, reinterpret_cast<const char*>(path), caller)) return failure;         \
    return real(a, b, c, d, e, f);                                                               \
  }
#define HOOK_TRANSFER(kind, name, parameters, arguments)                                \
  extern "C" __attribute__((used)) ssize_t Hook_##name parameters __asm__(#name);       \
  ssize_t Hook_##name parameters {                                                      \
    static auto* const real = Real<ssize_t parameters>(#name);                          \
    if (FailsTransfer(kind, #name, __builtin_return_address(0), fd, &count)) return -1; \
    return real arguments;                                                              \
  }

HOOK(kOpen, open, a, -1)
HOOK(kOpen, open64, a, -1)
HOOK(kOpen, openat, b, -1)
HOOK(kOpen, openat64, b, -1)
HOOK(kOpen, opendir, a, 0)
HOOK(kOpen, fdopendir, kNoPath, 0)
HOOK(kOpen, fopen, a, 0)
HOOK(kOpen, fopen64, a, 0)
HOOK(kOpen, mkostemp64, a, -1)

HOOK_TRANSFER(kRead, read, (int fd, void* to, size_t count), (fd, to, count))
HOOK_TRANSFER(kRead, pread, (int fd, void* to, size_t count, off_t at), (fd, to, count, at))
HOOK_TRANSFER(kRead, pread64, (int fd, void* to, size_t count, off_t at), (fd, to, count, at))
HOOK(kRead, getdents64, kNoPath, -1)
HOOK(kRead, readdir, kNoPath, 0)
HOOK(kRead, readdir64, kNoPath, 0)
HOOK(kRead, readlink, a, -1)

HOOK_TRANSFER(kWrite, write, (int fd, const void* from, size_t count), (fd, from, count))
HOOK_TRANSFER(kWrite, pwrite, (int fd, const void* from, size_t count, off_t at),
              (fd, from, count, at))
HOOK_TRANSFER(kWrite, pwrite64, (int fd, const void* from, size_t count, off_t at),
              (fd, from, count, at))

HOOK(kRename, rename, b, -1)
HOOK(kRename, renameat, d, -1)
HOOK(kLink, linkat, d, -1)
HOOK(kUnlink, unlink, a, -1)
HOOK(kUnlink, unlinkat, b, -1)
HOOK(kUnlink, rmdir, a, -1)
HOOK(kMkdir, mkdir, a, -1)
HOOK(kMkdir, mkdirat, b, -1)
HOOK(kSync, fsync, kNoPath, -1)
HOOK(kSync, fdatasync, kNoPath, -1)
HOOK(kTruncate, ftruncate, kNoPath, -1)
HOOK(kTruncate, ftruncate64, kNoPath, -1)
HOOK(kTruncate, fallocate, kNoPath, -1)
HOOK(kTruncate, fallocate64, kNoPath, -1)

HOOK(kFork, fork, kNoPath, -1)
// Its failures are returned.
HOOK(kThread, pthread_create, kNoPath, errno)
HOOK(kKill, kill, kNoPath, -1)

HOOK(kMap, mmap, kNoPath, -1)
HOOK(kMap, mmap64, kNoPath, -1)
HOOK(kMap, mremap, kNoPath, -1)

HOOK(kPipe, pipe, kNoPath, -1)
HOOK(kPipe, pipe2, kNoPath, -1)
HOOK(kPoll, poll, kNoPath, -1)
HOOK(kPoll, epoll_wait, kNoPath, -1)
HOOK(kWatch, epoll_ctl, kNoPath, -1)
HOOK(kPoll, nanosleep, kNoPath, -1)

HOOK(kDescriptor, dup2, kNoPath, -1)
HOOK(kDescriptor, close_range, kNoPath, -1)
HOOK(kStat, stat, a, -1)
HOOK(kStat, stat64, a, -1)
HOOK(kStat, lstat, a, -1)
HOOK(kStat, lstat64, a, -1)
HOOK(kStat, fstat, kNoPath, -1)
HOOK(kStat, fstat64, kNoPath, -1)
HOOK(kStat, fstatat, b, -1)
HOOK(kStat, fstatat64, b, -1)
HOOK(kStat, fstatfs64, kNoPath, -1)
HOOK(kStat, statx, b, -1)
HOOK(kStat, access, a, -1)
HOOK(kStat, faccessat, b, -1)
HOOK(kStat, realpath, a, 0)

HOOK(kIdentity, setresuid, kNoPath, -1)
HOOK(kIdentity, setresgid, kNoPath, -1)
HOOK(kIdentity, seteuid, kNoPath, -1)
HOOK(kIdentity, setegid, kNoPath, -1)
HOOK(kIdentity, setgroups, kNoPath, -1)
HOOK(kIdentity, initgroups, a, -1)
HOOK(kIdentity, setsid, kNoPath, -1)
HOOK(kIdentity, setpgid, kNoPath, -1)
HOOK(kOwner, fchmod, kNoPath, -1)
HOOK(kOwner, fchown, kNoPath, -1)
HOOK(kOwner, fchownat, b, -1)

HOOK(kSocket, socket, kNoPath, -1)
HOOK(kSocket, accept, kNoPath, -1)
HOOK(kSocket, setsockopt, kNoPath, -1)
HOOK(kSocket, recvmsg, kNoPath, -1)
HOOK(kSocket, sendmsg, kNoPath, -1)
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
