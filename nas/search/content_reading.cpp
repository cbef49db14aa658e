#include "nas/search/content_reading.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>

#include "nas/files/beneath.h"

namespace nas {

void ContentReading::Feed(size_t /*thread*/, Judge& judge) {
  CandidateList::Record record;
  while (!search_.stopping() && search_.candidates->Take(record)) Read(record, judge);
}

void ContentReading::Read(const CandidateList::Record& record, Judge& judge) {
  const Location& location = locations_[record.location];
  // Paths begin at the share, folders are opened from the location.
  std::string_view below = record.folder_path;
  below.remove_prefix(std::min(below.size(), location.path.size()));
  if (below.starts_with('/')) below.remove_prefix(1);
  const UniqueFd fd = OpenBelow(location.fd.get(), below, O_PATH | O_DIRECTORY);
  if (!fd) {
    search_.CannotRead(errno, record.location, record.folder_path);
    return;
  }
  judge.Enter(fd.get(), record.location, location, record.folder_path);
  for (std::string_view names = record.names; !names.empty() && !search_.stopping();) {
    judge.Contents(names.data());
    names.remove_prefix(names.find('\0') + 1);
  }
  judge.Leave();
}

}  // namespace nas
