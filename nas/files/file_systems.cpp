#include "nas/files/file_systems.h"

#include <linux/magic.h>
#include <sys/statfs.h>

#include <cstdint>

namespace nas {
namespace {

// Those that the kernel's headers do not name.
constexpr std::uint32_t kMessageQueues = 0x19800202;
constexpr std::uint32_t kConfigFs = 0x62656570;
constexpr std::uint32_t kFuseControl = 0x65735543;
constexpr std::uint32_t kRpcPipes = 0x67596969;

}  // namespace

bool IsPseudoFileSystem(int folder) {
  struct statfs status;
  if (fstatfs(folder, &status) != 0) return false;
  switch (static_cast<std::uint32_t>(status.f_type)) {
    case PROC_SUPER_MAGIC:
    case SYSFS_MAGIC:
    case DEBUGFS_MAGIC:
    case TRACEFS_MAGIC:
    case SECURITYFS_MAGIC:
    case SELINUX_MAGIC:
    case CGROUP_SUPER_MAGIC:
    case CGROUP2_SUPER_MAGIC:
    case PSTOREFS_MAGIC:
    case EFIVARFS_MAGIC:
    case BPF_FS_MAGIC:
    case DEVPTS_SUPER_MAGIC:
    case BINFMTFS_MAGIC:
    case BINDERFS_SUPER_MAGIC:
    case NSFS_MAGIC:
    case kMessageQueues:
    case kConfigFs:
    case kFuseControl:
    case kRpcPipes:
      return true;
    default:
      return false;
  }
}

}  // namespace nas
