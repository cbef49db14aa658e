#include "arbory/fleet_command.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "arbory/terminal.h"
#include "nas/base/file_io.h"
#include "nas/base/unique_fd.h"
#include "nas/fleet/library.h"
#include "nas/fleet/token.h"

namespace arbory {

int RunFleetKeyCommand(const FleetOptions& options) {
  std::string secret;
  std::string open_part;
  nas::LoadFleetLibrary().make_key(&secret, &open_part);
  // A key that is there may be one that boxes know.
  const nas::UniqueFd file(open(options.key_file.c_str(),
                                O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                                S_IRUSR | S_IWUSR));
  const nas::Status written =
      file ? nas::WriteAll(file.get(), nas::ToHex(secret) + "\n") : nas::ErrnoError();
  if (!written) {
    throw UsageError("the key cannot be written to " + options.key_file + ": " +
                     std::strerror(written.error().error_number));
  }
  WriteOut(STDOUT_FILENO, nas::ToHex(open_part) + "\n");
  return kExitSuccess;
}

}  // namespace arbory
