#include "nas/index/folder_key.h"

#include <fcntl.h>

#include <cerrno>

namespace nas {
namespace {

// A handle that only identifies: some file systems have no other. Not in older headers.
constexpr int kHandleToCompare = 0x200;  // AT_HANDLE_FID, Linux 6.5

struct HandleBuffer {
  alignas(file_handle) char bytes[sizeof(file_handle) + MAX_HANDLE_SZ];
  file_handle* get() { return reinterpret_cast<file_handle*>(bytes); }
};

bool ReadHandle(int fd, const char* name, int flags, HandleBuffer& buffer) {
  int mount = 0;
  buffer.get()->handle_bytes = MAX_HANDLE_SZ;
  return name_to_handle_at(fd, name, buffer.get(), &mount, flags) == 0;
}

Result<FolderKey> Read(int fd, const char* name, int flags) {
  HandleBuffer buffer;
  if (!ReadHandle(fd, name, flags, buffer) &&
      (errno != EOPNOTSUPP || !ReadHandle(fd, name, flags | kHandleToCompare, buffer))) {
    // An older kernel says that it does not know the flag.
    return errno == EINVAL ? ErrnoError(EOPNOTSUPP) : ErrnoError();
  }
  const file_handle& handle = *buffer.get();
  return MakeFolderKey(handle.handle_type,
                       {reinterpret_cast<const char*>(handle.f_handle), handle.handle_bytes});
}

}  // namespace

Result<FolderKey> KeyOf(int fd) { return Read(fd, "", AT_EMPTY_PATH); }

Result<FolderKey> KeyOf(int fd, const char* name) { return Read(fd, name, 0); }

FolderKey MakeFolderKey(int handle_type, std::string_view handle) {
  FolderKey key(reinterpret_cast<const char*>(&handle_type), sizeof handle_type);
  return key.append(handle);
}

}  // namespace nas
